#pragma once

// The file-system role: the item operations the subsystems need, each reporting a POSIX error.
//
// Every operation is synchronous and runs on the caller's thread; the class has no state, so one
// instance may be used from several threads at once. Operations are virtual so that a test can
// replace a single one (for example the free size of a volume) and keep the others real.

#include "platform/error.h"

#include <QString>
#include <QStringList>

#include <chrono>
#include <cstdint>
#include <optional>
#include <sys/types.h>

namespace zaf {

using Date = std::chrono::system_clock::time_point;

struct FileAttributes {
    std::int64_t size = 0;        // st_size of the entry itself (a directory's own size)
    Date modificationDate;
    Date creationDate;            // birth time where the file system records it, else the change time
    bool isDirectory = false;
    bool isSymbolicLink = false;
};

struct FileSystemAttributes {
    std::uint64_t freeSize = 0;   // bytes available to this user
    std::uint64_t totalSize = 0;
};

class FileManager {
public:
    virtual ~FileManager();

    // The process-wide instance.
    static FileManager &defaultManager();

    // True when an item (file, directory, or link, even a dangling one) exists at the path.
    virtual bool fileExistsAtPath(const QString &path) const;

    // Creates one directory, or with `intermediates` every missing parent too.
    // `mode` is applied to each directory created (before the umask).
    virtual OptionalError createDirectoryAtPath(const QString &path, bool intermediates,
                                                mode_t mode = 0777) const;

    // Names of the entries of a directory (no "." or ".."), in the order the file system lists them.
    virtual Result<QStringList> contentsOfDirectoryAtPath(const QString &path) const;

    // Attributes of the item at the path; a symbolic link is not followed.
    virtual Result<FileAttributes> attributesOfItemAtPath(const QString &path) const;

    // Removes the item at the path; a directory goes with its contents. Nothing there is an error.
    virtual OptionalError removeItemAtPath(const QString &path) const;

    // Moves an item. Fails with EEXIST when the destination exists; never overwrites (see
    // moveWithoutReplacing). Across file systems a file is copied as copyItemAtPath does, then the
    // source is removed.
    virtual OptionalError moveItemAtPath(const QString &from, const QString &to) const;

    // Copies a regular file to a destination that must not exist, through an AtomicFile: the
    // destination appears only complete and flushed to disk, and a failure leaves nothing.
    virtual OptionalError copyItemAtPath(const QString &from, const QString &to) const;

    // How a clone was made.
    enum class CloneKind { Reflink, HardLink, Copy };
    // A second name for a regular file's contents at a destination that must not exist, for a
    // reader that may remove it but never writes it: a copy-on-write clone where the file system
    // can (a reflink), else a hard link on the same file system, else a copy (copyItemAtPath).
    // Removing the destination never touches the source.
    OptionalError cloneItemAtPath(const QString &from, const QString &to, CloneKind *kind = nullptr) const;

    // Attributes of the file system that holds the path.
    virtual Result<FileSystemAttributes> attributesOfFileSystemForPath(const QString &path) const;
};

} // namespace zaf
