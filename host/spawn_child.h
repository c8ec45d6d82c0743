#pragma once

// Starting a child program with one of the host's descriptors handed over as its descriptor 3, and
// collecting it when it has ended.
//
// The child starts with no blocked signals and SIGPIPE at its default, whatever the host does, and
// with none of the host's descriptors but the standard three and the one handed over.
//
// Threads: any; spawnChild keeps no state. The caller owns the child: it must reap it.

#include <QByteArray>
#include <QList>
#include <QString>
#include <QStringList>

#include <sys/types.h>

#include <functional>
#include <optional>

namespace zaf::host {

// The number the handed descriptor has in the child.
inline constexpr int kHandedFd = 3;

struct ChildSpec {
    QString program;               // a path; no PATH search
    QStringList arguments;         // after the program's name
    QList<QByteArray> environment; // NAME=VALUE entries set over the host's own environment
    int handedFd = -1;             // a descriptor of the host's, given to the child as kHandedFd; -1: none
};

// Starts the child and returns its process ID, or nullopt with `error` filled (when given).
std::optional<pid_t> spawnChild(const ChildSpec &spec, QString *error = nullptr);

// Ends a child still running, as its owner's destructor does: it gets `graceMs` to exit by itself
// (its owner has asked it to, by closing its channel say), then SIGTERM and another `graceMs`, then
// SIGKILL. `waitForEnd(ms)` waits up to ms for the child's end without collecting it, true once it
// has ended. Logs each escalation under "zaf.host", naming the child `description`. Does not reap.
void endChild(pid_t pid, int graceMs, const std::function<bool(int milliseconds)> &waitForEnd, const QString &description);

// Collects an ended child (waits for it when it has not ended yet) and logs how it ended under
// "zaf.host", naming it `description`. Its exit status, 128 + the signal number when a signal
// killed it, or -1 when its status could not be had (someone else reaped it).
int reapChild(pid_t pid, const QString &description);

} // namespace zaf::host
