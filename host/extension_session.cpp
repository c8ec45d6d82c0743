#include "host/extension_session.h"

#include "host/child_process.h"
#include "host/extension_conversation.h"
#include "host/host_log.h"
#include "platform/extensionkit/framed_socket.h"
#include "platform/log.h"
#include "platform/unique_fd.h"

#include <QPointer>

#include <cerrno>
#include <cstring>

#include <sys/socket.h>

namespace zaf::host {

static_assert(kChildChannelFd == kHandedFd);

namespace {

using zaf::extensionkit::FramedSocket;

// Reads once the process has ended: what it wrote before it went (up to 64 MiB) comes before
// finished(); anything beyond that (a descendant still writing) follows on later notifications.
constexpr int kReadsAfterExit = 1024;

} // namespace

struct ExtensionSession::Private {
    ExtensionSession *q = nullptr;
    ChildProcess child;
    std::unique_ptr<FramedSocket> socket; // null before start()
    bool started = false;
    ExtensionConversation conversation;

    bool isChannelOpen() const { return socket && socket->isOpen(); }

    void reportProtocolError(const QString &message)
    {
        log::error(lcHost(), message);
        Q_EMIT q->protocolError(message);
    }

    bool sendPayload(const QByteArray &payload, QString *error = nullptr)
    {
        auto fail = [error](const QString &text) {
            if (error)
                *error = text;
            return false;
        };
        if (payload.size() > kMaxMessageLength)
            return fail(QStringLiteral("the message is too large (%1 bytes)").arg(payload.size()));
        if (!isChannelOpen())
            return fail(QStringLiteral("the channel is closed"));
        if (const OptionalError failure = socket->sendFrame(payload)) {
            log::error(lcHost(), QStringLiteral("cannot write to the extension: %1").arg(failure->message));
            return fail(QStringLiteral("the extension is not reading (the channel is broken)"));
        }
        return true;
    }

    void handleMessage(const QByteArray &payload)
    {
        const ExtensionMessage message = conversation.interpret(payload);
        if (message.answer)
            sendPayload(*message.answer);
        switch (message.kind) {
        case ExtensionMessage::Kind::Accepted:
            Q_EMIT q->requestAccepted();
            return;
        case ExtensionMessage::Kind::Refused:
            Q_EMIT q->requestRejected(message.text);
            return;
        case ExtensionMessage::Kind::Reported:
            Q_EMIT q->activityTypesReported(message.activityTypes);
            return;
        case ExtensionMessage::Kind::ProtocolError:
            Q_EMIT q->protocolError(message.text);
            return;
        }
    }

    // The process has been reaped: everything it wrote before it exited is in the socket's buffer
    // and is delivered first.
    void onChildFinished(int exitCode, bool crashed)
    {
        QPointer<ExtensionSession> guard(q);
        if (isChannelOpen())
            socket->readPending(kReadsAfterExit);
        if (guard)
            Q_EMIT q->finished(exitCode, crashed);
    }

    void openChannel(UniqueFd fd)
    {
        socket = std::make_unique<FramedSocket>(std::move(fd), kMaxMessageLength, FramedSocket::FullBuffer::Queue, QStringLiteral("the extension"));
        FramedSocket *s = socket.get();
        QObject::connect(s, &FramedSocket::frameReceived, q, [this](const QByteArray &payload) { handleMessage(payload); });
        QObject::connect(s, &FramedSocket::protocolError, q, [this](const QString &text) {
            reportProtocolError(QStringLiteral("malformed message from the extension: %1").arg(text));
        });
        QObject::connect(s, &FramedSocket::writeFailed, q, [](const Error &error) {
            log::error(lcHost(), QStringLiteral("cannot write to the extension: %1").arg(error.message));
        });
        QObject::connect(s, &FramedSocket::closed, q, [this](const QString &reason) {
            log::info(lcHost(), QStringLiteral("the channel to the extension closed: %1").arg(reason));
            Q_EMIT q->channelClosed();
        });
        QString error;
        if (!socket->start(&error))
            log::error(lcHost(), QStringLiteral("cannot read from the extension: %1").arg(error));
    }
};

ExtensionSession::ExtensionSession(QObject *parent) : QObject(parent), d(std::make_unique<Private>())
{
    d->q = this;
    connect(&d->child, &ChildProcess::finished, this, [this](int exitCode, bool crashed) { d->onChildFinished(exitCode, crashed); });
}

ExtensionSession::~ExtensionSession()
{
    // No signals from here. The closed channel is the removal of the extension's view: it tidies up
    // and exits on its own, which the child process's end waits for before it escalates.
    d->socket.reset();
}

bool ExtensionSession::start(const QString &extensionExecutable, const QList<InputItem> &items, QString *error)
{
    auto fail = [error](const QString &message) {
        log::error(lcHost(), message);
        if (error)
            *error = message;
        return false;
    };
    if (d->started)
        return fail(QStringLiteral("the extension session was already started"));

    const QByteArray payload = d->conversation.beginRequest(items);
    if (payload.size() > kMaxMessageLength)
        return fail(QStringLiteral("the request to the extension is too large (%1 bytes, at most %2)").arg(payload.size()).arg(kMaxMessageLength));

    int fds[2];
    if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, fds) != 0)
        return fail(QStringLiteral("cannot make the extension's channel: %1").arg(QString::fromLocal8Bit(std::strerror(errno))));
    UniqueFd hostEnd(fds[0]);
    const UniqueFd extensionEnd(fds[1]);
    ChildSpec spec;
    spec.program = extensionExecutable;
    spec.environment = {QByteArray(kChannelFdVariable) + '=' + QByteArray::number(kChildChannelFd)};
    spec.handedFd = extensionEnd.get();
    QString spawnError;
    if (!d->child.start(spec, &spawnError))
        return fail(spawnError);

    d->started = true;
    d->openChannel(std::move(hostEnd));
    // The request goes into the socket's buffer (or its queue); a failure here (the extension died at
    // once) shows up as a closed channel and finished(), not as a failed start.
    d->sendPayload(payload);
    return true;
}

void ExtensionSession::removeView()
{
    if (!d->isChannelOpen()) {
        log::error(lcHost(), QStringLiteral("cannot remove the extension's view: the channel is closed"));
        return;
    }
    QString error;
    if (!d->sendPayload(ExtensionConversation::removeView(), &error))
        log::error(lcHost(), QStringLiteral("cannot remove the extension's view: %1").arg(error));
}

void ExtensionSession::setTerminationGracePeriod(int milliseconds)
{
    d->child.setTerminationGracePeriod(milliseconds);
}

pid_t ExtensionSession::processId() const
{
    return d->child.processId();
}

bool ExtensionSession::isRunning() const
{
    return d->child.isRunning();
}

bool ExtensionSession::isChannelOpen() const
{
    return d->isChannelOpen();
}

} // namespace zaf::host
