#pragma once

// The one routine by which a finished file reaches a name a user sees (an export, a recorded movie,
// a copy out of the temporary directory). What it guarantees, whatever fails and wherever:
//   - the destination name never holds a partial file: the data is written under a temporary name
//     and the destination appears only once the data is on disk;
//   - an existing item at the destination (file, directory, even a dangling link) is never replaced;
//   - a failure, or an AtomicFile dropped without commit(), leaves nothing behind.
//
// The steps, and why each is there:
//   1. create(): refuses at once when the destination exists, so a long job does not run for
//      nothing; then reserves ".<name>.partial-<random>" in the destination's own directory with
//      O_CREAT|O_EXCL (never someone else's file, and the final rename stays on one file system).
//      The mode is 0666 before the umask: the finished file gets the user's usual permissions.
//      The temporary is hidden and named after its destination, so one left by a crash is easy to
//      tell apart and never mistaken for a finished file.
//   2. The caller writes the temporary, through descriptor() or by opening temporaryPath() (an
//      encoder that wants a path). The descriptor stays open from creation to commit.
//   3. commit(): fsync() of that descriptor. fsync works on the file, not on a descriptor, so it
//      also flushes what other descriptors wrote; and the descriptor, open since the file was
//      created, is told of every write-back error of the file since then.
//   4. moveWithoutReplacing() puts the temporary at the destination (see below).
//   5. fsync() of the destination's directory, so the new name survives a power cut too. A failure
//      here is only logged: the complete file is already in place, and reporting a failure for a
//      file that exists would break "nothing left behind on failure".
//   Any failure in 3 or 4 removes the temporary before commit() returns its error.
//
// Errors are in the POSIX domain (Error::fromErrno) and carry the path concerned: EEXIST when the
// destination exists, ENOSPC / EDQUOT when the disk is full, the errno of the failed step otherwise.
//
// Threads: an AtomicFile is used from one thread at a time (any thread). moveWithoutReplacing() is
// stateless and callable from any thread.

#include "platform/error.h"

#include <QString>

#include <memory>

namespace zaf {

class AtomicFile {
public:
    // Reserves a fresh temporary file beside `destination` (step 1).
    static Result<std::unique_ptr<AtomicFile>> create(const QString &destination);
    // Discards the temporary file unless committed.
    ~AtomicFile();
    AtomicFile(const AtomicFile &) = delete;
    AtomicFile &operator=(const AtomicFile &) = delete;

    QString destination() const { return m_destination; }
    QString temporaryPath() const { return m_temporaryPath; }
    // A read-write descriptor of the temporary file, open until commit() or discard().
    int descriptor() const { return m_fd; }

    // Flushes the file, puts it at the destination without replacing anything and flushes the
    // directory (steps 3 to 5). On failure the temporary file is gone. Only the first call acts.
    OptionalError commit();
    // Closes and removes the temporary file. Nothing happens after commit() or a first discard().
    void discard();

private:
    AtomicFile(QString destination, QString temporaryPath, int fd);
    QString m_destination;
    QString m_temporaryPath;
    int m_fd = -1;
    bool m_done = false;
};

// Renames `from` to `to`, which must be on the same file system, never replacing an existing `to`
// (EEXIST), then flushes `to`'s directory. Works for files and directories. In order of preference:
//   - renameat2(RENAME_NOREPLACE): the kernel refuses atomically;
//   - where the file system lacks that flag (EINVAL, ENOSYS): link() then unlink(). A hard link
//     never replaces either, and there is no moment when the data has no name;
//   - where it has no hard links either (a directory, or file systems such as some FUSE ones):
//     lstat() then rename(). This last resort can replace an item created in the microseconds
//     between the two calls; no file system the application writes to by default needs it.
OptionalError moveWithoutReplacing(const QString &from, const QString &to);

} // namespace zaf
