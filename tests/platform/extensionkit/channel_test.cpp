// The channel over a real socket pair: messages both ways, the peer going away, malformed and
// oversized input, and concurrent writers. SIGPIPE is deliberately left at its default here: a
// write to a closed peer that raised it would kill this test program.

#include "platform/extensionkit/channel.h"
#include "platform/extensionkit/json_rpc.h"
#include "tests/platform/extensionkit/socket_pair.h"
#include "tests/support/log_capture.h"

#include <QJsonArray>
#include <QPointer>
#include <QThread>

#include <gtest/gtest.h>

#include <atomic>
#include <cerrno>
#include <csignal>
#include <random>
#include <thread>

using zaf::extensionkit::Channel;
using zaf::test::SocketPair;
using zaf::test::waitUntil;
namespace rpc = zaf::extensionkit::jsonrpc;

namespace {

struct Received {
    QList<std::tuple<QJsonValue, QString, QJsonValue>> requests;
    QList<std::pair<QString, QJsonValue>> notifications;
    QStringList protocolErrors;
    QStringList closes;
};

class ChannelTest : public ::testing::Test {
protected:
    void SetUp() override
    {
        ASSERT_EQ(std::signal(SIGPIPE, SIG_DFL), SIG_DFL) << "this program must run with SIGPIPE at its default";
        channel = Channel::create(pair.releaseExtensionFd());
        ASSERT_TRUE(channel->start());
        QObject::connect(channel.get(), &Channel::requestReceived, [this](const QJsonValue &id, const QString &method, const QJsonValue &params) {
            received.requests.append({id, method, params});
        });
        QObject::connect(channel.get(), &Channel::notificationReceived, [this](const QString &method, const QJsonValue &params) {
            received.notifications.append({method, params});
        });
        QObject::connect(channel.get(), &Channel::protocolError, [this](const QString &text) { received.protocolErrors.append(text); });
        QObject::connect(channel.get(), &Channel::closed, [this](const QString &reason) { received.closes.append(reason); });
    }

    SocketPair pair;
    std::shared_ptr<Channel> channel;
    Received received;
};

} // namespace

TEST_F(ChannelTest, DeliversRequestsAndNotificationsInOrderAndSendsAnswersBack)
{
    pair.writeMessage(rpc::makeRequest(1, "beginExtensionRequest", QJsonObject{{"inputItems", QJsonArray{}}}));
    // Two frames in one write, the second split across two writes.
    const QByteArray two = zaf::extensionkit::encodeFrame(rpc::serialize(rpc::makeNotification("a")))
                           + zaf::extensionkit::encodeFrame(rpc::serialize(rpc::makeNotification("b", QJsonArray{1})));
    pair.writeRaw(two.left(two.size() - 3));
    pair.writeRaw(two.right(3));
    ASSERT_TRUE(waitUntil([&] { return received.requests.size() == 1 && received.notifications.size() == 2; }));
    EXPECT_EQ(std::get<0>(received.requests[0]), QJsonValue(1));
    EXPECT_EQ(std::get<1>(received.requests[0]), "beginExtensionRequest");
    EXPECT_EQ(received.notifications[0].first, "a");
    EXPECT_EQ(received.notifications[1].first, "b");
    EXPECT_EQ(received.notifications[1].second, QJsonValue(QJsonArray{1}));

    EXPECT_FALSE(channel->sendResult(1, QJsonObject{{"accepted", true}}).has_value());
    EXPECT_FALSE(channel->sendNotification("extensionDidFinishWithActivityTypes", QJsonArray{QJsonArray{"x"}}).has_value());
    const QList<QJsonObject> answers = pair.readMessages(2);
    ASSERT_EQ(answers.size(), 2);
    EXPECT_EQ(answers[0], rpc::makeResult(1, QJsonObject{{"accepted", true}}));
    EXPECT_EQ(answers[1].value("method"), "extensionDidFinishWithActivityTypes");
    EXPECT_FALSE(answers[1].contains("id"));
    EXPECT_TRUE(received.protocolErrors.isEmpty());
    EXPECT_TRUE(received.closes.isEmpty());
}

