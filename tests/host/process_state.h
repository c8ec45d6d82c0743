#pragma once

// What the host tests ask of a child's process ID once it should have gone.

#include <cerrno>

#include <signal.h>
#include <sys/types.h>
#include <sys/wait.h>

namespace zaf::test {

// True when `pid` is no longer a child waiting to be reaped (no zombie left behind).
inline bool isReaped(pid_t pid)
{
    return ::waitpid(pid, nullptr, WNOHANG) == -1 && errno == ECHILD;
}

// True while a process with this ID exists (a zombie too).
inline bool processExists(pid_t pid)
{
    return ::kill(pid, 0) == 0 || errno != ESRCH;
}

} // namespace zaf::test
