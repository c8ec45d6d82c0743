// JSON-RPC 2.0 parsing and validation: what is accepted, what is refused with which code, and with
// which id each refusal is answered (a request's own, null, or none for notifications and responses).

#include "platform/extensionkit/json_rpc.h"

#include <QJsonArray>

#include <gtest/gtest.h>

#include <random>

namespace rpc = zaf::extensionkit::jsonrpc;

namespace {

rpc::Message parsed(const QByteArray &payload)
{
    const rpc::ParseResult result = rpc::parseMessage(payload);
    EXPECT_TRUE(result.ok()) << payload.toStdString() << ": " << result.errorText.toStdString();
    return result.message.value_or(rpc::Message{});
}

} // namespace

TEST(JsonRpc, ParsesEachKindOfMessageWithItsMembers)
{
    const rpc::Message request = parsed(R"({"jsonrpc":"2.0","id":7,"method":"beginExtensionRequest","params":{"inputItems":[]}})");
    EXPECT_EQ(request.kind, rpc::MessageKind::Request);
    EXPECT_EQ(request.id, QJsonValue(7));
    EXPECT_EQ(request.method, "beginExtensionRequest");
    EXPECT_TRUE(request.params.toObject().value("inputItems").isArray());

    const rpc::Message notification = parsed(R"({"jsonrpc":"2.0","method":"removeExtensionView"})");
    EXPECT_EQ(notification.kind, rpc::MessageKind::Notification);
    EXPECT_TRUE(notification.id.isUndefined());
    EXPECT_TRUE(notification.params.isUndefined());

    const rpc::Message stringId = parsed(R"({"jsonrpc":"2.0","id":"abc","method":"m","params":[1,2]})");
    EXPECT_EQ(stringId.id, QJsonValue("abc"));
    EXPECT_EQ(stringId.params, QJsonValue(QJsonArray{1, 2}));

    const rpc::Message result = parsed(R"({"jsonrpc":"2.0","id":1,"result":{"accepted":true}})");
    EXPECT_EQ(result.kind, rpc::MessageKind::Response);
    EXPECT_EQ(result.result, QJsonValue(QJsonObject{{"accepted", true}}));

    const rpc::Message error = parsed(R"({"jsonrpc":"2.0","id":null,"error":{"code":-32700,"message":"bad","data":[1]}})");
    EXPECT_EQ(error.kind, rpc::MessageKind::ErrorResponse);
    EXPECT_EQ(error.errorCode, -32700);
    EXPECT_EQ(error.errorMessage, "bad");
    EXPECT_EQ(error.errorData, QJsonValue(QJsonArray{1}));
}

TEST(JsonRpc, NestingUpToTheLimitParsesAndBracketsInStringsDoNotCount)
{
    const QByteArray atLimit = QByteArray(rpc::kMaxNestingDepth - 1, '[') + QByteArray(rpc::kMaxNestingDepth - 1, ']');
    EXPECT_EQ(parsed(R"({"jsonrpc":"2.0","id":1,"method":"m","params":)" + atLimit + "}").kind, rpc::MessageKind::Request);
    const QByteArray brackets = "\"" + QByteArray(1000, '[') + "\\\"{\"";
    EXPECT_EQ(parsed(R"({"jsonrpc":"2.0","method":"m","params":[)" + brackets + "]}").params, QJsonValue(QJsonArray{QString(QByteArray(1000, '[') + "\"{")}));
}

TEST(JsonRpc, MadeMessagesParseBackAsTheSameKind)
{
    const rpc::Message request = parsed(rpc::serialize(rpc::makeRequest(5, "doIt", QJsonArray{1})));
    EXPECT_EQ(request.kind, rpc::MessageKind::Request);
    EXPECT_EQ(request.params, QJsonValue(QJsonArray{1}));
    const QJsonArray types{QJsonArray{"a", "b"}};
    const rpc::Message notification = parsed(rpc::serialize(rpc::makeNotification("extensionDidFinishWithActivityTypes", types)));
    EXPECT_EQ(notification.kind, rpc::MessageKind::Notification);
    EXPECT_EQ(notification.params, QJsonValue(types));
    EXPECT_EQ(parsed(rpc::serialize(rpc::makeResult("id", QJsonValue()))).kind, rpc::MessageKind::Response);
    const rpc::Message error = parsed(rpc::serialize(rpc::makeError(9, rpc::MethodNotFound, "no such method")));
    EXPECT_EQ(error.errorCode, -32601);
    EXPECT_EQ(error.id, QJsonValue(9));

    // A notification made without params leaves the member out rather than sending null, and an
    // error for an id that cannot be echoed goes out with a null id.
    EXPECT_FALSE(rpc::makeNotification("removeExtensionView").contains("params"));
    EXPECT_TRUE(rpc::makeError(QJsonObject{}, rpc::InvalidRequest, "x").value("id").isNull());
}

