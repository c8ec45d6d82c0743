#pragma once

// FolderWatcher: tells when a file in one folder is finished, through inotify(7).
//
// A file is finished when a descriptor that had it open for writing is closed (IN_CLOSE_WRITE) or
// when it is renamed into the folder (IN_MOVED_TO). Writes alone (IN_MODIFY) are not watched, so a
// file still being written is never reported; a recorder that writes through several descriptors
// of its own may close one early, which is why the watch mode still checks the file itself
// (movie_check.h). Only the folder's own entries count (not those of its subfolders), and not
// subfolders themselves.
//
// A folder that does not exist, yet or any more, is waited for, never created: the watcher watches
// the nearest existing ancestor until the next missing folder of the path appears, step by step, and
// watches the folder from the moment it exists. A folder removed or moved away while watched is
// waited for again. Files finished in a folder before its watch is in place are not reported (a
// folder that has just appeared is watched within one pass of the event loop).
// When the kernel's event queue overflows, the lost events are logged and cannot be recovered.
//
// Threads: a FolderWatcher lives on the thread that created it, which runs a Qt event loop (the
// main thread). The inotify descriptor is read there, by a QSocketNotifier, only when the kernel
// has events for it (nothing polls), and every signal is emitted there. Slots must not delete the
// watcher directly (use deleteLater()).

#include <QObject>
#include <QString>

class QSocketNotifier;

namespace zaf::host::watch {

class FolderWatcher : public QObject {
    Q_OBJECT
public:
    explicit FolderWatcher(QObject *parent = nullptr);
    // Stops watching: closing the inotify descriptor removes every watch.
    ~FolderWatcher() override;

    // Starts watching `folder` (an absolute path), or waiting for it. False, with `error` filled,
    // when inotify cannot be had (the per-user limit of instances, say) or start() was called before.
    bool start(const QString &folder, QString *error);

    QString folder() const { return m_folder; }
    // True while the folder itself is watched, false while it is waited for.
    bool isWatchingFolder() const { return m_folderWatch >= 0; }

Q_SIGNALS:
    // The watcher's thread: the file at `path`, directly in the folder, was closed after being
    // opened for writing, or was renamed into the folder.
    void fileFinished(const QString &path);
    // The watcher's thread: the folder exists and is watched; from start() when it exists, later
    // when it appears.
    void folderWatched(const QString &folder);
    // The watcher's thread: the folder is missing and is waited for; from start() when it is
    // missing, later when it goes away.
    void folderMissing(const QString &folder);

private:
    void readEvents();
    // Watches the folder when it exists, else the nearest existing ancestor.
    void rearm();
    void dropAncestorWatch();

    QString m_folder;
    int m_inotify = -1;
    QSocketNotifier *m_notifier = nullptr;
    int m_folderWatch = -1;   // the folder's watch while it exists
    int m_ancestorWatch = -1; // the nearest existing ancestor's while the folder is missing
    QString m_ancestor;
    bool m_missingAnnounced = false;
};

} // namespace zaf::host::watch
