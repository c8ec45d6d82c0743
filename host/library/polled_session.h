#pragma once

// PolledSession: one run of the extension for a host without a Qt event loop. It starts the
// extension with one end of a socket pair as its descriptor 3, sends the request, and does the rest
// when its owner calls dispatch(): read and interpret the extension's messages
// (ExtensionConversation), write what waits to be written, collect the ended process.
//
// It has no thread: one descriptor (an epoll set over the channel and a pidfd of the process)
// becomes readable when there is work, and dispatch() never waits. Every callback runs inside
// dispatch(), on the thread that called it.
//
// Threads: used from one thread at a time.

#include "host/extension_conversation.h"
#include "host/input_items.h"
#include "platform/extensionkit/frame_codec.h"
#include "platform/unique_fd.h"

#include <QByteArray>
#include <QList>
#include <QString>
#include <QStringList>

#include <sys/types.h>

#include <functional>

namespace zaf::host {

class PolledSession {
public:
    // Each called from dispatch(), on its caller's thread; any may be empty.
    struct Callbacks {
        std::function<void(const QString &protocolVersion)> accepted;
        std::function<void(int code, const QString &message)> refused;
        std::function<void(const QStringList &activityTypes)> reported;
        // The last one: the process has been reaped (its exit status, 128 + signal, or -1).
        std::function<void(int exitStatus)> finished;
    };

    PolledSession() = default;
    // A running extension gets the end of its channel (the removal of its view), then SIGTERM after
    // the grace period, then SIGKILL after another; it is always reaped.
    ~PolledSession();
    PolledSession(const PolledSession &) = delete;
    PolledSession &operator=(const PolledSession &) = delete;

    bool start(const QString &extensionExecutable, const QList<InputItem> &items, Callbacks callbacks, QString *error);
    int fd() const { return m_poll.get(); }
    // 1 while the session goes on, 0 once finished (after the finished callback), -1 on an error of
    // the session's own (`error` says which).
    int dispatch(QString *error);
    bool removeView(QString *error);
    bool isStarted() const { return m_pid > 0; }
    bool isFinished() const { return m_finished; }
    // Once finished: the exit status the finished callback had.
    int exitStatus() const { return m_exitStatus; }

    // The grace period of the destructor's steps (default 3000 ms).
    void setTerminationGracePeriod(int milliseconds) { m_graceMs = milliseconds; }

private:
    bool queue(const QByteArray &payload, QString *error);
    void flush();
    void readChannel(int maxReads);
    void deliver(const ExtensionMessage &message);
    void closeChannel(const QString &reason);
    void watchChannel(bool forWriting);
    void collectProcess();
    bool waitForEnd(int milliseconds) const;

    Callbacks m_callbacks;
    ExtensionConversation m_conversation;
    UniqueFd m_channel;
    UniqueFd m_processFd; // a pidfd: readable once the process has ended
    UniqueFd m_poll;      // epoll over the two
    pid_t m_pid = 0;
    zaf::extensionkit::FrameDecoder m_decoder;
    QByteArray m_pending; // framed bytes the socket has not taken yet
    bool m_watchingWrites = false;
    bool m_finished = false;
    int m_exitStatus = -1;
    int m_graceMs = 3000;
};

} // namespace zaf::host