TEST(JsonRpc, RefusesMalformedMessagesWithTheRightCodeAndAnswerability)
{
    // The last member is the id an answer must carry; nullopt when the failure must not be answered.
    struct Case {
        const char *name;
        QByteArray payload;
        int code;
        std::optional<QJsonValue> answerId;
    };
    const QJsonValue null(QJsonValue::Null);
    const auto nested = [](int levels, const char *inside = "") { return QByteArray(levels, '[') + inside + QByteArray(levels, ']'); };
    const QList<Case> cases{
        {"empty payload", "", rpc::ParseError, null},
        {"truncated JSON", R"({"jsonrpc":"2.0","id":1,"meth)", rpc::ParseError, null},
        {"invalid UTF-8 in a notification", QByteArray("{\"jsonrpc\":\"2.0\",\"method\":\"m\xff\xfe\"}"), rpc::ParseError, std::nullopt},
        {"invalid UTF-8 in a request", QByteArray("{\"jsonrpc\":\"2.0\",\"id\":8,\"method\":\"m\xff\xfe\"}"), rpc::ParseError, QJsonValue(8)},
        {"invalid UTF-8 in a response", QByteArray("{\"jsonrpc\":\"2.0\",\"id\":8,\"result\":\"\xff\"}"), rpc::ParseError, std::nullopt},
        {"invalid UTF-8 and JSON", QByteArray("\xff\xfe{"), rpc::ParseError, null},
        {"overlong UTF-8 encoding", QByteArray("{\"jsonrpc\":\"2.0\",\"method\":\"\xc0\xaf\"}"), rpc::ParseError, std::nullopt},
        {"lone surrogate in UTF-8", QByteArray("{\"jsonrpc\":\"2.0\",\"id\":\"s\",\"method\":\"\xed\xa0\x80\"}"), rpc::ParseError, QJsonValue("s")},
        {"trailing garbage", R"({"jsonrpc":"2.0","method":"m"} x)", rpc::ParseError, null},
        {"a number", "42", rpc::InvalidRequest, null},
        {"a string", R"("hello")", rpc::InvalidRequest, null},
        {"a batch", R"([{"jsonrpc":"2.0","id":1,"method":"m"}])", rpc::InvalidRequest, null},
        {"empty batch", "[]", rpc::InvalidRequest, null},
        {"request nested one level too deep", R"({"jsonrpc":"2.0","id":"d","method":"m","params":)" + nested(rpc::kMaxNestingDepth) + "}",
         rpc::ParseError, QJsonValue("d")},
        {"deep request with a bad id", R"({"jsonrpc":"2.0","id":[],"method":"m","params":)" + nested(500) + "}", rpc::ParseError, null},
        {"notification nested too deep", R"({"jsonrpc":"2.0","method":"m","params":)" + nested(100000) + "}", rpc::ParseError, std::nullopt},
        {"batch nested too deep", nested(100000), rpc::ParseError, null},
        {"deep and invalid UTF-8", QByteArray("{\"jsonrpc\":\"2.0\",\"id\":2,\"method\":\"\xff\",\"params\":") + nested(70) + "}",
         rpc::ParseError, QJsonValue(2)},
        {"missing version", R"({"id":1,"method":"m"})", rpc::InvalidRequest, QJsonValue(1)},
        {"version 1.0", R"({"jsonrpc":"1.0","id":1,"method":"m"})", rpc::InvalidRequest, QJsonValue(1)},
        {"numeric version", R"({"jsonrpc":2.0,"id":"x","method":"m"})", rpc::InvalidRequest, QJsonValue("x")},
        {"method a number", R"({"jsonrpc":"2.0","id":3,"method":12})", rpc::InvalidRequest, QJsonValue(3)},
        {"method null", R"({"jsonrpc":"2.0","id":3,"method":null})", rpc::InvalidRequest, QJsonValue(3)},
        {"method empty", R"({"jsonrpc":"2.0","id":3,"method":""})", rpc::InvalidRequest, QJsonValue(3)},
        {"method an object in a notification", R"({"jsonrpc":"2.0","method":{}})", rpc::InvalidRequest, std::nullopt},
        {"id an object", R"({"jsonrpc":"2.0","id":{},"method":"m"})", rpc::InvalidRequest, null},
        {"id an array", R"({"jsonrpc":"2.0","id":[1],"method":"m"})", rpc::InvalidRequest, null},
        {"id a boolean", R"({"jsonrpc":"2.0","id":true,"method":"m"})", rpc::InvalidRequest, null},
        {"params a string", R"({"jsonrpc":"2.0","id":4,"method":"m","params":"x"})", rpc::InvalidRequest, QJsonValue(4)},
        {"params a number", R"({"jsonrpc":"2.0","method":"m","params":5})", rpc::InvalidRequest, std::nullopt},
        {"params null", R"({"jsonrpc":"2.0","id":4,"method":"m","params":null})", rpc::InvalidRequest, QJsonValue(4)},
        {"method and result", R"({"jsonrpc":"2.0","id":4,"method":"m","result":1})", rpc::InvalidRequest, QJsonValue(4)},
        {"no method, with an id", R"({"jsonrpc":"2.0","id":4})", rpc::InvalidRequest, QJsonValue(4)},
        {"no method, with a bad id", R"({"jsonrpc":"2.0","id":{"a":1}})", rpc::InvalidRequest, null},
        {"no method and no id", R"({"jsonrpc":"2.0"})", rpc::InvalidRequest, null},
        {"empty object", "{}", rpc::InvalidRequest, null},
        {"result and error", R"({"jsonrpc":"2.0","id":4,"result":1,"error":{"code":1,"message":"m"}})", rpc::InvalidRequest, std::nullopt},
        {"result without id", R"({"jsonrpc":"2.0","result":1})", rpc::InvalidRequest, std::nullopt},
        {"result for a null id", R"({"jsonrpc":"2.0","id":null,"result":1})", rpc::InvalidRequest, std::nullopt},
        {"error a string", R"({"jsonrpc":"2.0","id":4,"error":"bad"})", rpc::InvalidRequest, std::nullopt},
        {"error code a string", R"({"jsonrpc":"2.0","id":4,"error":{"code":"1","message":"m"}})", rpc::InvalidRequest, std::nullopt},
        {"error code fractional", R"({"jsonrpc":"2.0","id":4,"error":{"code":1.5,"message":"m"}})", rpc::InvalidRequest, std::nullopt},
        {"error code out of range", R"({"jsonrpc":"2.0","id":4,"error":{"code":1e12,"message":"m"}})", rpc::InvalidRequest, std::nullopt},
        {"error message missing", R"({"jsonrpc":"2.0","id":4,"error":{"code":1}})", rpc::InvalidRequest, std::nullopt},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        const rpc::ParseResult result = rpc::parseMessage(c.payload);
        EXPECT_FALSE(result.ok());
        EXPECT_EQ(result.errorCode, c.code);
        EXPECT_FALSE(result.errorText.isEmpty());
        EXPECT_EQ(result.answerId, c.answerId);
    }
}

