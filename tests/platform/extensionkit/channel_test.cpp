// The channel over a real socket pair: messages both ways, the peer going away, malformed,
// truncated and oversized input, and concurrent writers. SIGPIPE stays at its default here: a write
// to a closed peer that raised it would kill this test program.

#include "platform/extensionkit/channel.h"
#include "platform/extensionkit/json_rpc.h"
#include "tests/platform/extensionkit/socket_pair.h"
#include "tests/support/log_capture.h"

#include <QJsonArray>
#include <QPointer>

#include <gtest/gtest.h>

#include <atomic>
#include <cerrno>
#include <csignal>
#include <optional>
#include <random>
#include <thread>

using zaf::extensionkit::Channel;
using zaf::extensionkit::encodeFrame;
using zaf::test::SocketPair;
using zaf::test::waitUntil;
namespace rpc = zaf::extensionkit::jsonrpc;

namespace {

// A started channel on the extension's end of a socket pair, recording every signal.
struct Harness {
    Harness()
    {
        QObject::connect(channel.get(), &Channel::requestReceived,
                         [this](const QJsonValue &id, const QString &method, const QJsonValue &) { requests.append({id, method}); });
        QObject::connect(channel.get(), &Channel::notificationReceived,
                         [this](const QString &method, const QJsonValue &params) { notifications.append({method, params}); });
        QObject::connect(channel.get(), &Channel::protocolError, [this](const QString &text) { protocolErrors.append(text); });
        QObject::connect(channel.get(), &Channel::closed, [this](const QString &reason) { closes.append(reason); });
        EXPECT_TRUE(channel->start());
    }
    QString lastNotification() const { return notifications.isEmpty() ? QString() : notifications.last().first; }

    SocketPair pair;
    std::shared_ptr<Channel> channel = Channel::create(pair.releaseExtensionFd());
    QList<std::pair<QJsonValue, QString>> requests;
    QList<std::pair<QString, QJsonValue>> notifications;
    QStringList protocolErrors;
    QStringList closes;
};

class ChannelTest : public ::testing::Test, protected Harness {
protected:
    void SetUp() override { ASSERT_EQ(std::signal(SIGPIPE, SIG_DFL), SIG_DFL) << "this program must run with SIGPIPE at its default"; }
};

} // namespace

TEST_F(ChannelTest, DeliversRequestsAndNotificationsInOrderAndSendsAnswersBack)
{
    pair.writeMessage(rpc::makeRequest(1, "beginExtensionRequest", QJsonObject{{"inputItems", QJsonArray{}}}));
    // Two frames in one write, the second split across two writes.
    const QByteArray two = encodeFrame(rpc::serialize(rpc::makeNotification("a")))
                           + encodeFrame(rpc::serialize(rpc::makeNotification("b", QJsonArray{1})));
    pair.writeRaw(two.left(two.size() - 3));
    pair.writeRaw(two.right(3));
    ASSERT_TRUE(waitUntil([&] { return requests.size() == 1 && notifications.size() == 2; }));
    EXPECT_EQ(requests[0], std::make_pair(QJsonValue(1), QString("beginExtensionRequest")));
    EXPECT_EQ(notifications[0].first, "a");
    EXPECT_EQ(notifications[1], std::make_pair(QString("b"), QJsonValue(QJsonArray{1})));

    EXPECT_FALSE(channel->sendResult(1, QJsonObject{{"accepted", true}}));
    EXPECT_FALSE(channel->sendNotification("extensionDidFinishWithActivityTypes", QJsonArray{QJsonArray{"x"}}));
    const QList<QJsonObject> answers = pair.readMessages(2);
    ASSERT_EQ(answers.size(), 2);
    EXPECT_EQ(answers[0], rpc::makeResult(1, QJsonObject{{"accepted", true}}));
    EXPECT_EQ(answers[1], rpc::makeNotification("extensionDidFinishWithActivityTypes", QJsonArray{QJsonArray{"x"}}));
    EXPECT_TRUE(protocolErrors.isEmpty());
    EXPECT_TRUE(closes.isEmpty());
}

TEST_F(ChannelTest, PeerGoneMakesWritesFailWithoutSigpipeAndClosesOnce)
{
    // Before the channel has read the end of stream the write itself fails; afterwards it is closed.
    pair.closeHost();
    zaf::OptionalError error = channel->sendNotification("afterPeerClosed", QJsonArray{QJsonArray{"a"}});
    ASSERT_TRUE(error.has_value());
    EXPECT_TRUE(error->code == EPIPE || error->code == ECONNRESET) << error->code;

    ASSERT_TRUE(waitUntil([&] { return !closes.isEmpty(); }));
    EXPECT_FALSE(channel->isOpen());
    error = channel->sendNotification("late");
    ASSERT_TRUE(error.has_value());
    EXPECT_EQ(error->domain, "posix");
    EXPECT_EQ(error->code, EPIPE);
    channel->close("again");
    waitUntil([] { return false; }, 30);
    EXPECT_EQ(closes.size(), 1);
}

TEST(ChannelStream, TruncatedOrOversizedFrameIsOneProtocolErrorThenClosedAfterWhatCameBefore)
{
    const QByteArray before = encodeFrame(rpc::serialize(rpc::makeNotification("before")));
    const struct {
        const char *name;
        QByteArray tail;
        bool peerCloses;
        const char *error;
    } cases[] = {
        {"stream ends inside a frame", encodeFrame(rpc::serialize(rpc::makeNotification("cut"))).left(9), true, "inside a frame"},
        {"length of 1 MiB + 1", QByteArray::fromHex("01001000") + QByteArray(64, 'x'), false, "1048577"},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.name);
        Harness h;
        h.pair.writeRaw(before + c.tail);
        if (c.peerCloses)
            h.pair.closeHost();
        ASSERT_TRUE(waitUntil([&] { return !h.closes.isEmpty(); }));
        ASSERT_EQ(h.notifications.size(), 1);
        EXPECT_EQ(h.notifications[0].first, "before");
        ASSERT_EQ(h.protocolErrors.size(), 1);
        EXPECT_TRUE(h.protocolErrors[0].contains(c.error)) << h.protocolErrors[0].toStdString();
        EXPECT_FALSE(h.channel->isOpen());
    }
}

