#include "host/library/polled_session.h"

#include "host/host_log.h"
#include "host/spawn_child.h"
#include "platform/log.h"

#include <cerrno>
#include <csignal>
#include <cstring>

#include <fcntl.h>
#include <poll.h>
#include <sys/epoll.h>
#include <sys/socket.h>
// glibc 2.36's header declares these without C linkage (fixed in 2.37).
extern "C" {
#include <sys/pidfd.h>
}

namespace zaf::host {

namespace {

constexpr char kChannelVariable[] = "ZAF_EXTENSION_CHANNEL_FD=3";
// Reads per dispatch: what a well-behaved extension writes fits many times over; a runaway writer
// cannot keep one dispatch from returning.
constexpr int kReadsPerDispatch = 64;
// Once the process has ended, everything it wrote is in the socket's buffer: read it all (up to
// 64 MiB) before the finished callback.
constexpr int kReadsAfterExit = 1024;

QString errnoText(int error = errno)
{
    return QString::fromLocal8Bit(std::strerror(error));
}

bool fail(QString *error, const QString &message)
{
    log::error(lcHost(), message);
    if (error)
        *error = message;
    return false;
}

} // namespace

PolledSession::~PolledSession()
{
    if (m_pid <= 0 || m_finished)
        return;
    // The closed channel is the removal of the extension's view: it tidies up and exits by itself.
    m_channel.reset();
    // The child is not reaped until below, so its process ID cannot have been reused.
    const QString description = QStringLiteral("the extension (process %1)").arg(m_pid);
    endChild(m_pid, m_graceMs, [this](int milliseconds) { return waitForEnd(milliseconds); }, description);
    reapChild(m_pid, description);
}

bool PolledSession::start(const QString &extensionExecutable, const QList<InputItem> &items, Callbacks callbacks, QString *error)
{
    if (m_pid > 0)
        return fail(error, QStringLiteral("the extension session was already started"));
    const QByteArray request = m_conversation.beginRequest(items);
    if (request.size() > qsizetype(m_decoder.maxFrameLength()))
        return fail(error, QStringLiteral("the request to the extension is too large (%1 bytes, at most %2)").arg(request.size()).arg(m_decoder.maxFrameLength()));

    int fds[2];
    if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, fds) != 0)
        return fail(error, QStringLiteral("cannot make the extension's channel: %1").arg(errnoText()));
    UniqueFd hostEnd(fds[0]);
    const UniqueFd extensionEnd(fds[1]);
    // The extension's end blocks, as the extension expects of its channel.
    ::fcntl(extensionEnd.get(), F_SETFL, ::fcntl(extensionEnd.get(), F_GETFL) & ~O_NONBLOCK);

    UniqueFd poll(::epoll_create1(EPOLL_CLOEXEC));
    if (!poll.isValid())
        return fail(error, QStringLiteral("cannot make the session's poll set: %1").arg(errnoText()));

    ChildSpec spec;
    spec.program = extensionExecutable;
    spec.environment = {QByteArray(kChannelVariable)};
    spec.handedFd = extensionEnd.get();
    QString spawnError;
    const std::optional<pid_t> pid = spawnChild(spec, &spawnError);
    if (!pid)
        return fail(error, spawnError);
    UniqueFd processFd(::pidfd_open(*pid, 0));
    if (!processFd.isValid()) {
        // Without a pidfd the session could not see the end without waiting: it ends the child now.
        const QString text = QStringLiteral("cannot watch the extension (process %1): %2").arg(*pid).arg(errnoText());
        ::kill(*pid, SIGKILL);
        reapChild(*pid, QStringLiteral("the extension (process %1)").arg(*pid));
        return fail(error, text);
    }
    log::info(lcHost(), QStringLiteral("started the extension %1 (process %2)").arg(extensionExecutable).arg(*pid));

    m_pid = *pid;
    m_callbacks = std::move(callbacks);
    m_channel = std::move(hostEnd);
    m_processFd = std::move(processFd);
    m_poll = std::move(poll);
    epoll_event channelEvent{};
    channelEvent.events = EPOLLIN;
    channelEvent.data.fd = m_channel.get();
    epoll_event processEvent{};
    processEvent.events = EPOLLIN;
    processEvent.data.fd = m_processFd.get();
    if (::epoll_ctl(m_poll.get(), EPOLL_CTL_ADD, m_channel.get(), &channelEvent) != 0
        || ::epoll_ctl(m_poll.get(), EPOLL_CTL_ADD, m_processFd.get(), &processEvent) != 0) {
        // Started but unwatchable: the destructor ends it.
        return fail(error, QStringLiteral("cannot watch the extension's channel: %1").arg(errnoText()));
    }
    // A failure here (the extension died at once) shows up as a closed channel and the finished
    // callback, not as a failed start.
    queue(request, nullptr);
    return true;
}

int PolledSession::dispatch(QString *error)
{
    if (m_pid <= 0) {
        fail(error, QStringLiteral("the extension session was not started"));
        return -1;
    }
    if (m_finished)
        return 0;
    epoll_event events[2];
    const int count = ::epoll_wait(m_poll.get(), events, 2, 0);
    if (count < 0 && errno != EINTR) {
        fail(error, QStringLiteral("cannot wait for the extension: %1").arg(errnoText()));
        return -1;
    }
    bool ended = false;
    for (int i = 0; i < count; ++i) {
        if (events[i].data.fd == m_processFd.get()) {
            ended = true;
            continue;
        }
        if (events[i].events & EPOLLOUT)
            flush();
        if (events[i].events & (EPOLLIN | EPOLLHUP | EPOLLERR))
            readChannel(kReadsPerDispatch);
    }
    if (ended)
        collectProcess();
    return m_finished ? 0 : 1;
}

