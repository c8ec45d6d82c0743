#include "host/spawn_child.h"

#include "host/host_log.h"
#include "platform/log.h"
#include "platform/unique_fd.h"

#include <QFile>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstring>
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

std::optional<pid_t> spawnChild(const ChildSpec &spec, QString *error)
{
    auto fail = [error](const QString &message) -> std::optional<pid_t> {
        if (error)
            *error = message;
        return std::nullopt;
    };

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
    return pid;
}

void endChild(pid_t pid, int graceMs, const std::function<bool(int milliseconds)> &waitForEnd, const QString &description)
{
    if (waitForEnd(graceMs))
        return;
    log::error(lcHost(), QStringLiteral("%1 did not exit within %2 ms; sending SIGTERM").arg(description).arg(graceMs));
    ::kill(pid, SIGTERM);
    if (waitForEnd(graceMs))
        return;
    log::error(lcHost(), QStringLiteral("%1 did not exit after SIGTERM; sending SIGKILL").arg(description));
    ::kill(pid, SIGKILL);
}

int reapChild(pid_t pid, const QString &description)
{
    int status = 0;
    pid_t r;
    while ((r = ::waitpid(pid, &status, 0)) < 0 && errno == EINTR) {
    }
    if (r != pid) {
        log::error(lcHost(), QStringLiteral("%1 ended with an unknown status").arg(description));
        return -1;
    }
    const int exitCode = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
    if (exitCode == 0)
        log::info(lcHost(), QStringLiteral("%1 exited normally").arg(description));
    else
        log::error(lcHost(), QStringLiteral("%1 ended: %2").arg(description, describeWaitStatus(status)));
    return exitCode;
}

} // namespace zaf::host
