#include "host/watch/movie_check.h"

#include "platform/unique_fd.h"

#include <QFile>
#include <QHashFunctions>

#include <cerrno>
#include <cstring>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace zaf::host::watch {

namespace {

quint64 bigEndian(const unsigned char *bytes, int count)
{
    quint64 value = 0;
    for (int i = 0; i < count; ++i)
        value = (value << 8) | bytes[i];
    return value;
}

// The four-character type as text, with anything unprintable shown as '?'.
QString typeText(const unsigned char *type)
{
    QString text;
    for (int i = 0; i < 4; ++i)
        text += (type[i] >= 0x20 && type[i] < 0x7f) ? QChar(type[i]) : QChar(u'?');
    return text;
}

// Reads up to `count` bytes at `offset`; how many it got, or -1 with errno set.
ssize_t readAt(int fd, unsigned char *buffer, size_t count, off_t offset)
{
    size_t got = 0;
    while (got < count) {
        const ssize_t n = ::pread(fd, buffer + got, count - got, offset + off_t(got));
        if (n < 0 && errno == EINTR)
            continue;
        if (n < 0)
            return -1;
        if (n == 0)
            break;
        got += size_t(n);
    }
    return ssize_t(got);
}

MovieCheck verdict(MovieCheck check, MovieVerdict verdict, const QString &reason)
{
    check.verdict = verdict;
    check.reason = reason;
    return check;
}

} // namespace

size_t qHash(const FileIdentity &identity, size_t seed) noexcept
{
    return qHashMulti(seed, quint64(identity.device), quint64(identity.inode), identity.size, identity.modifiedNs);
}

bool isPartialName(const QString &fileName)
{
    static const char *const suffixes[] = {".part", ".partial", ".tmp", ".temp", ".crdownload", ".download", "~"};
    if (fileName.startsWith(QLatin1Char('.')))
        return true;
    for (const char *suffix : suffixes) {
        if (fileName.endsWith(QLatin1String(suffix), Qt::CaseInsensitive))
            return true;
    }
    return false;
}

MovieCheck checkMovieFile(const QString &path)
{
    MovieCheck check;
    const UniqueFd fd(::open(QFile::encodeName(path).constData(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY));
    if (!fd.isValid()) {
        const int err = errno;
        if (err == ELOOP)
            return verdict(check, MovieVerdict::NotAFile, QStringLiteral("it is a symbolic link"));
        if (err == ENOENT || err == ENOTDIR)
            return verdict(check, MovieVerdict::NotAFile, QStringLiteral("it is gone"));
        return verdict(check, MovieVerdict::Unreadable, QStringLiteral("it cannot be opened: %1").arg(QString::fromLocal8Bit(std::strerror(err))));
    }
    struct stat info {};
    if (::fstat(fd.get(), &info) != 0)
        return verdict(check, MovieVerdict::Unreadable, QStringLiteral("it cannot be examined: %1").arg(QString::fromLocal8Bit(std::strerror(errno))));
    if (!S_ISREG(info.st_mode))
        return verdict(check, MovieVerdict::NotAFile, QStringLiteral("it is not a regular file"));
    check.identity = {info.st_dev, info.st_ino, qint64(info.st_size), qint64(info.st_mtim.tv_sec) * 1000000000 + info.st_mtim.tv_nsec};
    if (info.st_size == 0)
        return verdict(check, MovieVerdict::Incomplete, QStringLiteral("it is empty"));

    const quint64 end = quint64(info.st_size);
    quint64 offset = 0;
    bool moov = false;
    for (int boxes = 1; offset < end; ++boxes) {
        if (boxes > kMaxTopLevelBoxes)
            return verdict(check, MovieVerdict::NotMpeg4, QStringLiteral("it has more than %1 top-level boxes").arg(kMaxTopLevelBoxes));
        unsigned char header[16];
        const ssize_t got = readAt(fd.get(), header, end - offset >= 16 ? 16 : size_t(end - offset), off_t(offset));
        if (got < 0)
            return verdict(check, MovieVerdict::Unreadable, QStringLiteral("it cannot be read: %1").arg(QString::fromLocal8Bit(std::strerror(errno))));
        if (got < 8)
            return verdict(check, boxes == 1 ? MovieVerdict::NotMpeg4 : MovieVerdict::Incomplete,
                           QStringLiteral("it ends inside a box header at byte %1").arg(offset));
        const QString type = typeText(header + 4);
        if (boxes == 1 && type != QLatin1String("ftyp"))
            return verdict(check, MovieVerdict::NotMpeg4, QStringLiteral("it does not start with an ftyp box"));
        quint64 size = bigEndian(header, 4);
        quint64 headerLength = 8;
        if (size == 1) {
            if (got < 16)
                return verdict(check, MovieVerdict::Incomplete, QStringLiteral("it ends inside the header of the %1 box at byte %2").arg(type).arg(offset));
            size = bigEndian(header + 8, 8);
            headerLength = 16;
        } else if (size == 0) {
            size = end - offset; // the box runs to the end of the file
        }
        if (size < headerLength)
            return verdict(check, MovieVerdict::NotMpeg4, QStringLiteral("the %1 box at byte %2 is shorter than its header").arg(type).arg(offset));
        if (boxes == 1 && size < headerLength + 8)
            return verdict(check, MovieVerdict::NotMpeg4, QStringLiteral("its ftyp box has no brand"));
        if (size > end - offset)
            return verdict(check, MovieVerdict::Incomplete, QStringLiteral("it is cut short: the %1 box at byte %2 needs %3 bytes, %4 are there")
                                                                .arg(type).arg(offset).arg(size).arg(end - offset));
        moov = moov || type == QLatin1String("moov");
        offset += size;
    }
    if (!moov)
        return verdict(check, MovieVerdict::Incomplete, QStringLiteral("it has no moov box (the recording was not finished)"));
    return verdict(check, MovieVerdict::Movie, {});
}

} // namespace zaf::host::watch
