#include "host/extension_session.h"

#include "host/child_process.h"
#include "host/host_log.h"
#include "platform/extensionkit/framed_socket.h"
#include "platform/extensionkit/json_rpc.h"
#include "platform/extensionkit/protocol_version.h"
#include "platform/log.h"
#include "platform/unique_fd.h"

#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>
#include <QPointer>

#include <cerrno>
#include <cstring>

#include <sys/socket.h>

namespace zaf::host {

static_assert(kChildChannelFd == kHandedFd);

namespace {

namespace rpc = zaf::extensionkit::jsonrpc;
using zaf::extensionkit::FramedSocket;
using zaf::extensionkit::kProtocolVersion;
using zaf::extensionkit::kProtocolVersionKey;

// Reads once the process has ended: what it wrote before it went (up to 64 MiB) comes before
// finished(); anything beyond that (a descendant still writing) follows on later notifications.
constexpr int kReadsAfterExit = 1024;

const QString kMethodBegin = QStringLiteral("beginExtensionRequest");
const QString kMethodRemove = QStringLiteral("removeExtensionView");
const QString kMethodFinish = QStringLiteral("extensionDidFinishWithActivityTypes");

} // namespace

struct ExtensionSession::Private {
    ExtensionSession *q = nullptr;
    ChildProcess child;
    std::unique_ptr<FramedSocket> socket; // null before start()
    bool started = false;
    int requestId = 1; // the pending request's id; 0 once it has been answered

    bool isChannelOpen() const { return socket && socket->isOpen(); }

    void reportProtocolError(const QString &message)
    {
        log::error(lcHost(), message);
        Q_EMIT q->protocolError(message);
    }

    bool sendMessage(const QJsonObject &message, QString *error = nullptr)
    {
        auto fail = [error](const QString &text) {
            if (error)
                *error = text;
            return false;
        };
        const QByteArray payload = rpc::serialize(message);
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
        const rpc::ParseResult parsed = rpc::parseMessage(payload);
        if (!parsed.ok()) {
            reportProtocolError(QStringLiteral("malformed message from the extension: %1").arg(parsed.errorText));
            // A request is answered with its id; a message whose id cannot be read is only reported.
            if (parsed.answerId && !parsed.answerId->isNull())
                sendMessage(rpc::makeError(*parsed.answerId, parsed.errorCode, parsed.errorText));
            return;
        }
        const rpc::Message &message = *parsed.message;
        switch (message.kind) {
        case rpc::MessageKind::Request:
            // The host offers no methods to call; only notifications are expected.
            reportProtocolError(QStringLiteral("the extension called the unknown method %1").arg(message.method));
            sendMessage(rpc::makeError(message.id, rpc::MethodNotFound, QStringLiteral("Method not found")));
            return;
        case rpc::MessageKind::Notification:
            handleNotification(message.method, message.params);
            return;
        case rpc::MessageKind::Response:
        case rpc::MessageKind::ErrorResponse:
            handleResponse(message);
            return;
        }
    }

    void handleNotification(const QString &method, const QJsonValue &params)
    {
        if (method != kMethodFinish) {
            reportProtocolError(QStringLiteral("the extension sent the unknown notification %1").arg(method));
            return;
        }
        // params: a one-element array holding the array of activity types.
        const QJsonArray outer = params.toArray();
        if (!params.isArray() || outer.size() != 1 || !outer.at(0).isArray()) {
            reportProtocolError(QStringLiteral("malformed %1: params must be a one-element array holding an array of strings").arg(kMethodFinish));
            return;
        }
        QStringList activityTypes;
        for (const QJsonValue &value : outer.at(0).toArray()) {
            if (!value.isString()) {
                reportProtocolError(QStringLiteral("malformed %1: an activity type is not a string").arg(kMethodFinish));
                return;
            }
            activityTypes.append(value.toString());
        }
        log::info(lcHost(), QStringLiteral("the extension finished with activity types [%1]").arg(activityTypes.join(QStringLiteral(", "))));
        Q_EMIT q->activityTypesReported(activityTypes);
    }

    void handleResponse(const rpc::Message &message)
    {
        if (!message.id.isDouble() || message.id.toInt() != requestId || requestId == 0) {
            reportProtocolError(QStringLiteral("the extension answered a request that is not pending (id %1)")
                                    .arg(QString::fromUtf8(QJsonDocument(QJsonArray{message.id}).toJson(QJsonDocument::Compact))));
            return;
        }
        requestId = 0; // answered: a second answer is an error
        if (message.kind == rpc::MessageKind::ErrorResponse) {
            const QString text = QStringLiteral("the extension refused the request: %1 (%2)").arg(message.errorMessage).arg(message.errorCode);
            log::error(lcHost(), text);
            Q_EMIT q->requestRejected(text);
            return;
        }
        const QJsonValue accepted = message.result.toObject().value(QStringLiteral("accepted"));
        if (!accepted.isBool()) {
            reportProtocolError(QStringLiteral("malformed answer to %1: the result must be {\"accepted\": true|false}").arg(kMethodBegin));
            return;
        }
        if (!accepted.toBool()) {
            const QString text = QStringLiteral("the extension did not accept the request");
            log::error(lcHost(), text);
            Q_EMIT q->requestRejected(text);
            return;
        }
        // An extension from before the version existed states none: it speaks 1.0.
        const QString theirs = message.result.toObject().value(QLatin1String(kProtocolVersionKey)).toString(QStringLiteral("1.0"));
        log::info(lcHost(), QStringLiteral("the extension accepted the request (protocol %1, ours %2)").arg(theirs, kProtocolVersion.toString()));
        Q_EMIT q->requestAccepted();
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

    const QJsonObject request = rpc::makeRequest(d->requestId, kMethodBegin, QJsonObject{{QLatin1String(kProtocolVersionKey), kProtocolVersion.toString()}, {QStringLiteral("inputItems"), toJson(items)}});
    const QByteArray payload = rpc::serialize(request);
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
    d->sendMessage(request);
    return true;
}

void ExtensionSession::removeView()
{
    if (!d->isChannelOpen()) {
        log::error(lcHost(), QStringLiteral("cannot remove the extension's view: the channel is closed"));
        return;
    }
    QString error;
    if (!d->sendMessage(rpc::makeNotification(kMethodRemove), &error))
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
