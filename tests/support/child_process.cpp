#include "tests/support/child_process.h"

#include <QDeadlineTimer>
#include <QFile>

#include <cerrno>
#include <csignal>
#include <cstring>
#include <vector>

#include <fcntl.h>
#include <poll.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

extern char **environ;

namespace zaf::test {

namespace {

// Owns a pipe's two ends.
struct Pipe {
    int read = -1, write = -1;
    bool open()
    {
        int fds[2];
        if (::pipe2(fds, O_CLOEXEC) != 0)
            return false;
        read = fds[0];
        write = fds[1];
        return true;
    }
    static void closeEnd(int &fd)
    {
        if (fd >= 0)
            ::close(fd);
        fd = -1;
    }
    ~Pipe()
    {
        closeEnd(read);
        closeEnd(write);
    }
};

// Null-terminated argv/envp arrays over byte strings that outlive them.
struct CStrings {
    std::vector<QByteArray> storage;
    std::vector<char *> pointers;
    explicit CStrings(const QStringList &list, bool localEncoding)
    {
        for (const QString &s : list)
            storage.push_back(localEncoding ? QFile::encodeName(s) : s.toUtf8());
        for (QByteArray &b : storage)
            pointers.push_back(b.data());
        pointers.push_back(nullptr);
    }
};

} // namespace

ChildRun runChild(const QString &program, const QStringList &args, const ChildOptions &options)
{
    ChildRun run;
    Pipe out, err;
    if (!options.forwardOutput && (!out.open() || (!options.mergeErrorIntoOutput && !err.open()))) {
        run.error = QStringLiteral("no pipe: %1").arg(QString::fromLocal8Bit(std::strerror(errno)));
        return run;
    }
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, STDIN_FILENO, "/dev/null", O_RDONLY, 0);
    if (!options.forwardOutput) {
        posix_spawn_file_actions_adddup2(&actions, out.write, STDOUT_FILENO);
        posix_spawn_file_actions_adddup2(&actions, options.mergeErrorIntoOutput ? out.write : err.write, STDERR_FILENO);
    }
    const CStrings argv(QStringList{program} + args, true);
    std::optional<CStrings> envp;
    if (options.environment)
        envp.emplace(*options.environment, true);
    pid_t pid = -1;
    const int rc = ::posix_spawnp(&pid, argv.pointers[0], &actions, nullptr, argv.pointers.data(),
                                  envp ? envp->pointers.data() : environ);
    posix_spawn_file_actions_destroy(&actions);
    Pipe::closeEnd(out.write);
    Pipe::closeEnd(err.write);
    if (rc != 0) {
        run.error = QStringLiteral("cannot start %1: %2").arg(program, QString::fromLocal8Bit(std::strerror(rc)));
        return run;
    }
    run.started = true;

    const QDeadlineTimer deadline(options.timeoutMs);
    char buffer[65536];
    while (out.read >= 0 || err.read >= 0) {
        pollfd fds[2];
        int count = 0;
        for (int fd : {out.read, err.read}) {
            if (fd >= 0)
                fds[count++] = pollfd{fd, POLLIN, 0};
        }
        const int ready = ::poll(fds, nfds_t(count), int(std::min<qint64>(deadline.remainingTime(), 200)));
        if (ready < 0 && errno != EINTR)
            break;
        if (deadline.hasExpired()) {
            run.timedOut = true;
            break;
        }
        for (int i = 0; i < count; ++i) {
            if (!(fds[i].revents & (POLLIN | POLLHUP | POLLERR)))
                continue;
            const bool isOut = fds[i].fd == out.read;
            const ssize_t n = ::read(fds[i].fd, buffer, sizeof buffer);
            if (n > 0) {
                (isOut ? run.out : run.err).append(buffer, n);
                if (isOut && options.sink)
                    options.sink(run.out);
            } else if (n == 0 || errno != EINTR) {
                Pipe::closeEnd(isOut ? out.read : err.read);
            }
        }
    }
    // The outputs are closed: wait for the end, within the same deadline.
    int status = 0;
    while (!run.timedOut) {
        const pid_t done = ::waitpid(pid, &status, WNOHANG);
        if (done == pid)
            break;
        if (done < 0 && errno != EINTR) {
            run.error = QStringLiteral("cannot wait for %1: %2").arg(program, QString::fromLocal8Bit(std::strerror(errno)));
            return run;
        }
        if (deadline.hasExpired())
            run.timedOut = true;
        else
            ::usleep(5000);
    }
    if (run.timedOut) {
        ::kill(pid, SIGKILL);
        while (::waitpid(pid, &status, 0) < 0 && errno == EINTR) {
        }
        run.error = QStringLiteral("%1 did not finish within %2 s").arg(program).arg(options.timeoutMs / 1000);
        return run;
    }
    run.exitCode = WIFEXITED(status) ? WEXITSTATUS(status) : -1;
    return run;
}

} // namespace zaf::test