bool PolledSession::removeView(QString *error)
{
    if (m_pid <= 0)
        return fail(error, QStringLiteral("cannot remove the extension's view: the session was not started"));
    return queue(ExtensionConversation::removeView(), error);
}

bool PolledSession::queue(const QByteArray &payload, QString *error)
{
    if (!m_channel.isValid())
        return fail(error, QStringLiteral("cannot write to the extension: the channel is closed"));
    m_pending += zaf::extensionkit::encodeFrame(payload);
    flush();
    return true;
}

void PolledSession::flush()
{
    while (!m_pending.isEmpty() && m_channel.isValid()) {
        const ssize_t written = ::send(m_channel.get(), m_pending.constData(), size_t(m_pending.size()), MSG_NOSIGNAL | MSG_DONTWAIT);
        if (written >= 0) {
            m_pending.remove(0, written);
            continue;
        }
        if (errno == EINTR)
            continue;
        if (errno == EAGAIN || errno == EWOULDBLOCK)
            break;
        closeChannel(QStringLiteral("cannot write to the extension: %1").arg(errnoText()));
        return;
    }
    watchChannel(!m_pending.isEmpty());
}

void PolledSession::readChannel(int maxReads)
{
    char buffer[65536];
    for (int reads = 0; reads < maxReads && m_channel.isValid(); ++reads) {
        const ssize_t got = ::recv(m_channel.get(), buffer, sizeof buffer, MSG_DONTWAIT);
        if (got < 0 && errno == EINTR)
            continue;
        if (got < 0 && (errno == EAGAIN || errno == EWOULDBLOCK))
            return;
        if (got <= 0) {
            closeChannel(got == 0 ? QStringLiteral("the extension closed its end") : QStringLiteral("cannot read from the extension: %1").arg(errnoText()));
            return;
        }
        const bool usable = m_decoder.feed(buffer, got);
        while (std::optional<QByteArray> payload = m_decoder.takeFrame()) {
            deliver(m_conversation.interpret(*payload));
        }
        // The messages complete before a bad length still count; the stream after it cannot be
        // resynchronised.
        if (!usable) {
            log::error(lcHost(), QStringLiteral("malformed message from the extension: %1").arg(m_decoder.errorString()));
            closeChannel(QStringLiteral("the stream from the extension is unusable"));
            return;
        }
    }
}

void PolledSession::deliver(const ExtensionMessage &message)
{
    if (message.answer)
        queue(*message.answer, nullptr);
    switch (message.kind) {
    case ExtensionMessage::Kind::Accepted:
        if (m_callbacks.accepted)
            m_callbacks.accepted(message.protocolVersion);
        return;
    case ExtensionMessage::Kind::Refused:
        if (m_callbacks.refused)
            m_callbacks.refused(message.errorCode, message.text);
        return;
    case ExtensionMessage::Kind::Reported:
        if (m_callbacks.reported)
            m_callbacks.reported(message.activityTypes);
        return;
    case ExtensionMessage::Kind::ProtocolError:
        return; // logged; the session goes on
    }
}

void PolledSession::closeChannel(const QString &reason)
{
    if (!m_channel.isValid())
        return;
    log::info(lcHost(), QStringLiteral("the channel to the extension closed: %1").arg(reason));
    ::epoll_ctl(m_poll.get(), EPOLL_CTL_DEL, m_channel.get(), nullptr);
    m_channel.reset();
    m_pending.clear();
    m_watchingWrites = false;
}

void PolledSession::watchChannel(bool forWriting)
{
    if (forWriting == m_watchingWrites || !m_channel.isValid())
        return;
    epoll_event event{};
    event.events = forWriting ? EPOLLIN | EPOLLOUT : EPOLLIN;
    event.data.fd = m_channel.get();
    if (::epoll_ctl(m_poll.get(), EPOLL_CTL_MOD, m_channel.get(), &event) == 0)
        m_watchingWrites = forWriting;
    else
        log::error(lcHost(), QStringLiteral("cannot watch the extension's channel: %1").arg(errnoText()));
}

void PolledSession::collectProcess()
{
    // Everything the process wrote before it ended comes before its end.
    readChannel(kReadsAfterExit);
    closeChannel(QStringLiteral("the extension ended"));
    ::epoll_ctl(m_poll.get(), EPOLL_CTL_DEL, m_processFd.get(), nullptr);
    m_exitStatus = reapChild(m_pid, QStringLiteral("the extension (process %1)").arg(m_pid));
    m_finished = true;
    if (m_callbacks.finished)
        m_callbacks.finished(m_exitStatus);
}

bool PolledSession::waitForEnd(int milliseconds) const
{
    pollfd watched{m_processFd.get(), POLLIN, 0};
    int r;
    while ((r = ::poll(&watched, 1, milliseconds)) < 0 && errno == EINTR) {
    }
    return r > 0;
}

} // namespace zaf::host
