#pragma once

// ChildProcess: a program the host starts with one of its descriptors handed over, watched until it
// ends and always reaped.
//
// Threads: a ChildProcess lives on the thread that created it, which runs a Qt event loop; start()
// and the destructor are called there and finished() is emitted there. A watcher thread of its own
// waits for the child's end (without reaping it) and hands it over to that thread; the destructor
// joins it.
//
// The child is started by spawnChild (spawn_child.h), which says what it inherits.

#include "host/spawn_child.h"

#include <QObject>
#include <QString>

#include <sys/types.h>

#include <memory>

namespace zaf::host {

class ChildProcess : public QObject {
    Q_OBJECT
public:
    explicit ChildProcess(QObject *parent = nullptr);
    // Ends a child still running and reaps it: it gets the grace period to exit by itself (its owner
    // has asked it to, by closing its channel say), then SIGTERM and another grace period, then
    // SIGKILL. The waits end as soon as the child does (the watcher reports its end; nothing sleeps),
    // so this blocks for at most about twice the grace period. Emits nothing.
    ~ChildProcess() override;

    // Starts the child. False, with `error` filled (when given), when it cannot be started or was
    // already started once.
    bool start(const ChildSpec &spec, QString *error = nullptr);

    // The grace period of the destructor's steps (default 3000 ms).
    void setTerminationGracePeriod(int milliseconds);

    // The child's process ID once started, 0 before; kept after it has been reaped.
    pid_t processId() const;
    // Started and not yet reaped.
    bool isRunning() const;

Q_SIGNALS:
    // The owner's thread: the child has ended and has been reaped. exitCode is its exit status, or
    // 128 + the signal number when a signal killed it (-1 when its status could not be had: someone
    // else reaped it); crashed is true unless it exited with status 0.
    void finished(int exitCode, bool crashed);

private:
    struct Private;
    std::unique_ptr<Private> d;
};

} // namespace zaf::host
