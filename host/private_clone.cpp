#include "host/private_clone.h"

#include "host/host_log.h"
#include "platform/files/file_manager.h"
#include "platform/log.h"

#include <QDateTime>
#include <QDir>
#include <QFileInfo>

namespace zaf::host {

namespace {

constexpr const char *kFolderPattern = "zafrel-open-";

} // namespace

std::unique_ptr<PrivateClone> PrivateClone::make(const QString &source, const QString &cacheDirectory, QString *error)
{
    QDir().mkpath(cacheDirectory);
    sweep(cacheDirectory);
    std::unique_ptr<PrivateClone> clone(new PrivateClone);
    clone->m_folder = std::make_unique<QTemporaryDir>(QDir(cacheDirectory).filePath(QLatin1String(kFolderPattern) + QStringLiteral("XXXXXX")));
    if (!clone->m_folder->isValid()) {
        *error = QStringLiteral("cannot make a folder for the editor's copy in %1: %2").arg(cacheDirectory, clone->m_folder->errorString());
        return nullptr;
    }
    Result<DirectoryLock> lock = DirectoryLock::lock(clone->m_folder->path(), DirectoryLock::Wait::No);
    if (!lock.ok()) {
        *error = QStringLiteral("cannot lock %1: %2").arg(clone->m_folder->path(), lock.error->description());
        return nullptr;
    }
    clone->m_lock = std::move(*lock.value);
    clone->m_path = clone->m_folder->filePath(QFileInfo(source).fileName());
    FileManager::CloneKind kind = FileManager::CloneKind::Copy;
    if (const OptionalError failure = FileManager::defaultManager().cloneItemAtPath(source, clone->m_path, &kind)) {
        *error = QStringLiteral("cannot hand the editor a copy of %1: %2").arg(source, failure->description());
        return nullptr;
    }
    zaf::log::info(lcHost(), QStringLiteral("the editor works on %1 of %2")
        .arg(QLatin1String(kind == FileManager::CloneKind::Reflink ? "a clone" : kind == FileManager::CloneKind::HardLink ? "a hard link" : "a copy"), source));
    return clone;
}

PrivateClone::~PrivateClone()
{
    m_folder.reset(); // removes the folder, then the lock goes
}

int PrivateClone::sweep(const QString &cacheDirectory, int minimumAgeSeconds)
{
    int swept = 0;
    const QDateTime youngest = QDateTime::currentDateTime().addSecs(-minimumAgeSeconds);
    const QFileInfoList folders = QDir(cacheDirectory).entryInfoList({QLatin1String(kFolderPattern) + QStringLiteral("*")},
                                                                     QDir::Dirs | QDir::NoDotAndDotDot | QDir::Hidden);
    for (const QFileInfo &folder : folders) {
        if (folder.isSymLink() || folder.lastModified() > youngest)
            continue;
        Result<DirectoryLock> lock = DirectoryLock::lock(folder.absoluteFilePath(), DirectoryLock::Wait::No);
        if (!lock.ok())
            continue; // its zaf-host still runs
        if (const OptionalError e = FileManager::defaultManager().removeItemAtPath(folder.absoluteFilePath())) {
            zaf::log::error(lcHost(), QStringLiteral("cannot remove %1, left by an earlier editor: %2").arg(folder.absoluteFilePath(), e->description()));
            continue;
        }
        zaf::log::info(lcHost(), QStringLiteral("removed %1, left by an earlier editor").arg(folder.absoluteFilePath()));
        ++swept;
    }
    return swept;
}

} // namespace zaf::host