TEST_F(ChannelTest, PeerClosingEmitsClosedOnceAndLaterWritesFailWithEpipe)
{
    pair.closeHost();
    ASSERT_TRUE(waitUntil([&] { return !received.closes.isEmpty(); }));
    EXPECT_FALSE(channel->isOpen());
    const zaf::OptionalError error = channel->sendNotification("late");
    ASSERT_TRUE(error.has_value());
    EXPECT_EQ(error->domain, "posix");
    EXPECT_EQ(error->code, EPIPE);
    channel->close("again");
    waitUntil([] { return false; }, 30);
    EXPECT_EQ(received.closes.size(), 1);
}

TEST_F(ChannelTest, WriteToAPeerThatVanishedReturnsAnErrorInsteadOfRaisingSigpipe)
{
    // The peer is gone but the channel has not read the end of stream yet: the write itself fails.
    pair.closeHost();
    const zaf::OptionalError error = channel->sendNotification("afterPeerClosed", QJsonArray{QJsonArray{"a"}});
    ASSERT_TRUE(error.has_value());
    EXPECT_TRUE(error->code == EPIPE || error->code == ECONNRESET) << error->code;
}

TEST_F(ChannelTest, StreamEndingInsideAFrameIsAProtocolErrorThenClosed)
{
    pair.writeRaw(zaf::extensionkit::encodeFrame(rpc::serialize(rpc::makeNotification("cut"))).left(9));
    pair.closeHost();
    ASSERT_TRUE(waitUntil([&] { return !received.closes.isEmpty(); }));
    ASSERT_EQ(received.protocolErrors.size(), 1);
    EXPECT_TRUE(received.protocolErrors[0].contains("inside a frame"));
    EXPECT_TRUE(received.notifications.isEmpty());
}

TEST_F(ChannelTest, MalformedMessagesAreReportedAnsweredWhenTheyHadAnIdAndReadingGoesOn)
{
    zaf::test::LogCapture logs;
    pair.writeFrame("not json");
    pair.writeFrame(QByteArray("{\"jsonrpc\":\"2.0\",\"method\":\"\xff\"}"));
    pair.writeFrame(R"({"jsonrpc":"2.0","id":5,"method":42})");
    pair.writeFrame(R"({"jsonrpc":"1.0","method":"noId"})");
    pair.writeFrame(R"({"jsonrpc":"2.0","id":6,"result":1})"); // a response nobody asked for
    pair.writeMessage(rpc::makeNotification("stillAlive"));
    ASSERT_TRUE(waitUntil([&] { return received.notifications.size() == 1; }));
    EXPECT_EQ(received.notifications[0].first, "stillAlive");
    EXPECT_EQ(received.protocolErrors.size(), 4);
    EXPECT_TRUE(received.requests.isEmpty());
    EXPECT_TRUE(received.closes.isEmpty());

    const QList<QJsonObject> answers = pair.readMessages(1);
    ASSERT_EQ(answers.size(), 1);
    EXPECT_EQ(answers[0].value("id"), QJsonValue(5));
    EXPECT_EQ(answers[0].value("error").toObject().value("code"), QJsonValue(rpc::InvalidRequest));
    EXPECT_TRUE(pair.nothingToRead());
    EXPECT_GE(logs.messages("zaf.extensionkit").filter("protocol error").size(), 4);
}

TEST_F(ChannelTest, OversizedLengthClosesTheChannelAfterDeliveringTheFramesBeforeIt)
{
    QByteArray stream = zaf::extensionkit::encodeFrame(rpc::serialize(rpc::makeNotification("before")));
    stream += QByteArray::fromHex("01001000"); // 1 MiB + 1
    stream += QByteArray(64, 'x');
    pair.writeRaw(stream);
    ASSERT_TRUE(waitUntil([&] { return !received.closes.isEmpty(); }));
    ASSERT_EQ(received.notifications.size(), 1);
    EXPECT_EQ(received.notifications[0].first, "before");
    ASSERT_EQ(received.protocolErrors.size(), 1);
    EXPECT_TRUE(received.protocolErrors[0].contains("1048577"));
    EXPECT_FALSE(channel->isOpen());
}

