#include "host/extension_session.h"

#include "host/host_log.h"
#include "platform/extensionkit/frame_codec.h"
#include "platform/log.h"

#include <QFile>
#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>
#include <QPointer>
#include <QSocketNotifier>
#include <QTimer>

#include <cerrno>
#include <cstring>
#include <ctime>
#include <string>
#include <vector>

#include <fcntl.h>
#include <signal.h>
#include <spawn.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

extern char **environ;

Q_LOGGING_CATEGORY(lcHost, "zaf.host")

namespace zaf::host {

namespace {

constexpr int kJsonRpcInvalidRequest = -32600;
constexpr int kJsonRpcMethodNotFound = -32601;
// How often the process is polled when the kernel offers no process descriptor.
constexpr int kExitPollIntervalMs = 50;
// Bytes read per call; reads per readiness notification are bounded so a flooding peer cannot
// starve the event loop.
constexpr qsizetype kReadChunk = 64 * 1024;
constexpr int kReadsPerNotification = 32;
constexpr int kReadsAfterExit = 1024;

const QString kMethodBegin = QStringLiteral("beginExtensionRequest");
const QString kMethodRemove = QStringLiteral("removeExtensionView");
const QString kMethodFinish = QStringLiteral("extensionDidFinishWithActivityTypes");

QString errnoText(int error)
{
    return QString::fromLocal8Bit(std::strerror(error));
}

// A process descriptor that becomes readable when the process exits; -1 when the kernel has none.
int openProcessFd(pid_t pid)
{
#ifdef SYS_pidfd_open
    const long fd = ::syscall(SYS_pidfd_open, pid, 0);
    if (fd >= 0) {
        ::fcntl(static_cast<int>(fd), F_SETFD, FD_CLOEXEC);
        return static_cast<int>(fd);
    }
#else
    Q_UNUSED(pid);
#endif
    return -1;
}

// Sleeps in short steps until the process has been reaped or `milliseconds` have passed. True when
// reaped; `status` is then its wait status.
bool waitForExit(pid_t pid, int milliseconds, int *status)
{
    const timespec step{0, 10 * 1000 * 1000};
    for (int waited = 0;; waited += 10) {
        const pid_t r = ::waitpid(pid, status, WNOHANG);
        if (r == pid)
            return true;
        if (r < 0 && errno != EINTR) {
            *status = -1;
            return true; // not our child any more (reaped elsewhere)
        }
        if (waited >= milliseconds)
            return false;
        ::nanosleep(&step, nullptr);
    }
}

QString describeWaitStatus(int status)
{
    if (WIFSIGNALED(status))
        return QStringLiteral("killed by signal %1 (%2)").arg(WTERMSIG(status)).arg(QString::fromLocal8Bit(::strsignal(WTERMSIG(status))));
    return QStringLiteral("exit status %1").arg(WEXITSTATUS(status));
}

} // namespace

ExtensionSession::ExtensionSession(QObject *parent)
    : QObject(parent)
    , m_decoder(std::make_unique<zaf::extensionkit::FrameDecoder>(kMaxMessageLength))
{
}

ExtensionSession::~ExtensionSession()
{
    terminateAndReap();
}

bool ExtensionSession::start(const QString &extensionExecutable, const QList<InputItem> &items, QString *error)
{
    auto fail = [error](const QString &message) {
        log::error(lcHost(), message);
        if (error)
            *error = message;
        return false;
    };
    if (m_started)
        return fail(QStringLiteral("the extension session was already started"));

    const QJsonObject request{{QStringLiteral("jsonrpc"), QStringLiteral("2.0")},
                              {QStringLiteral("id"), m_requestId},
                              {QStringLiteral("method"), kMethodBegin},
                              {QStringLiteral("params"), QJsonObject{{QStringLiteral("inputItems"), toJson(items)}}}};
    const QByteArray payload = QJsonDocument(request).toJson(QJsonDocument::Compact);
    if (payload.size() > kMaxMessageLength)
        return fail(QStringLiteral("the request to the extension is too large (%1 bytes, at most %2)").arg(payload.size()).arg(kMaxMessageLength));

    int fds[2];
    if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, fds) != 0)
        return fail(QStringLiteral("cannot make the extension's channel: %1").arg(errnoText(errno)));
    int parentFd = fds[0];
    int childFd = fds[1];
    // The child's end is moved onto descriptor 3 in the child. When it already is 3, a dup2 onto
    // itself would leave close-on-exec set, so it is moved out of the way first.
    if (childFd == kChildChannelFd) {
        const int moved = ::fcntl(childFd, F_DUPFD_CLOEXEC, kChildChannelFd + 1);
        ::close(childFd);
        if (moved < 0) {
            const int e = errno;
            ::close(parentFd);
            return fail(QStringLiteral("cannot make the extension's channel: %1").arg(errnoText(e)));
        }
        childFd = moved;
    }

    // The environment: ours, with the channel variable set to the child's descriptor.
    const std::string channelPrefix = std::string(kChannelFdVariable) + '=';
    std::vector<std::string> environment;
    for (char **entry = environ; entry && *entry; ++entry) {
        if (std::strncmp(*entry, channelPrefix.c_str(), channelPrefix.size()) != 0)
            environment.emplace_back(*entry);
    }
    environment.push_back(channelPrefix + std::to_string(kChildChannelFd));
    std::vector<char *> envp;
    for (std::string &entry : environment)
        envp.push_back(entry.data());
    envp.push_back(nullptr);

    const QByteArray program = QFile::encodeName(extensionExecutable);
    std::string programCopy = program.toStdString();
    char *argv[] = {programCopy.data(), nullptr};

    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_adddup2(&actions, childFd, kChildChannelFd);
    posix_spawnattr_t attributes;
    posix_spawnattr_init(&attributes);
    // The child starts with no blocked signals and SIGPIPE at its default, whatever the host does.
    sigset_t none;
    sigemptyset(&none);
    sigset_t defaults;
    sigemptyset(&defaults);
    sigaddset(&defaults, SIGPIPE);
    posix_spawnattr_setsigmask(&attributes, &none);
    posix_spawnattr_setsigdefault(&attributes, &defaults);
    posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSIGDEF);

    pid_t pid = 0;
    const int spawnError = ::posix_spawn(&pid, program.constData(), &actions, &attributes, argv, envp.data());
    posix_spawn_file_actions_destroy(&actions);
    posix_spawnattr_destroy(&attributes);
    ::close(childFd);
    if (spawnError != 0) {
        ::close(parentFd);
        return fail(QStringLiteral("cannot start the extension %1: %2").arg(extensionExecutable, errnoText(spawnError)));
    }

    m_started = true;
    m_pid = pid;
    m_fd = parentFd;
    ::fcntl(m_fd, F_SETFL, ::fcntl(m_fd, F_GETFL) | O_NONBLOCK);
    log::info(lcHost(), QStringLiteral("started the extension %1 (process %2)").arg(extensionExecutable).arg(pid));

    m_pidFd = openProcessFd(pid);
    if (m_pidFd >= 0) {
        m_exitNotifier = new QSocketNotifier(m_pidFd, QSocketNotifier::Read, this);
        connect(m_exitNotifier, &QSocketNotifier::activated, this, &ExtensionSession::pollProcess);
    } else {
        m_exitPoll = new QTimer(this);
        m_exitPoll->setInterval(kExitPollIntervalMs);
        connect(m_exitPoll, &QTimer::timeout, this, &ExtensionSession::pollProcess);
        m_exitPoll->start();
    }

    m_readNotifier = new QSocketNotifier(m_fd, QSocketNotifier::Read, this);
    connect(m_readNotifier, &QSocketNotifier::activated, this, &ExtensionSession::onReadable);
    m_writeNotifier = new QSocketNotifier(m_fd, QSocketNotifier::Write, this);
    m_writeNotifier->setEnabled(false);
    connect(m_writeNotifier, &QSocketNotifier::activated, this, &ExtensionSession::onWritable);

    // The request goes into the socket's buffer; a failure here (the extension died at once) shows up
    // as a closed channel and finished(), not as a failed start.
    sendMessage(request);
    return true;
}

