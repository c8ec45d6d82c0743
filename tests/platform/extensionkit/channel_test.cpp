// The channel over a real socket pair; its framing is framed_socket_test.cpp's, the messages both
// ways through the runtime are extension_runtime_test.cpp's.

#include "platform/extensionkit/channel.h"
#include "platform/extensionkit/json_rpc.h"
#include "tests/platform/extensionkit/socket_pair.h"
#include "tests/support/log_capture.h"
#include "tests/support/named_cases.h"

#include <QJsonArray>
#include <QPointer>

#include <gtest/gtest.h>

#include <optional>
#include <thread>

using zaf::extensionkit::Channel;
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

    SocketPair pair;
    std::shared_ptr<Channel> channel = Channel::create(pair.releaseExtensionFd());
    QList<std::pair<QJsonValue, QString>> requests;
    QList<std::pair<QString, QJsonValue>> notifications;
    QStringList protocolErrors;
    QStringList closes;
};

class ChannelTest : public ::testing::Test, protected Harness {};

} // namespace

TEST_F(ChannelTest, RequestsArriveBeforeTheNotificationsSentAfterThem)
{
    pair.writeMessage(rpc::makeRequest(1, "beginExtensionRequest", QJsonObject{{"inputItems", QJsonArray{}}}));
    pair.writeMessage(rpc::makeNotification("a"));
    pair.writeMessage(rpc::makeNotification("b", QJsonArray{1}));
    ASSERT_TRUE(waitUntil([&] { return notifications.size() == 2; }, 5000));
    EXPECT_EQ(requests, (QList<std::pair<QJsonValue, QString>>{{1, "beginExtensionRequest"}}));
    EXPECT_EQ(notifications, (QList<std::pair<QString, QJsonValue>>{{"a", QJsonValue::Undefined}, {"b", QJsonArray{1}}}));
    EXPECT_TRUE(protocolErrors.isEmpty());
}

ZAF_PRINT_CASES_AS_NAMES

// A malformed frame is logged and reported, and answered with the request's id where it can be read,
// null where not, never for notifications and responses (which id for which frame is
// json_rpc_test.cpp's table); the next request still comes through.
struct Malformed {
    const char *name;
    QByteArray payload;
    std::optional<std::pair<QJsonValue, int>> answer; // id and code; none: not answered
};

class ChannelMalformedTest : public ::testing::TestWithParam<Malformed>, protected Harness {};

TEST_P(ChannelMalformedTest, IsAnsweredAsJsonRpcAsks)
{
    zaf::test::LogCapture logs;
    pair.writeFrame(GetParam().payload);
    pair.writeMessage(rpc::makeRequest(99, "next"));
    ASSERT_TRUE(waitUntil([&] { return requests.size() == 1; }, 5000));
    EXPECT_EQ(requests[0], std::make_pair(QJsonValue(99), QString("next")));
    EXPECT_EQ(protocolErrors.size(), 1);
    EXPECT_EQ(logs.messages("zaf.extensionkit").filter("protocol error").size(), 1);
    if (GetParam().answer) {
        EXPECT_EQ(pair.readErrorAnswer(), GetParam().answer);
    }
    EXPECT_TRUE(pair.nothingToRead());
    EXPECT_TRUE(notifications.isEmpty());
    EXPECT_TRUE(closes.isEmpty());
}

INSTANTIATE_TEST_SUITE_P(Frames, ChannelMalformedTest, ::testing::Values(
    Malformed{"NotJson", "not json", {{QJsonValue::Null, rpc::ParseError}}},
    Malformed{"InvalidUtf8InARequest", QByteArray("{\"jsonrpc\":\"2.0\",\"id\":7,\"method\":\"m\xff\"}"), {{7, rpc::ParseError}}},
    Malformed{"MethodANumber", R"({"jsonrpc":"2.0","id":5,"method":42})", {{5, rpc::InvalidRequest}}},
    Malformed{"InvalidUtf8InANotification", QByteArray("{\"jsonrpc\":\"2.0\",\"method\":\"\xff\"}"), std::nullopt},
    Malformed{"ResponseWithResultAndError", R"({"jsonrpc":"2.0","id":6,"result":1,"error":{"code":1,"message":"m"}})", std::nullopt}),
    zaf::test::caseName);

TEST(ChannelLifetime, DroppedOnAWorkerIsDeletedOnItsOwnThread)
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
    ASSERT_TRUE(waitUntil([&] { return watch.isNull(); }, 5000));
    EXPECT_EQ(pair.readMessages(1).size(), 1);
}
