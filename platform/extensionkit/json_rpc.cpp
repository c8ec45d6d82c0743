#include "platform/extensionkit/json_rpc.h"

#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonParseError>
#include <QStringDecoder>

#include <algorithm>
#include <cmath>

namespace zaf::extensionkit::jsonrpc {

namespace {

ParseResult failure(int code, const QString &text, std::optional<QJsonValue> answerId = std::nullopt)
{
    ParseResult result;
    result.errorCode = code;
    result.errorText = text;
    result.answerId = std::move(answerId);
    return result;
}

QString typeName(const QJsonValue &value)
{
    switch (value.type()) {
    case QJsonValue::Null: return QStringLiteral("null");
    case QJsonValue::Bool: return QStringLiteral("boolean");
    case QJsonValue::Double: return QStringLiteral("number");
    case QJsonValue::String: return QStringLiteral("string");
    case QJsonValue::Array: return QStringLiteral("array");
    case QJsonValue::Object: return QStringLiteral("object");
    case QJsonValue::Undefined: break;
    }
    return QStringLiteral("absent");
}

QJsonValue idOrNull(const QJsonValue &id)
{
    return isValidId(id) ? id : QJsonValue(QJsonValue::Null);
}

bool isValidUtf8(const QByteArray &bytes)
{
    QStringDecoder decoder(QStringDecoder::Utf8, QStringDecoder::Flag::Stateless);
    const QString text = decoder.decode(bytes);
    Q_UNUSED(text);
    return !decoder.hasError();
}

// Walks JSON text one character at a time and keeps the nesting depth of arrays and objects;
// brackets inside strings do not count.
struct NestingScanner {
    int depth = 0;
    bool inString = false, escaped = false;

