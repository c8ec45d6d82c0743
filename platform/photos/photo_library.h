#pragma once

// The photo library role: the user's video library, the XDG Videos directory.
//
// performChanges() runs the change block and carries out its requests on a serial queue of the
// library's own, then calls the completion on that queue (never the main thread) with a success
// flag and, on failure, an error whose integer code is one of PhotoLibraryErrorCode. Creating a
// video checks that the file is a playable movie and that the library's volume has room, then
// copies it in under a unique, readable name through an unnamed temporary file that is flushed and
// linked into place: never a partial file, never an overwrite. The source file is left untouched.

#include "platform/error.h"
#include "platform/files/file_manager.h"

#include <QList>
#include <QString>
#include <QUrl>

#include <functional>
#include <mutex>

namespace zaf::photos {

inline constexpr const char *kPhotoLibraryErrorDomain = "zaf.photos";
enum PhotoLibraryErrorCode : int {
    kPhotoLibraryErrorNoRequest = 1,        // the change block asked for nothing
    kPhotoLibraryErrorNotPlayable = 2,      // missing, unreadable or not a movie
    kPhotoLibraryErrorNotEnoughSpace = 3,   // the library's volume is too full
    kPhotoLibraryErrorLibraryUnavailable = 4, // the library directory cannot be made or written
    kPhotoLibraryErrorWriteFailed = 5,      // the copy failed (see the message)
};

// The requests a change block makes.
class PhotoLibraryChangeRequest {
public:
    // Asks for a new video asset made from the movie at a file URL.
    void creationRequestForAssetFromVideoAtFileURL(const QUrl &fileURL) { m_videos.append(fileURL); }
    const QList<QUrl> &videos() const { return m_videos; }

private:
    QList<QUrl> m_videos;
};

class PhotoLibrary {
public:
    using ChangeBlock = std::function<void(PhotoLibraryChangeRequest &)>;
    // Runs on the library's queue: whether every request succeeded, and the first error.
    using Completion = std::function<void(bool success, const OptionalError &error)>;

    // The process-wide library: $ZAF_VIDEO_LIBRARY when set (tests), else the XDG Videos directory.
    static PhotoLibrary &sharedPhotoLibrary();
    // A library in a directory, on a file manager (tests use one that reports a chosen free size).
    explicit PhotoLibrary(QString directory, const FileManager &fileManager = FileManager::defaultManager());

    QString libraryDirectory() const { return m_directory; }
    void performChanges(ChangeBlock changes, Completion completion);
    // The paths of the videos created so far by this process (newest last), for reports and tests.
    QList<QString> createdVideos() const;

    // Free bytes the library keeps beyond the movie's size.
    static constexpr std::int64_t kSpareBytes = 16 * 1024 * 1024;

private:
    OptionalError createVideo(const QUrl &source);
    QString m_directory;
    const FileManager &m_fileManager;
    mutable std::mutex m_mutex;
    QList<QString> m_created;
};

} // namespace zaf::photos
