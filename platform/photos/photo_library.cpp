#include "platform/photos/photo_library.h"

#include "platform/files/file_manager.h"
#include "platform/files/user_folders.h"
#include "platform/dispatch.h"
#include "platform/log.h"
#include "platform/media/media_asset.h"
#include "platform/thread_rules.h"

#include <QDateTime>
#include <QDir>
#include <QFileInfo>
#include <QThreadPool>

Q_LOGGING_CATEGORY(lcPhotos, "zaf.photos")

namespace zaf::photos {

namespace {

Error libraryError(int code, const QString &message)
{
    return Error{QString::fromLatin1(kPhotoLibraryErrorDomain), code, message};
}

// The library's own serial queue.
QThreadPool &libraryQueue()
{
    static QThreadPool pool;
    static std::once_flag once;
    std::call_once(once, [] {
        pool.setMaxThreadCount(1);
        pool.setObjectName(QStringLiteral("zaf.photos"));
    });
    return pool;
}

// "Screen Recording 2026-11-22 at 21.05.33.mp4", then " 2", " 3", ... while a name is taken.
QString candidateName(const QDateTime &when, int attempt)
{
    QString name = QStringLiteral("Screen Recording %1").arg(when.toString(QStringLiteral("yyyy-MM-dd 'at' HH.mm.ss")));
    if (attempt > 1)
        name += QStringLiteral(" %1").arg(attempt);
    return name + QStringLiteral(".mp4");
}

} // namespace

PhotoLibrary &PhotoLibrary::sharedPhotoLibrary()
{
    static PhotoLibrary library(zaf::files::videoLibraryFolder());
    return library;
}

PhotoLibrary::PhotoLibrary(QString directory, const FileManager &fileManager)
    : m_directory(std::move(directory))
    , m_fileManager(fileManager)
{
}

QList<QString> PhotoLibrary::createdVideos() const
{
    std::lock_guard lock(m_mutex);
    return m_created;
}

void PhotoLibrary::performChanges(ChangeBlock changes, Completion completion)
{
    dispatch::asyncOn(libraryQueue(), [this, changes = std::move(changes), completion = std::move(completion)] {
        PhotoLibraryChangeRequest request;
        if (changes)
            changes(request);
        OptionalError failure;
        if (request.videos().isEmpty())
            failure = libraryError(kPhotoLibraryErrorNoRequest, QStringLiteral("no change was requested"));
        for (const QUrl &video : request.videos()) {
            if (OptionalError e = createVideo(video)) {
                failure = e;
                break;
            }
        }
        if (failure)
            log::error(lcPhotos(), QStringLiteral("cannot add the video to %1: %2").arg(m_directory, failure->message));
        ZAF_ASSERT_WORKER_THREAD();
        if (completion)
            completion(!failure, failure);
    });
}

OptionalError PhotoLibrary::createVideo(const QUrl &source)
{
    const QString sourcePath = source.toLocalFile();
    const std::shared_ptr<media::MediaAsset> asset = media::MediaAsset::assetWithURL(source);
    if (sourcePath.isEmpty() || !asset->load() || !asset->isPlayable())
        return libraryError(kPhotoLibraryErrorNotPlayable, QStringLiteral("%1 is not a playable movie").arg(sourcePath));

    const FileManager &fm = m_fileManager;
    if (OptionalError e = fm.createDirectoryAtPath(m_directory, true, 0755))
        return libraryError(kPhotoLibraryErrorLibraryUnavailable, e->message);
    const std::int64_t size = QFileInfo(sourcePath).size();
    const Result<FileSystemAttributes> volume = fm.attributesOfFileSystemForPath(m_directory);
    if (!volume.ok())
        return libraryError(kPhotoLibraryErrorLibraryUnavailable, volume.error->message);
    if (volume.value->freeSize < std::uint64_t(size + kSpareBytes))
        return libraryError(kPhotoLibraryErrorNotEnoughSpace,
                            QStringLiteral("%1 bytes free, %2 needed").arg(volume.value->freeSize).arg(size + kSpareBytes));

    const QDateTime now = QDateTime::currentDateTime();
    for (int attempt = 1; attempt <= 1000; ++attempt) {
        const QString target = QDir(m_directory).filePath(candidateName(now, attempt));
        const OptionalError e = fm.copyItemAtPath(sourcePath, target);
        if (!e) {
            std::lock_guard lock(m_mutex);
            m_created.append(target);
            log::notice(lcPhotos(), QStringLiteral("saved %1").arg(target));
            return std::nullopt;
        }
        if (e->code == ENOSPC || e->code == EDQUOT)
            return libraryError(kPhotoLibraryErrorNotEnoughSpace, e->message);
        // A read-only or forbidden library fails every name alike: the library cannot be written.
        if (e->code == EROFS || e->code == EACCES || e->code == EPERM)
            return libraryError(kPhotoLibraryErrorLibraryUnavailable, e->message);
        if (e->code != EEXIST)
            return libraryError(kPhotoLibraryErrorWriteFailed, e->message);
    }
    return libraryError(kPhotoLibraryErrorWriteFailed, QStringLiteral("no free name in %1").arg(m_directory));
}

} // namespace zaf::photos
