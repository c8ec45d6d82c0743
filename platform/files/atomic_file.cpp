#include "platform/files/atomic_file.h"

#include "platform/log.h"

#include <QByteArray>
#include <QFile>
#include <QFileInfo>
#include <QLoggingCategory>
#include <QRandomGenerator>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>
#include <utility>

namespace zaf {

namespace {

Q_LOGGING_CATEGORY(lcFiles, "zaf.files")

QString errnoText(int errnum)
{
    return QString::fromLocal8Bit(std::strerror(errnum));
}

bool itemExists(const QByteArray &path)
{
    struct stat st;
    return ::lstat(path.constData(), &st) == 0;
}

// The directory that holds `path`, for creating the temporary beside it and for flushing the name.
QString directoryOf(const QString &path)
{
    return QFileInfo(path).absolutePath();
}

// Makes the entries of a directory durable (step 5). Only logged: see the header.
void syncDirectory(const QString &directory)
{
    const int fd = ::open(QFile::encodeName(directory).constData(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    if (fd < 0 || ::fsync(fd) != 0)
        zaf::log::error(lcFiles(), QStringLiteral("AtomicFile: cannot flush the directory %1: %2").arg(directory, errnoText(errno)));
    if (fd >= 0)
        ::close(fd);
}

// The rename chain of moveWithoutReplacing(), without the directory flush. Returns 0 or an errno.
int renameNoReplace(const QByteArray &from, const QByteArray &to)
{
    if (::renameat2(AT_FDCWD, from.constData(), AT_FDCWD, to.constData(), RENAME_NOREPLACE) == 0)
        return 0;
    if (errno != EINVAL && errno != ENOSYS)
        return errno;
    // EINVAL is also the answer to moving a directory into itself; the steps below refuse that too.
    if (::link(from.constData(), to.constData()) == 0) {
        if (::unlink(from.constData()) != 0)
            zaf::log::error(lcFiles(), QStringLiteral("AtomicFile: %1 is in place but its old name %2 stays: %3")
                                           .arg(QFile::decodeName(to), QFile::decodeName(from), errnoText(errno)));
        return 0;
    }
    const int linkError = errno;
    if (linkError != EPERM && linkError != EOPNOTSUPP && linkError != ENOSYS && linkError != EMLINK)
        return linkError;
    if (itemExists(to))
        return EEXIST;
    return ::rename(from.constData(), to.constData()) == 0 ? 0 : errno;
}

} // namespace

OptionalError moveWithoutReplacing(const QString &from, const QString &to)
{
    if (const int err = renameNoReplace(QFile::encodeName(from), QFile::encodeName(to)))
        return Error::fromErrno(err, err == EEXIST ? to : from);
    syncDirectory(directoryOf(to));
    return std::nullopt;
}

AtomicFile::AtomicFile(QString destination, QString temporaryPath, int fd)
    : m_destination(std::move(destination))
    , m_temporaryPath(std::move(temporaryPath))
    , m_fd(fd)
{
}

AtomicFile::~AtomicFile()
{
    discard();
}

Result<std::unique_ptr<AtomicFile>> AtomicFile::create(const QString &destination)
{
    using R = Result<std::unique_ptr<AtomicFile>>;
    if (destination.isEmpty())
        return R::failure(Error::fromErrno(ENOENT, destination));
    if (itemExists(QFile::encodeName(destination)))
        return R::failure(Error::fromErrno(EEXIST, destination));
    const QFileInfo info(destination);
    // A long destination name is shortened in the temporary's, which must stay within NAME_MAX.
    const QString prefix = info.absolutePath() + QStringLiteral("/.") + info.fileName().left(96) + QStringLiteral(".partial-");
    QByteArray path;
    int fd = -1;
    for (int attempt = 0; attempt < 100 && fd < 0; ++attempt) {
        path = QFile::encodeName(prefix + QString::number(QRandomGenerator::global()->generate64(), 36));
        fd = ::open(path.constData(), O_RDWR | O_CREAT | O_EXCL | O_CLOEXEC, 0666);
        if (fd < 0 && errno != EEXIST)
            break;
    }
    if (fd < 0)
        return R::failure(Error::fromErrno(errno, info.absolutePath()));
    return R::success(std::unique_ptr<AtomicFile>(new AtomicFile(destination, QFile::decodeName(path), fd)));
}

OptionalError AtomicFile::commit()
{
    if (m_done)
        return std::nullopt;
    OptionalError failure;
    if (::fsync(m_fd) != 0)
        failure = Error::fromErrno(errno, m_temporaryPath);
    else if (::close(std::exchange(m_fd, -1)) != 0)
        failure = Error::fromErrno(errno, m_temporaryPath);
    else
        failure = moveWithoutReplacing(m_temporaryPath, m_destination);
    if (failure) {
        discard();
        return failure;
    }
    m_done = true;
    return std::nullopt;
}

void AtomicFile::discard()
{
    if (m_done)
        return;
    m_done = true;
    if (m_fd >= 0)
        ::close(std::exchange(m_fd, -1));
    if (::unlink(QFile::encodeName(m_temporaryPath).constData()) != 0 && errno != ENOENT)
        zaf::log::error(lcFiles(), QStringLiteral("AtomicFile: cannot remove the temporary file %1: %2")
                                       .arg(m_temporaryPath, errnoText(errno)));
}

} // namespace zaf
