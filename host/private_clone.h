#pragma once

// The editor's private clone of a movie a user opens as their own (`zaf-host --open`): the editor's
// save removes the movie it was handed, so it is handed a clone (a reflink, a hard link or a copy,
// FileManager::cloneItemAtPath) in a folder of the user's cache, never the user's file.
//
// The folder, "zafrel-open-XXXXXX", lives as long as the PrivateClone and holds a DirectoryLock the
// whole time. A folder whose lock is free was left by a zaf-host that ended without removing it
// (killed); making a clone removes such folders first. Any thread.

#include "platform/error.h"
#include "platform/files/directory_lock.h"

#include <QString>
#include <QTemporaryDir>

#include <memory>

namespace zaf::host {

class PrivateClone {
public:
    // Clones `source` into a new folder under `cacheDirectory`; null with `error` set when it cannot.
    static std::unique_ptr<PrivateClone> make(const QString &source, const QString &cacheDirectory, QString *error);
    // Removes the folders of earlier clones whose owners are gone, untouched for at least `minimumAgeSeconds`
    // (so that a folder whose owner is only about to lock it is never taken). Returns how many went.
    static int sweep(const QString &cacheDirectory, int minimumAgeSeconds = 60);

    // Removes the folder and the clone.
    ~PrivateClone();

    QString path() const { return m_path; }

private:
    PrivateClone() = default;

    std::unique_ptr<QTemporaryDir> m_folder;
    DirectoryLock m_lock;
    QString m_path;
};

} // namespace zaf::host
