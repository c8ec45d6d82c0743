#include "host/child_process.h"

#include "host/host_log.h"
#include "platform/dispatch.h"
#include "platform/log.h"
#include "platform/unique_fd.h"

#include <QFile>
#include <QFileInfo>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <condition_variable>
#include <csignal>
#include <cstring>
#include <mutex>
#include <thread>
#include <vector>

#include <fcntl.h>
#include <spawn.h>
#include <sys/wait.h>

extern char **environ;

namespace zaf::host {

namespace {

QString errnoText(int error)
{
    return QString::fromLocal8Bit(std::strerror(error));
}

// NUL-terminated argv or envp arrays over byte strings they keep alive.
struct CStrings {
    std::vector<QByteArray> storage;
    std::vector<char *> pointers;
    explicit CStrings(std::vector<QByteArray> strings) : storage(std::move(strings))
    {
        for (QByteArray &string : storage)
            pointers.push_back(string.data());
        pointers.push_back(nullptr);
    }
};

// The host's environment with `overrides` (NAME=VALUE) set over it.
std::vector<QByteArray> environmentWith(const QList<QByteArray> &overrides)
{
    auto nameOf = [](const QByteArray &entry) { return entry.left(entry.indexOf('=') + 1); };
    std::vector<QByteArray> entries;
    for (char **entry = environ; entry && *entry; ++entry) {
        const QByteArray current(*entry);
        if (std::none_of(overrides.begin(), overrides.end(), [&](const QByteArray &o) { return nameOf(o) == nameOf(current); }))
            entries.push_back(current);
    }
    entries.insert(entries.end(), overrides.begin(), overrides.end());
    return entries;
}

QString describeWaitStatus(int status)
{
    if (WIFSIGNALED(status))
        return QStringLiteral("killed by signal %1 (%2)").arg(WTERMSIG(status)).arg(QString::fromLocal8Bit(::strsignal(WTERMSIG(status))));
    return QStringLiteral("exit status %1").arg(WEXITSTATUS(status));
}

} // namespace

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
        int status = 0;
        pid_t r;
        while ((r = ::waitpid(pid, &status, 0)) < 0 && errno == EINTR) {
        }
        int exitCode = -1;
        if (r != pid)
            log::error(lcHost(), QStringLiteral("%1 ended with an unknown status").arg(describe()));
        else if (WIFEXITED(status))
            exitCode = WEXITSTATUS(status);
        else
            exitCode = 128 + WTERMSIG(status);
        if (exitCode == 0)
            log::info(lcHost(), QStringLiteral("%1 exited normally").arg(describe()));
        else if (r == pid)
            log::error(lcHost(), QStringLiteral("%1 ended: %2").arg(describe(), describeWaitStatus(status)));
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
    if (!d->reaped && !d->waitForEnd(d->graceMs)) {
        log::error(lcHost(), QStringLiteral("%1 did not exit within %2 ms; sending SIGTERM").arg(d->describe()).arg(d->graceMs));
        ::kill(d->pid, SIGTERM);
        if (!d->waitForEnd(d->graceMs)) {
            log::error(lcHost(), QStringLiteral("%1 did not exit after SIGTERM; sending SIGKILL").arg(d->describe()));
            ::kill(d->pid, SIGKILL);
        }
    }
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

    // A descriptor already at the child's number would be dup2'ed onto itself, which leaves
    // close-on-exec set: it is handed over from a copy instead.
    UniqueFd copy;
    int handed = spec.handedFd;
    if (handed == kHandedFd) {
        copy.reset(::fcntl(handed, F_DUPFD_CLOEXEC, kHandedFd + 1));
        if (!copy.isValid())
            return fail(QStringLiteral("cannot hand descriptor %1 to %2: %3").arg(handed).arg(spec.program, errnoText(errno)));
        handed = copy.get();
    }

    std::vector<QByteArray> arguments{QFile::encodeName(spec.program)};
    for (const QString &argument : spec.arguments)
        arguments.push_back(QFile::encodeName(argument));
    CStrings argv(std::move(arguments));
    CStrings envp(environmentWith(spec.environment));

    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    if (handed >= 0)
        posix_spawn_file_actions_adddup2(&actions, handed, kHandedFd);
    // Whatever else the host left open without close-on-exec stays behind.
    posix_spawn_file_actions_addclosefrom_np(&actions, handed >= 0 ? kHandedFd + 1 : kHandedFd);
    posix_spawnattr_t attributes;
    posix_spawnattr_init(&attributes);
    sigset_t none;
    sigemptyset(&none);
    sigset_t defaults;
    sigemptyset(&defaults);
    sigaddset(&defaults, SIGPIPE);
    posix_spawnattr_setsigmask(&attributes, &none);
    posix_spawnattr_setsigdefault(&attributes, &defaults);
    posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSIGDEF);
    pid_t pid = 0;
    const int spawnError = ::posix_spawn(&pid, argv.pointers[0], &actions, &attributes, argv.pointers.data(), envp.pointers.data());
    posix_spawn_file_actions_destroy(&actions);
    posix_spawnattr_destroy(&attributes);
    if (spawnError != 0)
        return fail(QStringLiteral("cannot start %1: %2").arg(spec.program, errnoText(spawnError)));

    d->started = true;
    d->pid = pid;
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
