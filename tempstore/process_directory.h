#pragma once

// The temporary directory of one process, inside the per-user root.
//
// Several editors of one user may run at once (one per host), and each empties its temporary
// directory when it goes away. So that none of them removes another's files, every process claims a
// directory of its own under the per-user root ("session-XXXXXX") and holds an exclusive flock on it
// for as long as it runs. The kernel drops that lock when the process ends, however it ends, so a
// directory whose lock can be taken belongs to nobody: what a crashed or killed process left behind
// is removed by the next sweep (at every claim and every emptying).
//
// Claims and sweeps hold a lock on the root itself while they run, so a sweep never sees a new
// directory in the moment between its creation and its lock.
//
// Threads: any. The process's own directory is claimed once, on first use, under a thread-safe
// one-time initialiser, and removed when the process exits normally.

#include "platform/files/directory_lock.h"
#include "platform/files/file_manager.h"

#include <QString>

namespace zaf::tempstore {

// The per-user root, absolute and ending in "/": $ZAF_TEMP_DIRECTORY when set (tests), else
// $XDG_CACHE_HOME/Zafrel/, else ~/.cache/Zafrel/. A per-user cache directory, so two users never
// share it.
QString perUserTempRoot();

class ProcessDirectory {
public:
    // The name prefix of the directories that processes claim under the root.
    static constexpr const char *kNamePrefix = "session-";

    // Creates the root (and its parents, mode 0700) when missing, makes a new directory in it
    // (mode 0700), locks it, and sweeps the abandoned siblings. When the root cannot be made or the
    // lock cannot be taken the failure is logged and the result is unclaimed: path() then still
    // names a directory inside the root that a later setup may create, and no sweep removes it
    // (a sweep removes only what it could lock).
    static ProcessDirectory claim(const FileManager &fileManager, const QString &root);

    ProcessDirectory(ProcessDirectory &&) noexcept = default;
    ProcessDirectory &operator=(ProcessDirectory &&) = delete;
    // Removes the directory with whatever is left in it, then lets go of the lock.
    ~ProcessDirectory();

    // The directory, absolute and ending in "/".
    const QString &path() const { return m_path; }
    bool isClaimed() const { return m_lock.isLocked(); }

    // Removes every directory of the root whose lock is free (its process has ended), and loose
    // entries that earlier versions left in the root itself once they are a day old. Returns the
    // number of entries removed. Never touches a directory that a living process holds.
    int sweepAbandonedSiblings() const;
    // The same sweep of a root by a process that claims nothing there (the tidying tool).
    static int sweepAbandoned(const FileManager &fileManager, const QString &root);
    // Whether a directory of the root is held by a living process (its lock cannot be taken now).
    static bool isHeldByLivingProcess(const QString &directory);

private:
    static int sweep(const FileManager &fileManager, const QString &root, const QString &keep);
    ProcessDirectory(const FileManager &fileManager, QString root, QString path, DirectoryLock lock);

    const FileManager *m_fileManager;
    QString m_root;
    QString m_path;
    DirectoryLock m_lock;
};

// This process's own directory, claimed on first use under the per-user root.
const ProcessDirectory &processDirectory();

} // namespace zaf::tempstore
