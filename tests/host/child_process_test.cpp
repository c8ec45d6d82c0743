// The child process on its own, with /bin/sh as the child.
#include "host/child_process.h"
#include "platform/unique_fd.h"
#include "tests/host/process_state.h"
#include "tests/support/log_capture.h"
#include "tests/support/named_cases.h"
#include "tests/support/wait_until.h"

#include <QScopeGuard>

#include <gtest/gtest.h>

#include <csignal>
#include <optional>

#include <fcntl.h>
#include <poll.h>

namespace zaf::test {
namespace {

ZAF_PRINT_CASES_AS_NAMES

struct Pipe {
    UniqueFd read, write;
    Pipe()
    {
        int fds[2];
        EXPECT_EQ(::pipe2(fds, O_CLOEXEC), 0);
        read.reset(fds[0]);
        write.reset(fds[1]);
    }
};

// A shell script as the child, handed `fd`.
host::ChildSpec script(const QString &text, int fd, const QList<QByteArray> &environment = {})
{
    return {"/bin/sh", {"-c", text}, environment, fd};
}

// Everything written to `fd` until its end (each wait bounded).
QByteArray readToEnd(int fd)
{
    QByteArray all;
    char buffer[4096];
    pollfd pfd{fd, POLLIN, 0};
    while (::poll(&pfd, 1, 20000) > 0) {
        const ssize_t n = ::read(fd, buffer, sizeof buffer);
        if (n <= 0)
            break;
        all.append(buffer, n);
    }
    return all;
}

struct ExitCase { const char *name; const char *script; int exitCode; bool crashed; };

class ChildExitTest : public ::testing::TestWithParam<ExitCase> {};

TEST_P(ChildExitTest, FinishedCarriesTheExitStatusOnceReaped)
{
    host::ChildProcess child;
    std::optional<std::pair<int, bool>> finished;
    QObject::connect(&child, &host::ChildProcess::finished, [&](int code, bool crashed) { finished.emplace(code, crashed); });
    ASSERT_TRUE(child.start(script(GetParam().script, -1)));
    ASSERT_TRUE(waitUntil([&] { return finished.has_value(); }, 20000));
    EXPECT_EQ(*finished, std::make_pair(GetParam().exitCode, GetParam().crashed));
    EXPECT_FALSE(child.isRunning());
    EXPECT_TRUE(isReaped(child.processId()));
}

INSTANTIATE_TEST_SUITE_P(Ends, ChildExitTest, ::testing::Values(
    ExitCase{"StatusZero", "exit 0", 0, false},
    ExitCase{"StatusSeven", "exit 7", 7, true},
    ExitCase{"KilledBySigkill", "kill -KILL $$", 128 + SIGKILL, true}), caseName);

// What a child started while the host ignores SIGPIPE, blocks SIGUSR1, holds a descriptor open
// across exec and has ZAF_PROBE=host and ZAF_MARKER=inherited writes to the descriptor it was
// handed.
struct FindsCase { const char *name; const char *script; const char *written; };

class ChildFindsTest : public ::testing::TestWithParam<FindsCase> {};

TEST_P(ChildFindsTest, WhatTheHostSetUp)
{
    const auto restoreEnvironment = qScopeGuard([] {
        qunsetenv("ZAF_PROBE");
        qunsetenv("ZAF_MARKER");
    });
    qputenv("ZAF_PROBE", "host");
    qputenv("ZAF_MARKER", "inherited");
    const UniqueFd stray(::open("/dev/null", O_RDONLY)); // not close-on-exec
    ASSERT_TRUE(stray.isValid());
    Pipe pipe;
    host::ChildProcess child;
    sigset_t usr1, before;
    sigemptyset(&usr1);
    sigaddset(&usr1, SIGUSR1);
    ::pthread_sigmask(SIG_BLOCK, &usr1, &before);
    const auto previous = std::signal(SIGPIPE, SIG_IGN);
    const bool started = child.start(script(GetParam().script, pipe.write.get(), {"ZAF_PROBE=child"}));
    std::signal(SIGPIPE, previous);
    ::pthread_sigmask(SIG_SETMASK, &before, nullptr);
    ASSERT_TRUE(started);
    pipe.write.reset();
    EXPECT_EQ(readToEnd(pipe.read.get()).toStdString(), GetParam().written);
}

INSTANTIATE_TEST_SUITE_P(Setups, ChildFindsTest, ::testing::Values(
    FindsCase{"HandedDescriptorAsThree", "echo handed >&3", "handed\n"},
    FindsCase{"NoOtherDescriptor", "exec >&3; ls /proc/$$/fd; exit", "0\n1\n2\n3\n"},
    FindsCase{"EnvironmentEntriesOverTheHosts", "echo $ZAF_PROBE $ZAF_MARKER >&3", "child inherited\n"},
    FindsCase{"SigpipeAtItsDefault", "set -- $(grep SigIgn /proc/self/status); echo $((0x$2 >> 12 & 1)) >&3", "0\n"},
    FindsCase{"NoBlockedSignal", "set -- $(grep SigBlk /proc/self/status); echo $((0x$2)) >&3", "0\n"}), caseName);

class ChildStartFailureTest : public ::testing::TestWithParam<const char *> {};

TEST_P(ChildStartFailureTest, GivesAReasonNamingTheProgram)
{
    host::ChildProcess child;
    QString error;
    EXPECT_FALSE(child.start({GetParam(), {}, {}, -1}, &error));
    EXPECT_TRUE(error.contains(GetParam())) << error.toStdString();
    EXPECT_FALSE(child.isRunning());
    EXPECT_EQ(child.processId(), 0);
}

INSTANTIATE_TEST_SUITE_P(Programs, ChildStartFailureTest, ::testing::Values("/nonexistent/zaf-child", "/dev/null"));

TEST(ChildProcess, SecondStartIsRefused)
{
    host::ChildProcess child;
    ASSERT_TRUE(child.start(script("exit 0", -1)));
    QString error;
    EXPECT_FALSE(child.start(script("exit 0", -1), &error));
    EXPECT_TRUE(error.contains("already started")) << error.toStdString();
}

// The destructor of a child still running, which it has been handed the read end of a pipe whose
// write end the test has closed: one that takes that end as its cue exits by itself; one that
// hangs gets SIGTERM; one that ignores SIGTERM gets SIGKILL. Each is reaped before the destructor
// returns, which emits nothing.
struct TerminationCase { const char *name; const char *script; int graceMs; bool term; bool kill; };

class ChildTerminationTest : public ::testing::TestWithParam<TerminationCase> {};

TEST_P(ChildTerminationTest, DestructorReapsTheChild)
{
    const TerminationCase &c = GetParam();
    LogCapture log;
    pid_t pid = 0;
    bool finished = false;
    {
        Pipe pipe;
        host::ChildProcess child;
        QObject::connect(&child, &host::ChildProcess::finished, [&] { finished = true; });
        child.setTerminationGracePeriod(c.graceMs);
        ASSERT_TRUE(child.start(script(c.script, pipe.read.get())));
        pid = child.processId();
        pipe.write.reset();
    }
    EXPECT_TRUE(isReaped(pid));
    EXPECT_FALSE(processExists(pid));
    EXPECT_FALSE(finished);
    const QString all = log.messages("zaf.host").join('\n');
    EXPECT_EQ(all.contains("SIGTERM"), c.term) << all.toStdString();
    EXPECT_EQ(all.contains("SIGKILL"), c.kill) << all.toStdString();
}

INSTANTIATE_TEST_SUITE_P(Children, ChildTerminationTest, ::testing::Values(
    TerminationCase{"ExitsAtTheEndOfItsInput", "read line <&3", 20000, false, false},
    TerminationCase{"Hangs", "exec sleep 1000", 100, true, false},
    TerminationCase{"IgnoresSigterm", "trap '' TERM; exec sleep 1000", 100, true, true}), caseName);

} // namespace
} // namespace zaf::test