void ExtensionSession::removeView()
{
    if (m_fd < 0) {
        log::error(lcHost(), QStringLiteral("cannot remove the extension's view: the channel is closed"));
        return;
    }
    QString error;
    if (!sendMessage(QJsonObject{{QStringLiteral("jsonrpc"), QStringLiteral("2.0")}, {QStringLiteral("method"), kMethodRemove}}, &error))
        log::error(lcHost(), QStringLiteral("cannot remove the extension's view: %1").arg(error));
}

void ExtensionSession::onReadable()
{
    readAvailable();
}

void ExtensionSession::onWritable()
{
    if (m_writeNotifier)
        m_writeNotifier->setEnabled(false);
    flushOutgoing();
}

void ExtensionSession::pollProcess()
{
    if (m_reaped || m_pid <= 0)
        return;
    int status = 0;
    const pid_t r = ::waitpid(m_pid, &status, WNOHANG);
    if (r == m_pid) {
        markReaped(status);
    } else if (r < 0 && errno != EINTR) {
        log::error(lcHost(), QStringLiteral("the extension process %1 cannot be waited for: %2").arg(m_pid).arg(errnoText(errno)));
        markReaped(-1);
    }
}

void ExtensionSession::markReaped(int status)
{
    m_reaped = true;
    if (m_exitNotifier) {
        m_exitNotifier->setEnabled(false);
        m_exitNotifier->deleteLater();
        m_exitNotifier = nullptr;
    }
    if (m_exitPoll) {
        m_exitPoll->stop();
        m_exitPoll->deleteLater();
        m_exitPoll = nullptr;
    }
    if (m_pidFd >= 0) {
        ::close(m_pidFd);
        m_pidFd = -1;
    }

    int exitCode = -1;
    bool crashed = true;
    if (status >= 0 && WIFEXITED(status)) {
        exitCode = WEXITSTATUS(status);
        crashed = exitCode != 0;
    } else if (status >= 0 && WIFSIGNALED(status)) {
        exitCode = 128 + WTERMSIG(status);
    }
    if (status < 0)
        log::error(lcHost(), QStringLiteral("the extension process %1 ended with an unknown status").arg(m_pid));
    else if (crashed)
        log::error(lcHost(), QStringLiteral("the extension process %1 ended: %2").arg(m_pid).arg(describeWaitStatus(status)));
    else
        log::info(lcHost(), QStringLiteral("the extension process %1 exited normally").arg(m_pid));

    // Everything the process wrote before it exited is in the socket's buffer: deliver it first.
    QPointer<ExtensionSession> guard(this);
    if (m_fd >= 0)
        readAvailable();
    if (!guard)
        return;
    Q_EMIT finished(exitCode, crashed);
}

