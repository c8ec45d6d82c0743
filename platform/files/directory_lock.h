#pragma once

// DirectoryLock: an exclusive advisory lock (flock) on a directory, held for as long as the
// object lives. Processes of one user use it to tell a directory that a living process owns from
// one that a process which has ended left behind: the kernel drops the lock when its holder exits,
// however it exits (SIGKILL included).
//
// The descriptor is opened close-on-exec, so programs that the process starts never inherit the
// lock and cannot keep it alive after the process has gone. Movable, not copyable. Any thread.

#include "platform/error.h"

#include <QString>

namespace zaf {

class DirectoryLock {
public:
    enum class Wait { No, Yes };

    DirectoryLock() = default;
    ~DirectoryLock();
    DirectoryLock(DirectoryLock &&other) noexcept;
    DirectoryLock &operator=(DirectoryLock &&other) noexcept;
    DirectoryLock(const DirectoryLock &) = delete;
    DirectoryLock &operator=(const DirectoryLock &) = delete;

    // Locks the directory at the path. With Wait::No a lock held elsewhere fails at once with
    // EWOULDBLOCK; with Wait::Yes the call blocks until the holder lets go. Other failures carry
    // the errno of opening the directory (ENOENT, ENOTDIR, EACCES, ...).
    static Result<DirectoryLock> lock(const QString &path, Wait wait);

    bool isLocked() const { return m_fd >= 0; }
    // Lets go of the lock now (the destructor does the same).
    void unlock();

private:
    explicit DirectoryLock(int fd) : m_fd(fd) {}
    int m_fd = -1;
};

} // namespace zaf
