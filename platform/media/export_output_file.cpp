#include "platform/media/export_output_file.h"

#include "platform/media/export_common.h"
#include "platform/log.h"

#include <QFile>
#include <QFileInfo>
#include <QRandomGenerator>

#include <cerrno>
#include <cstdio>
#include <fcntl.h>
#include <unistd.h>

namespace zaf::media::exportpipe {

namespace {

Error fileError(int errnum, const QString &what, const QString &path)
{
    int code = kMediaErrorWriteFailed;
    if (errnum == ENOSPC || errnum == EDQUOT)
        code = kMediaErrorDiskFull;
    else if (errnum == EEXIST)
        code = kMediaErrorOutputExists;
    return makeMediaError(code, QStringLiteral("%1 %2: %3").arg(what, path, QString::fromLocal8Bit(strerror(errnum))));
}

// rename() that fails with EEXIST instead of replacing the destination.
int renameNoReplace(const QByteArray &from, const QByteArray &to)
{
    if (::renameat2(AT_FDCWD, from.constData(), AT_FDCWD, to.constData(), RENAME_NOREPLACE) == 0)
        return 0;
    if (errno != EINVAL && errno != ENOSYS)
        return errno;
    // File systems without RENAME_NOREPLACE: a hard link cannot replace either.
    if (::link(from.constData(), to.constData()) != 0)
        return errno;
    ::unlink(from.constData());
    return 0;
}

} // namespace

ExportOutputFile::ExportOutputFile(QString destination, QString temporaryPath)
    : m_destination(std::move(destination))
    , m_temporaryPath(std::move(temporaryPath))
{
}

ExportOutputFile::~ExportOutputFile()
{
    discard();
}

std::unique_ptr<ExportOutputFile> ExportOutputFile::create(const QString &destination, Error *error)
{
    const QFileInfo info(destination);
    if (info.exists() || info.isSymLink()) {
        *error = makeMediaError(kMediaErrorOutputExists, QStringLiteral("the output file exists: %1").arg(destination));
        return nullptr;
    }
    // Created with mode 0666 so the umask gives the finished movie the user's usual permissions
    // (a mkstemp file would stay private to its owner).
    const QString prefix = info.absolutePath() + QStringLiteral("/.") + info.fileName() + QStringLiteral(".partial-");
    QByteArray pattern;
    int fd = -1;
    for (int attempt = 0; attempt < 100 && fd < 0; ++attempt) {
        pattern = QFile::encodeName(prefix + QString::number(QRandomGenerator::global()->generate64(), 36));
        fd = ::open(pattern.constData(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0666);
        if (fd < 0 && errno != EEXIST)
            break;
    }
    if (fd < 0) {
        *error = fileError(errno, QStringLiteral("cannot create a file in"), info.absolutePath());
        return nullptr;
    }
    ::close(fd);
    return std::unique_ptr<ExportOutputFile>(new ExportOutputFile(destination, QFile::decodeName(pattern)));
}

OptionalError ExportOutputFile::commit()
{
    const QByteArray from = QFile::encodeName(m_temporaryPath);
    const int fd = ::open(from.constData(), O_RDONLY | O_CLOEXEC);
    if (fd < 0)
        return fileError(errno, QStringLiteral("cannot reopen"), m_temporaryPath);
    const int syncResult = ::fsync(fd);
    const int syncErrno = errno;
    ::close(fd);
    if (syncResult != 0)
        return fileError(syncErrno, QStringLiteral("cannot flush"), m_temporaryPath);
    if (const int rc = renameNoReplace(from, QFile::encodeName(m_destination)); rc != 0)
        return fileError(rc, QStringLiteral("cannot move the export to"), m_destination);
    m_done = true;
    return std::nullopt;
}

void ExportOutputFile::discard()
{
    if (m_done)
        return;
    m_done = true;
    if (::unlink(QFile::encodeName(m_temporaryPath).constData()) != 0 && errno != ENOENT)
        zaf::log::error(lcExport(), QStringLiteral("ExportSession: cannot remove the partial file %1: %2")
                                        .arg(m_temporaryPath, QString::fromLocal8Bit(strerror(errno))));
}

} // namespace zaf::media::exportpipe