void ExtensionSession::readAvailable()
{
    QPointer<ExtensionSession> guard(this);
    // Reads are bounded per call so a flooding peer cannot starve the event loop. Once the process
    // has been reaped, what it wrote is read in one go (up to 64 MiB) so that it comes before
    // finished(); anything beyond that (a descendant still writing) follows on later notifications.
    const int maxReads = m_reaped ? kReadsAfterExit : kReadsPerNotification;
    QByteArray chunk(kReadChunk, Qt::Uninitialized);
    for (int reads = 0; m_fd >= 0 && reads < maxReads; ++reads) {
        const ssize_t n = ::recv(m_fd, chunk.data(), chunk.size(), MSG_DONTWAIT);
        if (n < 0) {
            if (errno == EINTR)
                continue;
            if (errno == EAGAIN || errno == EWOULDBLOCK)
                return;
            log::error(lcHost(), QStringLiteral("cannot read from the extension: %1").arg(errnoText(errno)));
            closeChannel();
            return;
        }
        if (n == 0) {
            if (!m_decoder->isAtFrameBoundary())
                reportProtocolError(QStringLiteral("the extension closed the channel in the middle of a message (%1 bytes pending)")
                                        .arg(m_decoder->pendingBytes()));
            if (!guard)
                return;
            log::info(lcHost(), QStringLiteral("the extension closed the channel"));
            closeChannel();
            return;
        }
        if (!m_decoder->feed(chunk.constData(), n)) {
            // Complete messages before the bad length are still delivered.
            for (const QByteArray &payload : m_decoder->takeFrames()) {
                handleMessage(payload);
                if (!guard)
                    return;
            }
            reportProtocolError(QStringLiteral("malformed message from the extension: %1").arg(m_decoder->errorString()));
            if (!guard)
                return;
            closeChannel();
            return;
        }
        while (std::optional<QByteArray> payload = m_decoder->takeFrame()) {
            handleMessage(*payload);
            if (!guard || m_fd < 0)
                return;
        }
    }
}

