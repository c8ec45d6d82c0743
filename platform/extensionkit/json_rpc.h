#pragma once

// JSON-RPC 2.0 messages as the host channel carries them: parsing and validation of one payload
// (a request, a notification, a response or an error response) and the making of the messages this
// side sends. Batches are not part of the channel's protocol: one is refused whole, with one error.
//
// Threads: pure functions, callable from any thread.

#include <QByteArray>
#include <QJsonObject>
#include <QJsonValue>
#include <QString>

#include <optional>

namespace zaf::extensionkit::jsonrpc {

// The standard error codes.
enum ErrorCode : int {
    ParseError = -32700,
    InvalidRequest = -32600,
    MethodNotFound = -32601,
    InvalidParams = -32602,
    InternalError = -32603,
    // The channel's own, from the range JSON-RPC leaves to servers: the request speaks a major
    // protocol version this extension does not (protocol_version.h).
    UnsupportedProtocolVersion = -32001,
};

// Messages nested deeper than this (arrays and objects; the message itself is level 1) are refused
// unparsed. Real messages of the channel nest a handful of levels.
inline constexpr int kMaxNestingDepth = 64;

enum class MessageKind {
    Request,        // method and id: must be answered
    Notification,   // method, no id: never answered
    Response,       // result and id
    ErrorResponse,  // error and id (null when the peer could not read our id)
};

struct Message {
    MessageKind kind = MessageKind::Notification;
    // Request and responses: a string, a number or null. Undefined for notifications.
    QJsonValue id;
    // Requests and notifications.
    QString method;
    // Requests and notifications: an object, an array, or undefined when absent.
    QJsonValue params;
    // Responses.
    QJsonValue result;
    // Error responses.
    int errorCode = 0;
    QString errorMessage;
    QJsonValue errorData;
};

// The outcome of parsing one payload: a valid message, or the error to report.
struct ParseResult {
    std::optional<Message> message;
    // On failure: ParseError (not UTF-8, not JSON, nested too deep) or InvalidRequest (a batch, or
    // JSON that is no valid JSON-RPC 2.0 message), and a text saying why.
    int errorCode = 0;
    QString errorText;
    // On failure: the id to answer with. A request's own id where it can be read (an id of a wrong
    // type becomes null), null where no id can be read. Absent for a notification (a "method"
    // without "id") and for anything that looks like a response: those are only logged.
    std::optional<QJsonValue> answerId;

    bool ok() const { return message.has_value(); }
};

// Validates `payload` as UTF-8 and parses it as one JSON-RPC 2.0 message.
ParseResult parseMessage(const QByteArray &payload);

// True for the id types JSON-RPC 2.0 allows in a request (string or number; null is tolerated).
bool isValidId(const QJsonValue &id);

// Message makers. `params` must be an object or an array, or undefined to leave it out.
QJsonObject makeRequest(const QJsonValue &id, const QString &method, const QJsonValue &params = QJsonValue::Undefined);
QJsonObject makeNotification(const QString &method, const QJsonValue &params = QJsonValue::Undefined);
QJsonObject makeResult(const QJsonValue &id, const QJsonValue &result);
QJsonObject makeError(const QJsonValue &id, int code, const QString &message, const QJsonValue &data = QJsonValue::Undefined);

// The compact UTF-8 JSON text of a message (a frame's payload).
QByteArray serialize(const QJsonObject &message);

// A short human-readable name of a standard code ("parse error", ...), for logs.
QString errorCodeName(int code);

} // namespace zaf::extensionkit::jsonrpc
