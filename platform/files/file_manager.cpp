#include "platform/files/file_manager.h"

#include "platform/files/atomic_file.h"

#include <QByteArray>
#include <QFile>

#include <cerrno>
#include <dirent.h>
#include <fcntl.h>
#include <linux/fs.h>
#include <sys/ioctl.h>
#include <filesystem>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <unistd.h>

namespace zaf {

namespace {

QByteArray encoded(const QString &path)
{
    return QFile::encodeName(path);
}

// The item a path names: "dir/" names "dir" (so a file in the way is found, and a link is not
// followed merely because of the slash).
QByteArray itemPath(const QString &path)
{
    QByteArray p = encoded(path);
    while (p.size() > 1 && p.endsWith('/'))
        p.chop(1);
    return p;
}

Date toDate(const struct statx_timestamp &ts)
{
    using namespace std::chrono;
    return Date(duration_cast<system_clock::duration>(seconds(ts.tv_sec) + nanoseconds(ts.tv_nsec)));
}

// Retries a system call interrupted by a signal.
template <typename F>
auto retrying(F f)
{
    decltype(f()) r;
    do {
        r = f();
    } while (r == -1 && errno == EINTR);
    return r;
}

OptionalError copyFileData(int in, int out, const QString &from, const QString &to)
{
    char buffer[1 << 16];
    for (;;) {
        const ssize_t n = retrying([&] { return ::read(in, buffer, sizeof buffer); });
        if (n < 0)
            return Error::fromErrno(errno, from);
        if (n == 0)
            return std::nullopt;
        ssize_t written = 0;
        while (written < n) {
            const ssize_t w = retrying([&] { return ::write(out, buffer + written, size_t(n - written)); });
            if (w < 0)
                return Error::fromErrno(errno, to);
            written += w;
        }
    }
}

// Opens a regular file for reading; EINVAL for anything else (a directory, a device).
OptionalError openRegularFile(const QString &path, int *fd)
{
    const int in = retrying([&] { return ::open(encoded(path).constData(), O_RDONLY | O_CLOEXEC); });
    if (in < 0)
        return Error::fromErrno(errno, path);
    struct stat st;
    const int statError = ::fstat(in, &st) != 0 ? errno : (S_ISREG(st.st_mode) ? 0 : EINVAL);
    if (statError != 0) {
        ::close(in);
        return Error::fromErrno(statError, path);
    }
    *fd = in;
    return std::nullopt;
}

} // namespace

FileManager::~FileManager() = default;

FileManager &FileManager::defaultManager()
{
    static FileManager instance;
    return instance;
}

bool FileManager::fileExistsAtPath(const QString &path) const
{
    struct stat st;
    return ::lstat(itemPath(path).constData(), &st) == 0;
}

OptionalError FileManager::createDirectoryAtPath(const QString &path, bool intermediates, mode_t mode) const
{
    if (intermediates) {
        const int slash = path.lastIndexOf(QLatin1Char('/'), path.endsWith(QLatin1Char('/')) ? -2 : -1);
        if (slash > 0) {
            const QString parent = path.left(slash);
            if (!fileExistsAtPath(parent)) {
                if (OptionalError e = createDirectoryAtPath(parent, true, mode))
                    return e;
            }
        }
    }
    if (::mkdir(encoded(path).constData(), mode) != 0) {
        if (intermediates && errno == EEXIST) {
            struct stat st;
            if (::stat(encoded(path).constData(), &st) == 0 && S_ISDIR(st.st_mode))
                return std::nullopt;
        }
        return Error::fromErrno(errno, path);
    }
    return std::nullopt;
}

Result<QStringList> FileManager::contentsOfDirectoryAtPath(const QString &path) const
{
    DIR *dir = ::opendir(encoded(path).constData());
    if (!dir)
        return Result<QStringList>::failure(Error::fromErrno(errno, path));
    QStringList names;
    errno = 0;
    while (struct dirent *entry = ::readdir(dir)) {
        const char *name = entry->d_name;
        if (name[0] == '.' && (name[1] == '\0' || (name[1] == '.' && name[2] == '\0')))
            continue;
        names.append(QFile::decodeName(name));
        errno = 0;
    }
    const int readError = errno;
    ::closedir(dir);
    if (readError != 0)
        return Result<QStringList>::failure(Error::fromErrno(readError, path));
    return Result<QStringList>::success(names);
}

Result<FileAttributes> FileManager::attributesOfItemAtPath(const QString &path) const
{
    struct statx sx;
    if (::statx(AT_FDCWD, itemPath(path).constData(), AT_SYMLINK_NOFOLLOW,
                STATX_BASIC_STATS | STATX_BTIME, &sx) != 0)
        return Result<FileAttributes>::failure(Error::fromErrno(errno, path));
    FileAttributes a;
    a.size = std::int64_t(sx.stx_size);
    a.modificationDate = toDate(sx.stx_mtime);
    a.creationDate = (sx.stx_mask & STATX_BTIME) ? toDate(sx.stx_btime) : toDate(sx.stx_ctime);
    a.isDirectory = S_ISDIR(sx.stx_mode);
    a.isSymbolicLink = S_ISLNK(sx.stx_mode);
    return Result<FileAttributes>::success(a);
}

OptionalError FileManager::removeItemAtPath(const QString &path) const
{
    const std::filesystem::path p(encoded(path).toStdString());
    std::error_code ec;
    const auto status = std::filesystem::symlink_status(p, ec);
    if (ec || !std::filesystem::exists(status))
        return Error::fromErrno(ec ? ec.value() : ENOENT, path);
    std::filesystem::remove_all(p, ec);
    if (ec)
        return Error::fromErrno(ec.value(), path);
    return std::nullopt;
}

OptionalError FileManager::moveItemAtPath(const QString &from, const QString &to) const
{
    OptionalError moved = moveWithoutReplacing(from, to);
    if (!moved || moved->code != EXDEV)
        return moved;
    // Another file system: copy safely, then remove the source.
    if (OptionalError e = copyItemAtPath(from, to))
        return e;
    return removeItemAtPath(from);
}

OptionalError FileManager::copyItemAtPath(const QString &from, const QString &to) const
{
    int in = -1;
    if (OptionalError e = openRegularFile(from, &in))
        return e;
    Result<std::unique_ptr<AtomicFile>> out = AtomicFile::create(to);
    if (!out.ok()) {
        ::close(in);
        return out.error;
    }
    OptionalError failure = copyFileData(in, (*out.value)->descriptor(), from, to);
    ::close(in);
    // On failure the temporary goes with the AtomicFile.
    return failure ? failure : (*out.value)->commit();
}

OptionalError FileManager::cloneItemAtPath(const QString &from, const QString &to, CloneKind *kind) const
{
    CloneKind made = CloneKind::Copy;
    int in = -1;
    if (OptionalError e = openRegularFile(from, &in))
        return e;
    OptionalError failure;
    {
        Result<std::unique_ptr<AtomicFile>> out = AtomicFile::create(to);
        if (!out.ok()) {
            ::close(in);
            return out.error;
        }
        if (::ioctl((*out.value)->descriptor(), FICLONE, in) == 0) {
            made = CloneKind::Reflink;
            failure = (*out.value)->commit();
        }
        // Otherwise the reserved temporary goes with the AtomicFile.
    }
    ::close(in);
    if (made != CloneKind::Reflink) {
        if (::link(encoded(from).constData(), encoded(to).constData()) == 0)
            made = CloneKind::HardLink;
        else if (errno == EEXIST)
            return Error::fromErrno(EEXIST, to);
        else
            failure = copyItemAtPath(from, to);
    }
    if (!failure && kind)
        *kind = made;
    return failure;
}

Result<FileSystemAttributes> FileManager::attributesOfFileSystemForPath(const QString &path) const
{
    struct statvfs vfs;
    if (::statvfs(encoded(path).constData(), &vfs) != 0)
        return Result<FileSystemAttributes>::failure(Error::fromErrno(errno, path));
    FileSystemAttributes a;
    a.freeSize = std::uint64_t(vfs.f_bavail) * vfs.f_frsize;
    a.totalSize = std::uint64_t(vfs.f_blocks) * vfs.f_frsize;
    return Result<FileSystemAttributes>::success(a);
}

} // namespace zaf
