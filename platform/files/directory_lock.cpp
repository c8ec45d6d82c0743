#include "platform/files/directory_lock.h"

#include <QFile>

#include <cerrno>
#include <fcntl.h>
#include <sys/file.h>
#include <unistd.h>
#include <utility>

namespace zaf {

DirectoryLock::~DirectoryLock()
{
    unlock();
}

DirectoryLock::DirectoryLock(DirectoryLock &&other) noexcept
    : m_fd(std::exchange(other.m_fd, -1))
{
}

DirectoryLock &DirectoryLock::operator=(DirectoryLock &&other) noexcept
{
    if (this != &other) {
        unlock();
        m_fd = std::exchange(other.m_fd, -1);
    }
    return *this;
}

Result<DirectoryLock> DirectoryLock::lock(const QString &path, Wait wait)
{
    const QByteArray encoded = QFile::encodeName(path);
    const int fd = ::open(encoded.constData(), O_RDONLY | O_DIRECTORY | O_CLOEXEC | O_NOFOLLOW);
    if (fd < 0)
        return Result<DirectoryLock>::failure(Error::fromErrno(errno, path));
    const int operation = LOCK_EX | (wait == Wait::No ? LOCK_NB : 0);
    int rc;
    do {
        rc = ::flock(fd, operation);
    } while (rc != 0 && errno == EINTR);
    if (rc != 0) {
        const int saved = errno;
        ::close(fd);
        return Result<DirectoryLock>::failure(Error::fromErrno(saved, path));
    }
    return Result<DirectoryLock>::success(DirectoryLock(fd));
}

void DirectoryLock::unlock()
{
    // Closing the only descriptor of the open file description releases the flock.
    if (m_fd >= 0)
        ::close(std::exchange(m_fd, -1));
}

} // namespace zaf
