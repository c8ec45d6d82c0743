// JSON-RPC 2.0 parsing and validation: what is accepted, and each refusal's code and answer id.

#include "platform/extensionkit/json_rpc.h"

#include "tests/support/named_cases.h"

#include <QJsonArray>

#include <gtest/gtest.h>

#include <random>

namespace rpc = zaf::extensionkit::jsonrpc;
using zaf::test::caseName;

ZAF_PRINT_CASES_AS_NAMES

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

TEST(JsonRpc, NestingUpToTheLimitParses)
{
    const QByteArray atLimit = QByteArray(rpc::kMaxNestingDepth - 1, '[') + QByteArray(rpc::kMaxNestingDepth - 1, ']');
    EXPECT_EQ(parsed(R"({"jsonrpc":"2.0","id":1,"method":"m","params":)" + atLimit + "}").kind, rpc::MessageKind::Request);
}

TEST(JsonRpc, BracketsInsideStringsAreNoNesting)
{
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
}

TEST(JsonRpc, MakersLeaveOutWhatCannotBeSent)
{
    // A notification made without params leaves the member out rather than sending null; an error
    // for an id that cannot be echoed goes out with a null id.
    EXPECT_FALSE(rpc::makeNotification("removeExtensionView").contains("params"));
    EXPECT_TRUE(rpc::makeError(QJsonObject{}, rpc::InvalidRequest, "x").value("id").isNull());
}

// Each refusal: the code, and the id an answer must carry (nullopt when it must not be answered).
struct Refusal { const char *name; QByteArray payload; int code; std::optional<QJsonValue> answerId; };

class JsonRpcRefusalTest : public ::testing::TestWithParam<Refusal> {};

TEST_P(JsonRpcRefusalTest, CarriesTheCodeAndTheAnswerId)
{
    const rpc::ParseResult result = rpc::parseMessage(GetParam().payload);
    EXPECT_FALSE(result.ok());
    EXPECT_EQ(result.errorCode, GetParam().code);
    EXPECT_FALSE(result.errorText.isEmpty());
    EXPECT_EQ(result.answerId, GetParam().answerId);
}

const QJsonValue null(QJsonValue::Null);
QByteArray nested(int levels)
{
    return QByteArray(levels, '[') + QByteArray(levels, ']');
}

