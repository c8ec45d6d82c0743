#include "platform/extensionkit/channel.h"

#include "platform/dispatch.h"
#include "platform/extensionkit/extensionkit_log.h"
#include "platform/extensionkit/json_rpc.h"
#include "platform/log.h"

#include <QThread>

#include <cerrno>

namespace zaf::extensionkit {

namespace {

QString describeId(const QJsonValue &id)
{
    if (id.isString())
        return QStringLiteral("\"%1\"").arg(id.toString());
    if (id.isDouble())
        return QString::number(id.toDouble());
    return QStringLiteral("null");
}

} // namespace

std::shared_ptr<Channel> Channel::create(int fd, std::uint32_t maxIncomingFrameLength)
{
    // The last reference may be dropped on a worker thread (a proxy held by a background task): the
    // object, with its socket notifier, must then be deleted on its own thread.
    return std::shared_ptr<Channel>(new Channel(fd, maxIncomingFrameLength), [](Channel *channel) {
        if (QThread::currentThread() == channel->thread())
            delete channel;
        else
            zaf::dispatch::onThreadOf(channel, [channel] { delete channel; });
    });
}

Channel::Channel(int fd, std::uint32_t maxIncomingFrameLength)
    : m_socket(UniqueFd(fd), maxIncomingFrameLength, FramedSocket::FullBuffer::Wait, QStringLiteral("the host"))
{
    connect(&m_socket, &FramedSocket::frameReceived, this, &Channel::handlePayload);
    connect(&m_socket, &FramedSocket::protocolError, this, &Channel::reportProtocolError);
    connect(&m_socket, &FramedSocket::closed, this, [this](const QString &reason) {
        log::notice(lcExtensionKit(), QStringLiteral("channel closed: %1").arg(reason));
        Q_EMIT closed(reason);
    });
}

Channel::~Channel() = default;

bool Channel::start(QString *error)
{
    QString text;
    if (!m_socket.start(&text)) {
        log::error(lcExtensionKit(), QStringLiteral("channel: %1").arg(text));
        if (error)
            *error = text;
        return false;
    }
    log::info(lcExtensionKit(), QStringLiteral("channel: reading descriptor %1").arg(m_socket.fd()));
    return true;
}

bool Channel::isOpen() const
{
    return m_socket.isOpen();
}

int Channel::fd() const
{
    return m_socket.fd();
}

void Channel::close(const QString &reason)
{
    m_socket.close(reason);
}

void Channel::handlePayload(const QByteArray &payload)
{
    const jsonrpc::ParseResult parsed = jsonrpc::parseMessage(payload);
    if (!parsed.ok()) {
        const QString text = QStringLiteral("malformed message (%1): %2").arg(jsonrpc::errorCodeName(parsed.errorCode), parsed.errorText);
        if (parsed.answerId) {
            if (const OptionalError error = sendError(*parsed.answerId, parsed.errorCode, parsed.errorText))
                log::error(lcExtensionKit(), QStringLiteral("channel: cannot answer a malformed message: %1").arg(error->description()));
        }
        reportProtocolError(text);
        return;
    }
    const jsonrpc::Message &message = *parsed.message;
    switch (message.kind) {
    case jsonrpc::MessageKind::Request:
        log::info(lcExtensionKit(), QStringLiteral("channel: request %1 id %2").arg(message.method, describeId(message.id)));
        Q_EMIT requestReceived(message.id, message.method, message.params);
        break;
    case jsonrpc::MessageKind::Notification:
        log::info(lcExtensionKit(), QStringLiteral("channel: notification %1").arg(message.method));
        Q_EMIT notificationReceived(message.method, message.params);
        break;
    case jsonrpc::MessageKind::Response:
        log::notice(lcExtensionKit(), QStringLiteral("channel: ignoring a response to id %1 (no request was sent)").arg(describeId(message.id)));
        break;
    case jsonrpc::MessageKind::ErrorResponse:
        log::error(lcExtensionKit(), QStringLiteral("channel: the host reported error %1 for id %2: %3")
                                       .arg(message.errorCode)
                                       .arg(describeId(message.id), message.errorMessage));
        break;
    }
}

void Channel::reportProtocolError(const QString &text)
{
    log::error(lcExtensionKit(), QStringLiteral("channel protocol error: %1").arg(text));
    Q_EMIT protocolError(text);
}

OptionalError Channel::sendMessage(const QJsonObject &message)
{
    return sendFrame(jsonrpc::serialize(message));
}

OptionalError Channel::sendNotification(const QString &method, const QJsonValue &params)
{
    return sendMessage(jsonrpc::makeNotification(method, params));
}

OptionalError Channel::sendResult(const QJsonValue &id, const QJsonValue &result)
{
    return sendMessage(jsonrpc::makeResult(id, result));
}

OptionalError Channel::sendError(const QJsonValue &id, int code, const QString &message, const QJsonValue &data)
{
    return sendMessage(jsonrpc::makeError(id, code, message, data));
}

OptionalError Channel::sendFrame(const QByteArray &payload)
{
    const OptionalError error = m_socket.sendFrame(payload);
    if (error && error->code == ETIMEDOUT)
        log::error(lcExtensionKit(), QStringLiteral("channel: the host did not read in time; message dropped"));
    return error;
}

} // namespace zaf::extensionkit
