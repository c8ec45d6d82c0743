#include "host/extension_conversation.h"

#include "host/host_log.h"
#include "platform/extensionkit/json_rpc.h"
#include "platform/extensionkit/protocol_version.h"
#include "platform/log.h"

#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>

namespace zaf::host {

namespace {

namespace rpc = zaf::extensionkit::jsonrpc;
using zaf::extensionkit::kProtocolVersion;
using zaf::extensionkit::kProtocolVersionKey;

const QString kMethodBegin = QStringLiteral("beginExtensionRequest");
const QString kMethodRemove = QStringLiteral("removeExtensionView");
const QString kMethodFinish = QStringLiteral("extensionDidFinishWithActivityTypes");

ExtensionMessage protocolError(const QString &text)
{
    log::error(lcHost(), text);
    ExtensionMessage message;
    message.kind = ExtensionMessage::Kind::ProtocolError;
    message.text = text;
    return message;
}

ExtensionMessage refused(int code, const QString &text)
{
    log::error(lcHost(), text);
    ExtensionMessage message;
    message.kind = ExtensionMessage::Kind::Refused;
    message.errorCode = code;
    message.text = text;
    return message;
}

// extensionDidFinishWithActivityTypes: params are a one-element array holding the array of types.
ExtensionMessage report(const QJsonValue &params)
{
    const QJsonArray outer = params.toArray();
    if (!params.isArray() || outer.size() != 1 || !outer.at(0).isArray())
        return protocolError(QStringLiteral("malformed %1: params must be a one-element array holding an array of strings").arg(kMethodFinish));
    ExtensionMessage message;
    message.kind = ExtensionMessage::Kind::Reported;
    for (const QJsonValue &value : outer.at(0).toArray()) {
        if (!value.isString())
            return protocolError(QStringLiteral("malformed %1: an activity type is not a string").arg(kMethodFinish));
        message.activityTypes.append(value.toString());
    }
    log::info(lcHost(), QStringLiteral("the extension finished with activity types [%1]").arg(message.activityTypes.join(QStringLiteral(", "))));
    return message;
}

} // namespace

QByteArray ExtensionConversation::beginRequest(const QList<InputItem> &items)
{
    m_pendingRequestId = m_nextRequestId++;
    const QJsonObject params{{QLatin1String(kProtocolVersionKey), kProtocolVersion.toString()}, {QStringLiteral("inputItems"), toJson(items)}};
    return rpc::serialize(rpc::makeRequest(m_pendingRequestId, kMethodBegin, params));
}

QByteArray ExtensionConversation::removeView()
{
    return rpc::serialize(rpc::makeNotification(kMethodRemove));
}

ExtensionMessage ExtensionConversation::interpret(const QByteArray &payload)
{
    const rpc::ParseResult parsed = rpc::parseMessage(payload);
    if (!parsed.ok()) {
        ExtensionMessage message = protocolError(QStringLiteral("malformed message from the extension: %1").arg(parsed.errorText));
        // A request is answered with its id; a message whose id cannot be read is only reported.
        if (parsed.answerId && !parsed.answerId->isNull())
            message.answer = rpc::serialize(rpc::makeError(*parsed.answerId, parsed.errorCode, parsed.errorText));
        return message;
    }
    const rpc::Message &message = *parsed.message;
    switch (message.kind) {
    case rpc::MessageKind::Request: {
        // The host offers no methods to call; only notifications are expected.
        ExtensionMessage unknown = protocolError(QStringLiteral("the extension called the unknown method %1").arg(message.method));
        unknown.answer = rpc::serialize(rpc::makeError(message.id, rpc::MethodNotFound, QStringLiteral("Method not found")));
        return unknown;
    }
    case rpc::MessageKind::Notification:
        if (message.method != kMethodFinish)
            return protocolError(QStringLiteral("the extension sent the unknown notification %1").arg(message.method));
        return report(message.params);
    case rpc::MessageKind::Response:
    case rpc::MessageKind::ErrorResponse:
        break;
    }

    if (!message.id.isDouble() || message.id.toInt() != m_pendingRequestId || m_pendingRequestId == 0) {
        return protocolError(QStringLiteral("the extension answered a request that is not pending (id %1)")
                                 .arg(QString::fromUtf8(QJsonDocument(QJsonArray{message.id}).toJson(QJsonDocument::Compact))));
    }
    m_pendingRequestId = 0; // answered: a second answer is an error
    if (message.kind == rpc::MessageKind::ErrorResponse)
        return refused(message.errorCode, QStringLiteral("the extension refused the request: %1 (%2)").arg(message.errorMessage).arg(message.errorCode));
    const QJsonValue accepted = message.result.toObject().value(QStringLiteral("accepted"));
    if (!accepted.isBool())
        return protocolError(QStringLiteral("malformed answer to %1: the result must be {\"accepted\": true|false}").arg(kMethodBegin));
    if (!accepted.toBool())
        return refused(0, QStringLiteral("the extension did not accept the request"));
    ExtensionMessage answer;
    answer.kind = ExtensionMessage::Kind::Accepted;
    // An extension from before the version existed states none: it speaks 1.0.
    answer.protocolVersion = message.result.toObject().value(QLatin1String(kProtocolVersionKey)).toString(QStringLiteral("1.0"));
    log::info(lcHost(), QStringLiteral("the extension accepted the request (protocol %1, ours %2)").arg(answer.protocolVersion, kProtocolVersion.toString()));
    return answer;
}

} // namespace zaf::host