INSTANTIATE_TEST_SUITE_P(Payloads, JsonRpcRefusalTest, ::testing::Values(
    Refusal{"EmptyPayload", "", rpc::ParseError, null},
    Refusal{"TruncatedJSON", R"({"jsonrpc":"2.0","id":1,"meth)", rpc::ParseError, null},
    Refusal{"InvalidUtf8InANotification", QByteArray("{\"jsonrpc\":\"2.0\",\"method\":\"m\xff\xfe\"}"), rpc::ParseError, std::nullopt},
    Refusal{"InvalidUtf8InARequest", QByteArray("{\"jsonrpc\":\"2.0\",\"id\":8,\"method\":\"m\xff\xfe\"}"), rpc::ParseError, QJsonValue(8)},
    Refusal{"InvalidUtf8InAResponse", QByteArray("{\"jsonrpc\":\"2.0\",\"id\":8,\"result\":\"\xff\"}"), rpc::ParseError, std::nullopt},
    Refusal{"InvalidUtf8AndJSON", QByteArray("\xff\xfe{"), rpc::ParseError, null},
    Refusal{"OverlongUtf8Encoding", QByteArray("{\"jsonrpc\":\"2.0\",\"method\":\"\xc0\xaf\"}"), rpc::ParseError, std::nullopt},
    Refusal{"LoneSurrogateInUtf8", QByteArray("{\"jsonrpc\":\"2.0\",\"id\":\"s\",\"method\":\"\xed\xa0\x80\"}"), rpc::ParseError, QJsonValue("s")},
    Refusal{"TrailingGarbage", R"({"jsonrpc":"2.0","method":"m"} x)", rpc::ParseError, null},
    Refusal{"ANumber", "42", rpc::InvalidRequest, null},
    Refusal{"ABatch", R"([{"jsonrpc":"2.0","id":1,"method":"m"}])", rpc::InvalidRequest, null},
    Refusal{"RequestNestedOneLevelTooDeep", R"({"jsonrpc":"2.0","id":"d","method":"m","params":)" + nested(rpc::kMaxNestingDepth) + "}", rpc::ParseError, QJsonValue("d")},
    Refusal{"DeepRequestWithABadId", R"({"jsonrpc":"2.0","id":[],"method":"m","params":)" + nested(500) + "}", rpc::ParseError, null},
    Refusal{"NotificationNestedTooDeep", R"({"jsonrpc":"2.0","method":"m","params":)" + nested(100000) + "}", rpc::ParseError, std::nullopt},
    Refusal{"BatchNestedTooDeep", nested(100000), rpc::ParseError, null},
    Refusal{"DeepAndInvalidUtf8", QByteArray("{\"jsonrpc\":\"2.0\",\"id\":2,\"method\":\"\xff\",\"params\":") + nested(70) + "}", rpc::ParseError, QJsonValue(2)},
    Refusal{"MissingVersion", R"({"id":1,"method":"m"})", rpc::InvalidRequest, QJsonValue(1)},
    Refusal{"Version1", R"({"jsonrpc":"1.0","id":1,"method":"m"})", rpc::InvalidRequest, QJsonValue(1)},
    Refusal{"NumericVersion", R"({"jsonrpc":2.0,"id":"x","method":"m"})", rpc::InvalidRequest, QJsonValue("x")},
    Refusal{"MethodANumber", R"({"jsonrpc":"2.0","id":3,"method":12})", rpc::InvalidRequest, QJsonValue(3)},
    Refusal{"MethodEmpty", R"({"jsonrpc":"2.0","id":3,"method":""})", rpc::InvalidRequest, QJsonValue(3)},
    Refusal{"MethodAnObjectInANotification", R"({"jsonrpc":"2.0","method":{}})", rpc::InvalidRequest, std::nullopt},
    Refusal{"IdAnObject", R"({"jsonrpc":"2.0","id":{},"method":"m"})", rpc::InvalidRequest, null},
    Refusal{"IdABoolean", R"({"jsonrpc":"2.0","id":true,"method":"m"})", rpc::InvalidRequest, null},
    Refusal{"ParamsAString", R"({"jsonrpc":"2.0","id":4,"method":"m","params":"x"})", rpc::InvalidRequest, QJsonValue(4)},
    Refusal{"ParamsANumber", R"({"jsonrpc":"2.0","method":"m","params":5})", rpc::InvalidRequest, std::nullopt},
    Refusal{"ParamsNull", R"({"jsonrpc":"2.0","id":4,"method":"m","params":null})", rpc::InvalidRequest, QJsonValue(4)},
    Refusal{"MethodAndResult", R"({"jsonrpc":"2.0","id":4,"method":"m","result":1})", rpc::InvalidRequest, QJsonValue(4)},
    Refusal{"NoMethodWithAnId", R"({"jsonrpc":"2.0","id":4})", rpc::InvalidRequest, QJsonValue(4)},
    Refusal{"NoMethodWithABadId", R"({"jsonrpc":"2.0","id":{"a":1}})", rpc::InvalidRequest, null},
    Refusal{"NoMethodAndNoId", R"({"jsonrpc":"2.0"})", rpc::InvalidRequest, null},
    Refusal{"EmptyObject", "{}", rpc::InvalidRequest, null},
    Refusal{"ResultAndError", R"({"jsonrpc":"2.0","id":4,"result":1,"error":{"code":1,"message":"m"}})", rpc::InvalidRequest, std::nullopt},
    Refusal{"ResultWithoutId", R"({"jsonrpc":"2.0","result":1})", rpc::InvalidRequest, std::nullopt},
    Refusal{"ResultForANullId", R"({"jsonrpc":"2.0","id":null,"result":1})", rpc::InvalidRequest, std::nullopt},
    Refusal{"ErrorAString", R"({"jsonrpc":"2.0","id":4,"error":"bad"})", rpc::InvalidRequest, std::nullopt},
    Refusal{"ErrorCodeAString", R"({"jsonrpc":"2.0","id":4,"error":{"code":"1","message":"m"}})", rpc::InvalidRequest, std::nullopt},
    Refusal{"ErrorCodeFractional", R"({"jsonrpc":"2.0","id":4,"error":{"code":1.5,"message":"m"}})", rpc::InvalidRequest, std::nullopt},
    Refusal{"ErrorCodeOutOfRange", R"({"jsonrpc":"2.0","id":4,"error":{"code":1e12,"message":"m"}})", rpc::InvalidRequest, std::nullopt},
    Refusal{"ErrorMessageMissing", R"({"jsonrpc":"2.0","id":4,"error":{"code":1}})", rpc::InvalidRequest, std::nullopt}), caseName);

TEST(JsonRpc, RandomPayloadRefusalsAreExplained)
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