TEST(JsonRpc, MutatedAndRandomPayloadsNeverCrashAndAlwaysExplainARefusal)
{
    const QByteArray valid = R"({"jsonrpc":"2.0","id":1,"method":"beginExtensionRequest","params":{"inputItems":[{"title":"t","attachments":[{"type":"text/plain","value":"v"}]}]}})";
    std::mt19937 random(99);
    for (int i = 0; i < 3000; ++i) {
        QByteArray payload = valid;
        if (i % 3 == 0) {
            payload = QByteArray(int(random() % 200), Qt::Uninitialized);
            for (char &c : payload)
                c = char(random());
        } else {
            const int edits = 1 + int(random() % 4);
            for (int e = 0; e < edits; ++e)
                payload[int(random() % payload.size())] = char(random());
        }
        const rpc::ParseResult result = rpc::parseMessage(payload);
        if (!result.ok()) {
            ASSERT_TRUE(result.errorCode == rpc::ParseError || result.errorCode == rpc::InvalidRequest) << result.errorCode;
            ASSERT_FALSE(result.errorText.isEmpty());
            ASSERT_TRUE(!result.answerId || rpc::isValidId(*result.answerId));
        } else {
            ASSERT_FALSE(result.message->kind == rpc::MessageKind::Request && !rpc::isValidId(result.message->id));
        }
    }
}
