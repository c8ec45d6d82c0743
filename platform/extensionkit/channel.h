#pragma once

// Channel: the extension's end of the host connection, a FramedSocket (framed_socket.h) carrying
// JSON-RPC 2.0 messages (json_rpc.h).
//
// Threads: created, started, closed and destroyed on the main thread, which reads the socket; every
// signal is emitted there. The send functions may be called from any thread: each frame is written
// whole, and a full socket buffer is waited on for at most the write timeout. Writes never raise
// SIGPIPE; a failed write returns an Error in the POSIX domain whose code is the errno.
//
// Incoming messages: valid requests and notifications are emitted; responses are logged (this side
// never asks the host anything). A malformed message is logged and emitted as protocolError(), and
// answered with a JSON-RPC error unless it is a notification or a response (see json_rpc.h). A frame length above the cap, a
// failed read or the peer's end of stream closes the channel: closed() is emitted once, the socket
// is closed and later sends fail with EPIPE.
//
// Lifetime: use create(), whose shared pointer may be released on any thread (the object is then
// deleted on its own thread). Slots must not delete the channel directly.

#include "platform/error.h"
#include "platform/extensionkit/frame_codec.h"
#include "platform/extensionkit/framed_socket.h"

#include <QJsonArray>
#include <QJsonObject>
#include <QJsonValue>
#include <QObject>
#include <QString>

#include <memory>

namespace zaf::extensionkit {

class Channel : public QObject {
    Q_OBJECT
public:
    // Takes ownership of `fd` (a connected stream socket; it is made non-blocking and close-on-exec).
    static std::shared_ptr<Channel> create(int fd, std::uint32_t maxIncomingFrameLength = kDefaultMaxFrameLength);
    ~Channel() override;

    // Main thread: starts reading. False (with `error` filled) when the descriptor is not usable.
    bool start(QString *error = nullptr);
    // Main thread: closes the socket (idempotent); emits closed(reason) when it was open.
    void close(const QString &reason);
    bool isOpen() const;
    int fd() const;

    // Any thread: write one message. nullopt on success.
    OptionalError sendMessage(const QJsonObject &message);
    OptionalError sendNotification(const QString &method, const QJsonValue &params = QJsonValue::Undefined);
    OptionalError sendResult(const QJsonValue &id, const QJsonValue &result);
    OptionalError sendError(const QJsonValue &id, int code, const QString &message, const QJsonValue &data = QJsonValue::Undefined);
    // Any thread: write one frame with this payload.
    OptionalError sendFrame(const QByteArray &payload);

    // The longest a send waits for room in a full socket buffer before failing with ETIMEDOUT.
    void setWriteTimeout(int milliseconds) { m_socket.setWriteTimeout(milliseconds); }

Q_SIGNALS:
    // Main thread: a request; answer it with sendResult or sendError using `id`.
    void requestReceived(const QJsonValue &id, const QString &method, const QJsonValue &params);
    // Main thread: a notification (never answered).
    void notificationReceived(const QString &method, const QJsonValue &params);
    // Main thread: a malformed message or frame (already logged).
    void protocolError(const QString &text);
    // Main thread: the channel has closed (peer closed, read error, oversized frame, or close()).
    // Emitted once.
    void closed(const QString &reason);

private:
    Channel(int fd, std::uint32_t maxIncomingFrameLength);
    void handlePayload(const QByteArray &payload);
    void reportProtocolError(const QString &text);

    FramedSocket m_socket;
};

} // namespace zaf::extensionkit