    void step(char c)
    {
        if (inString) {
            if (escaped)
                escaped = false;
            else if (c == '\\')
                escaped = true;
            else if (c == '"')
                inString = false;
        } else if (c == '"') {
            inString = true;
        } else if (c == '{' || c == '[') {
            ++depth;
        } else if ((c == '}' || c == ']') && depth > 0) {
            --depth;
        }
    }
};

// The deepest nesting of arrays and objects in `text` (a top-level object counts 1), read in one
// pass without recursion. Stops counting once `limit` is passed.
int nestingDepth(const QByteArray &text, int limit)
{
    NestingScanner scanner;
    int deepest = 0;
    for (const char c : text) {
        scanner.step(c);
        deepest = std::max(deepest, scanner.depth);
        if (deepest > limit)
            break;
    }
    return deepest;
}

// `text` with every array or object inside the top-level value replaced by null: the envelope of
// a message (its id and method) without its contents, which can be read however deep they go.
QByteArray envelopeOf(const QByteArray &text)
{
    QByteArray out;
    out.reserve(text.size());
    NestingScanner scanner;
    for (const char c : text) {
        const int before = scanner.depth;
        scanner.step(c);
        if (before <= 1 && scanner.depth <= 1)
            out.append(c);
        else if (before == 1 && scanner.depth == 2)
            out.append("null");
    }
    return out;
}

// Whether, and with which id, a refused object is answered. A request (a "method" with an "id")
// is answered with its id, or null when the id has a wrong type. A notification (a "method"
// without "id") is never answered, and neither is anything that looks like a response, so two
// peers can never answer each other's errors back and forth. Whatever else cannot be told apart
// is answered with a null id, as JSON-RPC 2.0 asks.
std::optional<QJsonValue> answerIdFor(const QJsonObject &object)
{
    const bool hasId = object.contains(QLatin1String("id"));
    if (object.contains(QLatin1String("method")))
        return hasId ? std::optional<QJsonValue>(idOrNull(object.value(QLatin1String("id")))) : std::nullopt;
    if (object.contains(QLatin1String("result")) || object.contains(QLatin1String("error")))
        return std::nullopt;
    return hasId ? idOrNull(object.value(QLatin1String("id"))) : QJsonValue(QJsonValue::Null);
}

// The answer id of a payload that is refused before it is parsed (bad UTF-8, too deep): read from
// its envelope where that is a readable object; null otherwise.
std::optional<QJsonValue> salvagedAnswerId(const QByteArray &utf8)
{
    QJsonParseError error;
    const QJsonDocument envelope = QJsonDocument::fromJson(envelopeOf(utf8), &error);
    if (error.error == QJsonParseError::NoError && envelope.isObject())
        return answerIdFor(envelope.object());
    return QJsonValue(QJsonValue::Null);
}

} // namespace

bool isValidId(const QJsonValue &id)
{
    if (id.isString() || id.isNull())
        return true;
    return id.isDouble() && std::isfinite(id.toDouble());
}

ParseResult parseMessage(const QByteArray &payload)
{
    // Bad bytes cannot be parsed, but the id of a request is still read (the bad bytes replaced)
    // so that the refusal reaches the request it refuses.
    if (!isValidUtf8(payload))
        return failure(ParseError, QStringLiteral("message is not valid UTF-8"), salvagedAnswerId(QString::fromUtf8(payload).toUtf8()));
    // Deep nesting is refused before the JSON parser, which recurses once per level, ever sees it.
    if (nestingDepth(payload, kMaxNestingDepth) > kMaxNestingDepth)
        return failure(ParseError, QStringLiteral("message nested deeper than %1 levels").arg(kMaxNestingDepth), salvagedAnswerId(payload));

    QJsonParseError parseError;
    const QJsonDocument document = QJsonDocument::fromJson(payload, &parseError);
    if (parseError.error != QJsonParseError::NoError) {
        // The parser takes only an object or an array at the top; a lone number or string is
        // still valid JSON, just no request.
        QJsonParseError wrappedError;
        const QJsonDocument wrapped = QJsonDocument::fromJson('[' + payload + ']', &wrappedError);
        if (wrappedError.error == QJsonParseError::NoError && wrapped.array().size() == 1)
            return failure(InvalidRequest, QStringLiteral("message is not a JSON object"), QJsonValue(QJsonValue::Null));
        return failure(ParseError, QStringLiteral("invalid JSON at offset %1: %2").arg(parseError.offset).arg(parseError.errorString()),
                       QJsonValue(QJsonValue::Null));
    }
    // Batches are not supported: the host sends one message per frame and waits for each answer,
    // so a batch is refused whole with one error, whatever it holds.
    if (document.isArray())
        return failure(InvalidRequest, QStringLiteral("batch messages are not supported"), QJsonValue(QJsonValue::Null));
    if (!document.isObject())
        return failure(InvalidRequest, QStringLiteral("message is not a JSON object"), QJsonValue(QJsonValue::Null));

    const QJsonObject object = document.object();
    const bool hasId = object.contains(QLatin1String("id"));
    const QJsonValue id = object.value(QLatin1String("id"));
    const bool hasMethod = object.contains(QLatin1String("method"));
    const std::optional<QJsonValue> answerId = answerIdFor(object);

    const QJsonValue version = object.value(QLatin1String("jsonrpc"));
    if (version != QJsonValue(QStringLiteral("2.0")))
        return failure(InvalidRequest, QStringLiteral("\"jsonrpc\" must be \"2.0\" (got %1)").arg(typeName(version)), answerId);

    const bool hasResult = object.contains(QLatin1String("result"));
    const bool hasError = object.contains(QLatin1String("error"));

    if (hasMethod) {
        if (hasResult || hasError)
            return failure(InvalidRequest, QStringLiteral("a message cannot carry both \"method\" and \"result\"/\"error\""), answerId);
        const QJsonValue method = object.value(QLatin1String("method"));
        if (!method.isString() || method.toString().isEmpty())
            return failure(InvalidRequest, QStringLiteral("\"method\" must be a non-empty string (got %1)").arg(typeName(method)), answerId);
        if (hasId && !isValidId(id))
            return failure(InvalidRequest, QStringLiteral("\"id\" must be a string or a number (got %1)").arg(typeName(id)), answerId);
        const QJsonValue params = object.value(QLatin1String("params"));
        if (object.contains(QLatin1String("params")) && !params.isObject() && !params.isArray())
            return failure(InvalidRequest, QStringLiteral("\"params\" must be an object or an array (got %1)").arg(typeName(params)), answerId);
        Message message;
        message.kind = hasId ? MessageKind::Request : MessageKind::Notification;
        message.id = hasId ? id : QJsonValue(QJsonValue::Undefined);
        message.method = method.toString();
        message.params = object.contains(QLatin1String("params")) ? params : QJsonValue(QJsonValue::Undefined);
        ParseResult result;
        result.message = std::move(message);
        return result;
    }

    if (hasResult == hasError)
        return failure(InvalidRequest, hasResult ? QStringLiteral("a response cannot carry both \"result\" and \"error\"")
                                                 : QStringLiteral("message has neither \"method\" nor \"result\" nor \"error\""),
                       answerId);
    if (!hasId)
        return failure(InvalidRequest, QStringLiteral("a response must carry an \"id\""));
    if (!isValidId(id))
        return failure(InvalidRequest, QStringLiteral("\"id\" must be a string, a number or null (got %1)").arg(typeName(id)));

    Message message;
    message.id = id;
    if (hasResult) {
        if (id.isNull())
            return failure(InvalidRequest, QStringLiteral("a result must answer a non-null \"id\""));
        message.kind = MessageKind::Response;
        message.result = object.value(QLatin1String("result"));
    } else {
        const QJsonValue error = object.value(QLatin1String("error"));
        if (!error.isObject())
            return failure(InvalidRequest, QStringLiteral("\"error\" must be an object (got %1)").arg(typeName(error)));
        const QJsonObject errorObject = error.toObject();
        const QJsonValue code = errorObject.value(QLatin1String("code"));
        const double codeNumber = code.toDouble();
        if (!code.isDouble() || !std::isfinite(codeNumber) || codeNumber != std::floor(codeNumber) || codeNumber < -2147483648.0 || codeNumber > 2147483647.0)
            return failure(InvalidRequest, QStringLiteral("\"error.code\" must be an integer (got %1)").arg(typeName(code)));
        const QJsonValue text = errorObject.value(QLatin1String("message"));
        if (!text.isString())
            return failure(InvalidRequest, QStringLiteral("\"error.message\" must be a string (got %1)").arg(typeName(text)));
        message.kind = MessageKind::ErrorResponse;
        message.errorCode = int(codeNumber);
        message.errorMessage = text.toString();
        message.errorData = errorObject.value(QLatin1String("data"));
    }
    ParseResult result;
    result.message = std::move(message);
    return result;
}

QJsonObject makeRequest(const QJsonValue &id, const QString &method, const QJsonValue &params)
{
    QJsonObject object{{QStringLiteral("jsonrpc"), QStringLiteral("2.0")}, {QStringLiteral("id"), id}, {QStringLiteral("method"), method}};
    if (params.isObject() || params.isArray())
        object.insert(QStringLiteral("params"), params);
    return object;
}

QJsonObject makeNotification(const QString &method, const QJsonValue &params)
{
    QJsonObject object{{QStringLiteral("jsonrpc"), QStringLiteral("2.0")}, {QStringLiteral("method"), method}};
    if (params.isObject() || params.isArray())
        object.insert(QStringLiteral("params"), params);
    return object;
}

QJsonObject makeResult(const QJsonValue &id, const QJsonValue &result)
{
    return QJsonObject{{QStringLiteral("jsonrpc"), QStringLiteral("2.0")},
                       {QStringLiteral("id"), id},
                       {QStringLiteral("result"), result.isUndefined() ? QJsonValue(QJsonValue::Null) : result}};
}

QJsonObject makeError(const QJsonValue &id, int code, const QString &message, const QJsonValue &data)
{
    QJsonObject error{{QStringLiteral("code"), code}, {QStringLiteral("message"), message}};
    if (!data.isUndefined())
        error.insert(QStringLiteral("data"), data);
    return QJsonObject{{QStringLiteral("jsonrpc"), QStringLiteral("2.0")},
                       {QStringLiteral("id"), isValidId(id) ? id : QJsonValue(QJsonValue::Null)},
                       {QStringLiteral("error"), error}};
}

QByteArray serialize(const QJsonObject &message)
{
    return QJsonDocument(message).toJson(QJsonDocument::Compact);
}

QString errorCodeName(int code)
{
    switch (code) {
    case ParseError: return QStringLiteral("parse error");
    case InvalidRequest: return QStringLiteral("invalid request");
    case MethodNotFound: return QStringLiteral("method not found");
    case InvalidParams: return QStringLiteral("invalid params");
    case InternalError: return QStringLiteral("internal error");
    case UnsupportedProtocolVersion: return QStringLiteral("unsupported protocol version");
    default: break;
    }
    return QStringLiteral("error %1").arg(code);
}

} // namespace zaf::extensionkit::jsonrpc
