#pragma once

// Running a program from a test to its end: the one way tests start command-line tools (ffmpeg,
// ffprobe, msgfmt, unshare, our own programs). It is built on posix_spawn rather than QProcess:
// QProcess starts and reaps its children in ways ThreadSanitizer cannot follow, and after the
// first one the sanitizer loses track of the calling thread's locks, so every later hand-over
// would be reported as a race.

#include <QByteArray>
#include <QString>
#include <QStringList>

#include <functional>
#include <optional>

namespace zaf::test {

struct ChildOptions {
    int timeoutMs = 300000;                 // then the child is killed and the run fails
    bool mergeErrorIntoOutput = false;      // standard error goes to `out` too
    bool forwardOutput = false;             // both streams go to the test's own instead of being kept
    std::optional<QStringList> environment; // KEY=VALUE entries; none: the test's own environment
    // Takes standard output as it arrives (the whole output so far); called on the test's thread.
    std::function<void(QByteArray &out)> sink;
};

struct ChildRun {
    bool started = false;
    bool timedOut = false;
    int exitCode = -1;                      // -1 when killed by a signal, not started or timed out
    QByteArray out;
    QByteArray err;
    QString error;                          // why it did not start or finish
    bool ok() const { return started && !timedOut && exitCode == 0; }
};

// Runs `program` (looked up in PATH when it has no slash) with `args` and waits for it.
ChildRun runChild(const QString &program, const QStringList &args, const ChildOptions &options = {});

} // namespace zaf::test
