#pragma once

// The temporary file store: the file-manager operations that create, measure and empty the one
// temporary directory, remove and move single files off the caller's thread, and test free space.
//
// The store keeps no state of its own: every operation works on the file system as it finds it.
// Threads: the synchronous operations run on the caller's thread. _srRemoveFile runs its work and
// its completion on the global background-priority queue; _srMoveFileFromURL and
// _srDeleteFilesWithPrefix on the global default-priority queue. Completions never run on the main
// thread: a caller that touches the user interface from one must move to the main thread itself.

#include "platform/error.h"
#include "platform/files/file_manager.h"

#include <QLoggingCategory>
#include <QString>
#include <QUrl>

#include <cstdint>
#include <functional>

Q_DECLARE_LOGGING_CATEGORY(lcTempStore)

class ZafTempStore {
public:
    using Completion = std::function<void(const zaf::OptionalError &)>;
    using Clock = std::function<zaf::Date()>;
    // Removes what processes that have ended left beside this store's directory.
    using AbandonedSweep = std::function<void()>;

    // The store on the default file manager and the process's temporary directory.
    static ZafTempStore &defaultStore();

    // A store over another file manager or directory (tests: a private directory, a fixed clock,
    // a file manager whose volume reports a chosen free size). The directory must end in "/".
    // With a sweep, every emptying also runs it.
    explicit ZafTempStore(const zaf::FileManager &fileManager, QString directory, Clock clock = {},
                          AbandonedSweep sweep = {});

    // The directory path, exactly as configured.
    QString _srTempPath() const;

    // Creates the directory (mode 0700, no intermediate directories) unless an item exists there.
    void _srSetupTempDirectory() const;

    // What a process does once at start: creates the directory's missing parents (mode 0700; the
    // setup itself makes no intermediate directories), then runs _srSetupTempDirectory.
    void prepareAtProcessStart() const;

    // The size attribute of the directory entry itself (not the sum of its files); 0 and the error
    // in *error when it cannot be read.
    std::int64_t _srSizeOfTempDir(zaf::OptionalError *error) const;

    // Removes every entry of the directory; returns the bytes freed. The default store then also
    // removes the directories of processes that have ended (never another living editor's).
    std::int64_t _srDeleteAllTempFiles() const;

    // Removes the entries whose modification date is more than timeToLive seconds ago (every entry
    // when timeToLive is 0.0); returns the bytes freed by the removals that succeeded.
    std::int64_t _srDeleteFilesOlderThanTimeToLiveInSeconds(double timeToLive) const;

    // Removes the item at a file URL on the background-priority queue. Nothing there is no error.
    void _srRemoveFile(const QUrl &fileURL, Completion completion = {}) const;

    // Moves an item on the default-priority queue, replacing whatever is at the destination; a missing
    // source fails the move and leaves the destination alone.
    void _srMoveFileFromURL(const QUrl &source, const QUrl &destination, Completion completion = {}) const;

    // Removes, on the default-priority queue, every entry whose name begins with the prefix,
    // regardless of case and diacritics. No completion.
    void _srDeleteFilesWithPrefix(const QString &prefix) const;

    // True when the volume of the directory has strictly more than ZafScreenRecorderRequiredFreeSpace
    // bytes free.
    bool _srDeviceHasSufficientFreeSpaceForRecording() const;

    // Free bytes on the volume of the directory; 0 when they cannot be read.
    std::uint64_t _srDeviceFreeDiskSpace() const;

private:
    QString entryPath(const QString &name) const;
    void reportAgeCleanupError(const zaf::Error &error) const;

    const zaf::FileManager &m_fileManager;
    QString m_directory;
    Clock m_clock;
    AbandonedSweep m_sweep;
};
