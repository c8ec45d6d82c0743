#include "host/child_process.h"

#include "host/host_log.h"
#include "platform/dispatch.h"
#include "platform/log.h"

#include <QFileInfo>

#include <cerrno>
#include <chrono>
#include <condition_variable>
#include <cstring>
#include <mutex>
#include <thread>

#include <sys/wait.h>

namespace zaf::host {

struct ChildProcess::Private {
    ChildProcess *q = nullptr;
    QString name; // the program's file name, for the logs
    pid_t pid = 0;
    bool started = false;
    bool reaped = false;
    int graceMs = 3000;
    std::thread watcher;
    // The watcher's report of the child's end, for the destructor's waits.
    std::mutex mutex;
    std::condition_variable endedChanged;
    bool ended = false;

    QString describe() const { return QStringLiteral("%1 (process %2)").arg(name).arg(pid); }

    // The watcher thread: waits until the child has ended, leaving it to be reaped on the owner's
    // thread, which the end is handed over to.
    void watch()
    {
        siginfo_t info{};
        while (::waitid(P_PID, id_t(pid), &info, WEXITED | WNOWAIT) < 0 && errno == EINTR) {
        }
        {
            std::lock_guard lock(mutex);
            ended = true;
        }
        endedChanged.notify_all();
        dispatch::onThreadOf(q, [self = q] { self->d->reap(true); });
    }

    // True once the watcher has seen the end, false after `milliseconds` without it.
    bool waitForEnd(int milliseconds)
    {
        std::unique_lock lock(mutex);
        return endedChanged.wait_for(lock, std::chrono::milliseconds(milliseconds), [this] { return ended; });
    }

    // Collects the ended child's status; `report` emits finished().
    void reap(bool report)
    {
        if (reaped)
            return;
        reaped = true;
        const int exitCode = reapChild(pid, describe());
        if (report)
            Q_EMIT q->finished(exitCode, exitCode != 0);
    }
};

ChildProcess::ChildProcess(QObject *parent) : QObject(parent), d(std::make_unique<Private>())
{
    d->q = this;
}

ChildProcess::~ChildProcess()
{
    if (!d->started)
        return;
    if (!d->reaped)
        endChild(d->pid, d->graceMs, [this](int milliseconds) { return d->waitForEnd(milliseconds); }, d->describe());
    // The child has ended (or been killed, which ends it at once): the watcher returns.
    d->watcher.join();
    d->reap(false);
}

bool ChildProcess::start(const ChildSpec &spec, QString *error)
{
    auto fail = [error](const QString &message) {
        if (error)
            *error = message;
        return false;
    };
    if (d->started)
        return fail(QStringLiteral("%1 was already started").arg(d->describe()));

    QString spawnError;
    const std::optional<pid_t> pid = spawnChild(spec, &spawnError);
    if (!pid)
        return fail(spawnError);

    d->started = true;
    d->pid = *pid;
    d->name = QFileInfo(spec.program).fileName();
    log::info(lcHost(), QStringLiteral("started %1").arg(d->describe()));
    d->watcher = std::thread([this] { d->watch(); });
    return true;
}

void ChildProcess::setTerminationGracePeriod(int milliseconds)
{
    d->graceMs = milliseconds;
}

pid_t ChildProcess::processId() const
{
    return d->pid;
}

bool ChildProcess::isRunning() const
{
    return d->started && !d->reaped;
}

} // namespace zaf::host