// Every malformed frame is logged, reported and answered as JSON-RPC 2.0 asks (with the request's
// id where it can be read, null where not, never for notifications and responses), and the next
// request still comes through; random bytes never stop the reading.
TEST_F(ChannelTest, MalformedFramesAreAnsweredWithTheirIdOrNullAndTheNextRequestComesThrough)
{
    struct Case {
        const char *name;
        QByteArray payload;
        std::optional<std::pair<QJsonValue, int>> answer; // id and code; none: not answered
    };
    const QJsonValue null(QJsonValue::Null);
    const auto nested = [](int levels) { return QByteArray(levels, '[') + QByteArray(levels, ']'); };
    const QList<Case> cases{
        {"not JSON", "not json", {{null, rpc::ParseError}}},
        {"invalid UTF-8 in a notification", QByteArray("{\"jsonrpc\":\"2.0\",\"method\":\"\xff\"}"), std::nullopt},
        {"invalid UTF-8 in a request", QByteArray("{\"jsonrpc\":\"2.0\",\"id\":7,\"method\":\"m\xff\"}"), {{7, rpc::ParseError}}},
        {"method a number", R"({"jsonrpc":"2.0","id":5,"method":42})", {{5, rpc::InvalidRequest}}},
        {"no method", R"({"jsonrpc":"2.0","id":"a"})", {{"a", rpc::InvalidRequest}}},
        {"a batch", R"([{"jsonrpc":"2.0","id":9,"method":"m"}])", {{null, rpc::InvalidRequest}}},
        {"request nested too deep", R"({"jsonrpc":"2.0","id":11,"method":"m","params":)" + nested(200) + "}", {{11, rpc::ParseError}}},
        {"array nested 20000 deep", nested(20000), {{null, rpc::ParseError}}},
        {"notification nested too deep", R"({"jsonrpc":"2.0","method":"m","params":)" + nested(200) + "}", std::nullopt},
        {"notification of version 1.0", R"({"jsonrpc":"1.0","method":"noId"})", std::nullopt},
        {"a response with result and error", R"({"jsonrpc":"2.0","id":6,"result":1,"error":{"code":1,"message":"m"}})", std::nullopt},
    };
    zaf::test::LogCapture logs;
    for (qsizetype i = 0; i < cases.size(); ++i) {
        const Case &c = cases[i];
        SCOPED_TRACE(c.name);
        const qsizetype errorsBefore = protocolErrors.size();
        pair.writeFrame(c.payload);
        pair.writeMessage(rpc::makeRequest(int(i), "next"));
        ASSERT_TRUE(waitUntil([&] { return requests.size() == i + 1; }));
        EXPECT_EQ(requests.last(), std::make_pair(QJsonValue(int(i)), QString("next")));
        EXPECT_EQ(protocolErrors.size(), errorsBefore + 1);
        if (c.answer) {
            const QList<QJsonObject> answers = pair.readMessages(1);
            ASSERT_EQ(answers.size(), 1);
            EXPECT_EQ(answers[0].value("id"), c.answer->first);
            EXPECT_EQ(answers[0].value("error").toObject().value("code"), QJsonValue(c.answer->second));
        }
        EXPECT_TRUE(pair.nothingToRead());
    }
    EXPECT_TRUE(notifications.isEmpty());
    EXPECT_GE(logs.messages("zaf.extensionkit").filter("protocol error").size(), cases.size());

    std::mt19937 random(4242);
    for (int i = 0; i < 200; ++i) {
        QByteArray payload(int(random() % 300), Qt::Uninitialized);
        for (char &c : payload)
            c = char(random());
        pair.writeFrame(payload);
    }
    pair.writeMessage(rpc::makeNotification("end"));
    ASSERT_TRUE(waitUntil([&] { return lastNotification() == "end"; }));
    EXPECT_TRUE(channel->isOpen());
    EXPECT_GE(protocolErrors.size(), cases.size() + 190);
    EXPECT_TRUE(closes.isEmpty());
}

TEST_F(ChannelTest, ConcurrentSendersNeverInterleaveFrames)
{
    constexpr int kThreads = 4, kPerThread = 200;
    std::atomic<int> failures{0};
    const QString filler(2000, QLatin1Char('f')); // large enough for partial writes to happen
    std::vector<std::thread> threads;
    for (int t = 0; t < kThreads; ++t) {
        threads.emplace_back([&, t] {
            for (int i = 0; i < kPerThread; ++i)
                failures += channel->sendNotification("n", QJsonArray{t, i, filler}).has_value();
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
        const int t = params[0].toInt();
        ASSERT_TRUE(params.size() == 3 && t >= 0 && t < kThreads);
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

TEST(ChannelLifetime, RefusesAClosedDescriptorAndDeletesOnTheMainThreadWhenDroppedOnAWorker)
{
    int fds[2];
    ASSERT_EQ(::pipe(fds), 0);
    ::close(fds[0]);
    ::close(fds[1]);
    QString error;
    EXPECT_FALSE(Channel::create(fds[0])->start(&error));
    EXPECT_TRUE(error.contains("not open"));

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