TEST_F(ChannelTest, RandomGarbageNeverCrashesTheReader)
{
    std::mt19937 random(4242);
    for (int i = 0; i < 200; ++i) {
        QByteArray payload(int(random() % 300), Qt::Uninitialized);
        for (char &c : payload)
            c = char(random());
        pair.writeFrame(payload);
    }
    pair.writeMessage(rpc::makeNotification("end"));
    ASSERT_TRUE(waitUntil([&] { return !received.notifications.isEmpty() && received.notifications.last().first == "end"; }));
    EXPECT_TRUE(channel->isOpen());
    EXPECT_GE(received.protocolErrors.size(), 190);
}

TEST_F(ChannelTest, ConcurrentSendersNeverInterleaveFrames)
{
    constexpr int kThreads = 4;
    constexpr int kPerThread = 200;
    std::atomic<int> failures{0};
    std::vector<std::thread> threads;
    const QString filler(2000, QLatin1Char('f')); // large enough for partial writes to happen
    for (int t = 0; t < kThreads; ++t) {
        threads.emplace_back([&, t] {
            for (int i = 0; i < kPerThread; ++i) {
                if (channel->sendNotification("n", QJsonArray{t, i, filler}))
                    ++failures;
            }
        });
    }
    // Read on this thread while the writers run, so the socket buffer keeps draining.
    const QList<QJsonObject> messages = pair.readMessages(kThreads * kPerThread, 20000);
    for (std::thread &thread : threads)
        thread.join();
    EXPECT_EQ(failures.load(), 0);
    ASSERT_EQ(messages.size(), kThreads * kPerThread);
    std::vector<int> next(kThreads, 0);
    for (const QJsonObject &message : messages) {
        const QJsonArray params = message.value("params").toArray();
        ASSERT_EQ(params.size(), 3);
        const int t = params[0].toInt();
        ASSERT_GE(t, 0);
        ASSERT_LT(t, kThreads);
        EXPECT_EQ(params[1].toInt(), next[t]++);
        EXPECT_EQ(params[2].toString(), filler);
    }
}

TEST_F(ChannelTest, FullSocketBufferFailsWithTimeoutAfterTheBoundedWait)
{
    channel->setWriteTimeout(100);
    const QString big(60000, QLatin1Char('b'));
    zaf::OptionalError error;
    // The host never reads: the buffer fills, then one send waits its bounded time and fails.
    for (int i = 0; i < 1000 && !error; ++i)
        error = channel->sendNotification("fill", QJsonArray{big});
    ASSERT_TRUE(error.has_value());
    EXPECT_EQ(error->code, ETIMEDOUT);
}

TEST(ChannelStart, RefusesADescriptorThatIsNotOpen)
{
    int fds[2];
    ASSERT_EQ(::pipe(fds), 0);
    ::close(fds[0]);
    ::close(fds[1]);
    const auto channel = Channel::create(fds[0]);
    QString error;
    EXPECT_FALSE(channel->start(&error));
    EXPECT_TRUE(error.contains("not open"));
}

TEST(ChannelLifetime, LastReferenceDroppedOnAWorkerThreadDeletesOnTheMainThread)
{
    SocketPair pair;
    auto channel = Channel::create(pair.releaseExtensionFd());
    ASSERT_TRUE(channel->start());
    QPointer<Channel> watch(channel.get());
    std::thread worker([moved = std::move(channel)]() mutable {
        EXPECT_FALSE(moved->sendNotification("fromWorker").has_value());
        moved.reset();
    });
    worker.join();
    EXPECT_FALSE(watch.isNull()) << "deleted on the worker thread";
    ASSERT_TRUE(waitUntil([&] { return watch.isNull(); }));
    EXPECT_EQ(pair.readMessages(1).size(), 1);
}