void ExtensionSession::handleMessage(const QByteArray &payload)
{
    QJsonParseError parseError;
    const QJsonDocument document = QJsonDocument::fromJson(payload, &parseError);
    if (parseError.error != QJsonParseError::NoError) {
        reportProtocolError(QStringLiteral("malformed message from the extension: not JSON (%1 at offset %2)")
                                .arg(parseError.errorString())
                                .arg(parseError.offset));
        return;
    }
    if (!document.isObject()) {
        reportProtocolError(QStringLiteral("malformed message from the extension: not a JSON object"));
        return;
    }
    const QJsonObject message = document.object();
    const bool hasId = message.contains(QStringLiteral("id"));
    auto answerError = [this, &message](int code, const QString &text) {
        sendMessage(QJsonObject{{QStringLiteral("jsonrpc"), QStringLiteral("2.0")},
                                {QStringLiteral("id"), message.value(QStringLiteral("id"))},
                                {QStringLiteral("error"), QJsonObject{{QStringLiteral("code"), code}, {QStringLiteral("message"), text}}}});
    };

    if (message.value(QStringLiteral("jsonrpc")).toString() != QLatin1String("2.0")) {
        reportProtocolError(QStringLiteral("malformed message from the extension: \"jsonrpc\" is not \"2.0\""));
        if (hasId && !message.contains(QStringLiteral("result")) && !message.contains(QStringLiteral("error")))
            answerError(kJsonRpcInvalidRequest, QStringLiteral("Invalid Request"));
        return;
    }
    if (message.contains(QStringLiteral("method"))) {
        const QJsonValue method = message.value(QStringLiteral("method"));
        if (!method.isString()) {
            reportProtocolError(QStringLiteral("malformed message from the extension: \"method\" is not a string"));
            if (hasId)
                answerError(kJsonRpcInvalidRequest, QStringLiteral("Invalid Request"));
            return;
        }
        if (hasId) {
            // The host offers no methods to call; only notifications are expected.
            reportProtocolError(QStringLiteral("the extension called the unknown method %1").arg(method.toString()));
            answerError(kJsonRpcMethodNotFound, QStringLiteral("Method not found"));
            return;
        }
        handleNotification(method.toString(), message);
        return;
    }
    if (hasId && (message.contains(QStringLiteral("result")) || message.contains(QStringLiteral("error")))) {
        handleResponse(message);
        return;
    }
    reportProtocolError(QStringLiteral("malformed message from the extension: neither a notification nor an answer"));
    if (hasId)
        answerError(kJsonRpcInvalidRequest, QStringLiteral("Invalid Request"));
}

void ExtensionSession::handleNotification(const QString &method, const QJsonObject &message)
{
    if (method != kMethodFinish) {
        reportProtocolError(QStringLiteral("the extension sent the unknown notification %1").arg(method));
        return;
    }
    // params: a one-element array holding the array of activity types.
    const QJsonValue params = message.value(QStringLiteral("params"));
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
    Q_EMIT activityTypesReported(activityTypes);
}

void ExtensionSession::handleResponse(const QJsonObject &message)
{
    const QJsonValue id = message.value(QStringLiteral("id"));
    if (!id.isDouble() || id.toInt() != m_requestId || m_requestId == 0) {
        reportProtocolError(QStringLiteral("the extension answered a request that is not pending (id %1)")
                                .arg(QString::fromUtf8(QJsonDocument(QJsonArray{id}).toJson(QJsonDocument::Compact))));
        return;
    }
    m_requestId = 0; // answered: a second answer is an error
    if (message.contains(QStringLiteral("error"))) {
        const QJsonObject error = message.value(QStringLiteral("error")).toObject();
        const QString text = QStringLiteral("the extension refused the request: %1 (%2)")
                                 .arg(error.value(QStringLiteral("message")).toString())
                                 .arg(error.value(QStringLiteral("code")).toInt());
        log::error(lcHost(), text);
        Q_EMIT requestRejected(text);
        return;
    }
    const QJsonValue result = message.value(QStringLiteral("result"));
    if (!result.isObject() || !result.toObject().value(QStringLiteral("accepted")).isBool()) {
        reportProtocolError(QStringLiteral("malformed answer to %1: the result must be {\"accepted\": true|false}").arg(kMethodBegin));
        return;
    }
    if (!result.toObject().value(QStringLiteral("accepted")).toBool()) {
        const QString text = QStringLiteral("the extension did not accept the request");
        log::error(lcHost(), text);
        Q_EMIT requestRejected(text);
        return;
    }
    log::info(lcHost(), QStringLiteral("the extension accepted the request"));
    Q_EMIT requestAccepted();
}

