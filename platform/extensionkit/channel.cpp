#include "platform/extensionkit/channel.h"

#include "platform/dispatch.h"
#include "platform/extensionkit/extensionkit_log.h"
#include "platform/extensionkit/json_rpc.h"
#include "platform/log.h"

#include <QElapsedTimer>
#include <QPointer>
#include <QSocketNotifier>
#include <QThread>

#include <cerrno>
#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

namespace zaf::extensionkit {

namespace {

// Reads per readiness notification: a peer that writes without pause cannot starve the event loop.
constexpr int kMaxReadsPerActivation = 16;
constexpr qsizetype kReadChunkSize = 64 * 1024;

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

Channel::Channel(int fd, std::uint32_t maxIncomingFrameLength) : m_fd(fd), m_decoder(maxIncomingFrameLength) {}

Channel::~Channel()
{
    delete m_notifier;
    m_notifier = nullptr;
    std::lock_guard lock(m_writeMutex);
    if (m_fd >= 0) {
        ::close(m_fd);
        m_fd = -1;
    }
}

bool Channel::start(QString *error)
{
    auto fail = [&](const QString &text) {
        log::error(lcExtensionKit(), QStringLiteral("channel: %1").arg(text));
        if (error)
            *error = text;
        return false;
    };
    if (m_started)
        return fail(QStringLiteral("already started"));
    int fd = -1;
    {
        std::lock_guard lock(m_writeMutex);
        fd = m_fd;
    }
    if (fd < 0)
        return fail(QStringLiteral("no descriptor"));
    const int flags = ::fcntl(fd, F_GETFL);
    if (flags < 0)
        return fail(QStringLiteral("descriptor %1 is not open: %2").arg(fd).arg(Error::fromErrno(errno).message));
    if (::fcntl(fd, F_SETFL, flags | O_NONBLOCK) < 0)
        return fail(QStringLiteral("cannot make descriptor %1 non-blocking: %2").arg(fd).arg(Error::fromErrno(errno).message));
    const int fdFlags = ::fcntl(fd, F_GETFD);
    if (fdFlags >= 0)
        ::fcntl(fd, F_SETFD, fdFlags | FD_CLOEXEC);
    m_started = true;
    m_notifier = new QSocketNotifier(fd, QSocketNotifier::Read, this);
    connect(m_notifier, &QSocketNotifier::activated, this, [this] { onReadable(); });
    log::info(lcExtensionKit(), QStringLiteral("channel: reading descriptor %1").arg(fd));
    return true;
}

bool Channel::isOpen() const
{
    std::lock_guard lock(m_writeMutex);
    return m_fd >= 0;
}

int Channel::fd() const
{
    std::lock_guard lock(m_writeMutex);
    return m_fd;
}

void Channel::close(const QString &reason)
{
    if (m_notifier) {
        m_notifier->setEnabled(false);
        m_notifier->deleteLater();
        m_notifier = nullptr;
    }
    {
        std::lock_guard lock(m_writeMutex);
        if (m_fd >= 0) {
            ::close(m_fd);
            m_fd = -1;
        }
    }
    if (m_closed)
        return;
    m_closed = true;
    log::notice(lcExtensionKit(), QStringLiteral("channel closed: %1").arg(reason));
    Q_EMIT closed(reason);
}

void Channel::onReadable()
{
    QPointer<Channel> self(this);
    QByteArray buffer(kReadChunkSize, Qt::Uninitialized);
    for (int i = 0; i < kMaxReadsPerActivation; ++i) {
        int fd = -1;
        {
            std::lock_guard lock(m_writeMutex);
            fd = m_fd;
        }
        if (fd < 0)
            return;
        const ssize_t n = ::read(fd, buffer.data(), size_t(buffer.size()));
        if (n < 0) {
            if (errno == EINTR)
                continue;
            if (errno == EAGAIN || errno == EWOULDBLOCK)
                return;
            const Error error = Error::fromErrno(errno);
            log::error(lcExtensionKit(), QStringLiteral("channel read failed: %1").arg(error.description()));
            close(QStringLiteral("read failed: %1").arg(error.message));
            return;
        }
        if (n == 0) {
            if (!m_decoder.isAtFrameBoundary())
                reportProtocolError(QStringLiteral("stream ended inside a frame (%1 bytes of it received)").arg(m_decoder.pendingBytes()));
            if (self)
                close(QStringLiteral("the host closed the connection"));
            return;
        }
        if (!m_decoder.feed(buffer.constData(), qsizetype(n))) {
            // Complete frames before the bad length are still handled, in order.
            for (const QByteArray &payload : m_decoder.takeFrames()) {
                handlePayload(payload);
                if (!self || m_closed)
                    return;
            }
            reportProtocolError(m_decoder.errorString());
            if (self)
                close(QStringLiteral("protocol error: %1").arg(m_decoder.errorString()));
            return;
        }
        while (auto payload = m_decoder.takeFrame()) {
            handlePayload(*payload);
            // A slot may have closed the channel (or scheduled its deletion).
            if (!self || m_closed)
                return;
        }
    }
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

OptionalError Channel::sendError(const QJsonValue &id, int code, const QString &message)
{
    return sendMessage(jsonrpc::makeError(id, code, message));
}

OptionalError Channel::sendFrame(const QByteArray &payload)
{
    const QByteArray frame = encodeFrame(payload);
    if (frame.isEmpty())
        return Error::fromErrno(EMSGSIZE);

    std::lock_guard lock(m_writeMutex);
    if (m_fd < 0)
        return Error::fromErrno(EPIPE);
    if (m_writeBroken)
        return Error::fromErrno(EPIPE);

    const char *data = frame.constData();
    qsizetype left = frame.size();
    bool useSend = true;
    QElapsedTimer waited;
    bool waiting = false;
    while (left > 0) {
        ssize_t n;
        if (useSend) {
            n = ::send(m_fd, data, size_t(left), MSG_NOSIGNAL);
            if (n < 0 && errno == ENOTSOCK) {
                // Not a socket (a pipe in some setups): plain writes; SIGPIPE is ignored by the
                // extension's main routine, so EPIPE still comes back as an error.
                useSend = false;
                continue;
            }
        } else {
            n = ::write(m_fd, data, size_t(left));
        }
        if (n > 0) {
            data += n;
            left -= n;
            continue;
        }
        if (n < 0 && errno == EINTR)
            continue;
        if (n < 0 && (errno == EAGAIN || errno == EWOULDBLOCK)) {
            if (!waiting) {
                waited.start();
                waiting = true;
            }
            const qint64 remaining = m_writeTimeoutMs - waited.elapsed();
            if (remaining > 0) {
                pollfd pfd{m_fd, POLLOUT, 0};
                const int ready = ::poll(&pfd, 1, int(remaining));
                if (ready > 0 || (ready < 0 && errno == EINTR))
                    continue;
                if (ready < 0) {
                    const int err = errno;
                    if (left != frame.size())
                        m_writeBroken = true;
                    return Error::fromErrno(err);
                }
            }
            if (left != frame.size())
                m_writeBroken = true;
            log::error(lcExtensionKit(), QStringLiteral("channel: the host did not read for %1 ms; message dropped").arg(m_writeTimeoutMs));
            return Error::fromErrno(ETIMEDOUT);
        }
        const int err = n < 0 ? errno : EIO;
        if (left != frame.size())
            m_writeBroken = true;
        return Error::fromErrno(err);
    }
    return std::nullopt;
}

} // namespace zaf::extensionkit
