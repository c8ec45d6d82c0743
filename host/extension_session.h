#pragma once

// One run of the video editor extension, seen from the host: starts the extension process with one
// end of a Unix socket pair as its descriptor 3, sends it the request with the input items, and
// reports what comes back (the acceptance of the request, the activity types the user carried
// out), the end of the channel and the end of the process.
//
// Threads: an ExtensionSession lives on the thread that created it, which must run a Qt event loop
// (normally the main thread); every method is called there and every signal is emitted there.
//
// Order of the signals: requestAccepted() before any report; every message the extension wrote
// before it exited is delivered (activityTypesReported(), protocolError()) before finished();
// channelClosed() comes at most once, before finished() when the process closed its end by exiting.
// finished() is the last signal. Slots must not delete the session directly (use deleteLater()).
//
// Built from a ChildProcess (child_process.h) and the host's end of the channel, a FramedSocket
// (platform/extensionkit/framed_socket.h) that queues what a full socket buffer does not take, so
// the host's thread never waits for the extension to read. Writes never raise SIGPIPE: a dead
// extension makes a write fail with a logged error.

#include "host/input_items.h"

#include <QList>
#include <QObject>
#include <QString>
#include <QStringList>

#include <sys/types.h>

#include <memory>

namespace zaf::host {

// The name of the environment variable that tells the extension its channel's descriptor number.
inline constexpr char kChannelFdVariable[] = "ZAF_EXTENSION_CHANNEL_FD";
// The channel's descriptor number in the extension process.
inline constexpr int kChildChannelFd = 3;
// The largest message accepted in either direction: 1 MiB.
inline constexpr int kMaxMessageLength = 1024 * 1024;

class ExtensionSession : public QObject {
    Q_OBJECT
public:
    explicit ExtensionSession(QObject *parent = nullptr);
    // Ends an extension that is still running: closes the channel (which the extension takes as the
    // removal of its view), waits up to the grace period for it to exit, then SIGTERM, another grace
    // period, then SIGKILL. Always reaps the process. The waits end when the process does (nothing
    // sleeps); they block the calling thread for at most about twice the grace period.
    ~ExtensionSession() override;

    // Starts `extensionExecutable` (a path; no PATH search) and sends `beginExtensionRequest` with
    // `items`. False, with `error` filled (when given), when the channel cannot be made, the program
    // cannot be started, the request is too large, or the session was already started. Arguments:
    // none besides the program name.
    bool start(const QString &extensionExecutable, const QList<InputItem> &items, QString *error = nullptr);

    // Sends the removeExtensionView notification. Logs an error and does nothing else when the
    // channel is closed or the extension has gone.
    void removeView();

    // The grace period of the destructor's termination steps (default 3000 ms).
    void setTerminationGracePeriod(int milliseconds);

    // The extension's process ID while started, 0 before start(); kept after finished().
    pid_t processId() const;
    bool isRunning() const;
    bool isChannelOpen() const;

Q_SIGNALS:
    // Main thread: the extension answered beginExtensionRequest with {"accepted": true}.
    void requestAccepted();
    // Main thread: the extension answered beginExtensionRequest with a JSON-RPC error.
    void requestRejected(const QString &message);
    // Main thread: one extensionDidFinishWithActivityTypes notification, with its activity types in
    // the extension's order (empty: the user did nothing).
    void activityTypesReported(const QStringList &activityTypes);
    // Main thread: a malformed or oversized message from the extension (already logged under
    // "zaf.host"). After an oversized length the channel is closed too.
    void protocolError(const QString &message);
    // Main thread: the channel ended (the extension closed its end or exited, a read failed, or
    // the stream became unusable). Emitted once.
    void channelClosed();
    // Main thread: the process has been reaped. exitCode is its exit status, or 128 + the signal
    // number when a signal killed it; crashed is true when a signal killed it or the exit status
    // is not 0.
    void finished(int exitCode, bool crashed);

private:
    struct Private;
    std::unique_ptr<Private> d;
};

} // namespace zaf::host