bool ExtensionSession::sendMessage(const QJsonObject &message, QString *error)
{
    const QByteArray payload = QJsonDocument(message).toJson(QJsonDocument::Compact);
    if (payload.size() > kMaxMessageLength) {
        if (error)
            *error = QStringLiteral("the message is too large (%1 bytes)").arg(payload.size());
        return false;
    }
    if (m_fd < 0) {
        if (error)
            *error = QStringLiteral("the channel is closed");
        return false;
    }
    m_outgoing += zaf::extensionkit::encodeFrame(payload);
    if (!flushOutgoing()) {
        if (error)
            *error = QStringLiteral("the extension is not reading (the channel is broken)");
        return false;
    }
    return true;
}

bool ExtensionSession::flushOutgoing()
{
    while (!m_outgoing.isEmpty() && m_fd >= 0) {
        // MSG_NOSIGNAL: a peer that has gone makes this fail with EPIPE instead of raising SIGPIPE.
        const ssize_t n = ::send(m_fd, m_outgoing.constData(), m_outgoing.size(), MSG_NOSIGNAL | MSG_DONTWAIT);
        if (n >= 0) {
            m_outgoing.remove(0, n);
            continue;
        }
        if (errno == EINTR)
            continue;
        if (errno == EAGAIN || errno == EWOULDBLOCK) {
            if (m_writeNotifier)
                m_writeNotifier->setEnabled(true);
            return true;
        }
        // The reading side goes on: what the extension wrote before it went is still to be read, and
        // the end of the channel is noticed there.
        log::error(lcHost(), QStringLiteral("cannot write to the extension: %1").arg(errnoText(errno)));
        m_outgoing.clear();
        return false;
    }
    return true;
}

void ExtensionSession::reportProtocolError(const QString &message)
{
    log::error(lcHost(), message);
    Q_EMIT protocolError(message);
}

void ExtensionSession::closeChannel()
{
    if (m_fd < 0)
        return;
    for (QSocketNotifier *notifier : {m_readNotifier, m_writeNotifier}) {
        if (notifier) {
            notifier->setEnabled(false);
            notifier->deleteLater();
        }
    }
    m_readNotifier = nullptr;
    m_writeNotifier = nullptr;
    ::close(m_fd);
    m_fd = -1;
    m_outgoing.clear();
    Q_EMIT channelClosed();
}

void ExtensionSession::terminateAndReap()
{
    // No signals from here: the session is going away.
    for (QSocketNotifier *notifier : {m_readNotifier, m_writeNotifier, m_exitNotifier})
        delete notifier;
    m_readNotifier = m_writeNotifier = m_exitNotifier = nullptr;
    if (m_fd >= 0) {
        ::close(m_fd);
        m_fd = -1;
    }
    if (m_pidFd >= 0) {
        ::close(m_pidFd);
        m_pidFd = -1;
    }
    if (m_pid <= 0 || m_reaped)
        return;
    m_reaped = true;
    int status = 0;
    // A closed channel is the removal of the extension's view: it tidies up and exits on its own.
    if (waitForExit(m_pid, m_graceMs, &status))
        return;
    log::error(lcHost(), QStringLiteral("the extension process %1 did not exit after its channel was closed; sending SIGTERM").arg(m_pid));
    ::kill(m_pid, SIGTERM);
    if (waitForExit(m_pid, m_graceMs, &status))
        return;
    log::error(lcHost(), QStringLiteral("the extension process %1 did not exit after SIGTERM; sending SIGKILL").arg(m_pid));
    ::kill(m_pid, SIGKILL);
    while (::waitpid(m_pid, &status, 0) < 0 && errno == EINTR) {
    }
}

} // namespace zaf::host
