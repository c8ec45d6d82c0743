// The file operations whose failure would lose data: the atomic write, moves and copies never
// overwrite, files are whole or absent, and failures carry the errno.
#include "platform/files/atomic_file.h"
#include "platform/files/file_manager.h"
#include "tests/support/log_capture.h"
#include "tests/support/temp_dir.h"

#include <QDir>
#include <QFile>
#include <QFileInfo>
#include <gtest/gtest.h>

#include <cerrno>
#include <csignal>
#include <cstdio>
#include <string>
#include <string_view>
#include <algorithm>
#include <fcntl.h>
#include <functional>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace {

// Faults injected into the system calls of the atomic write. The definitions below take the place
// of the C library's in this test program; with no fault set they make the real system call.
struct Faults {
    int fileSync = 0;        // errno of fsync() on a file
    int directorySync = 0;   // errno of fsync() on a directory
    int renameat2 = 0;       // errno of renameat2()
    bool renameOnce = false; // only the first renameat2() fails
    int link = 0;            // errno of link()
    long spaceLeft = -1;     // bytes that writes into a ".partial-" temporary may still add before
                             // the disk is full (ENOSPC); -1: no limit
};
Faults faults;

int fail(int errnum)
{
    errno = errnum;
    return -1;
}

} // namespace

extern "C" int fsync(int fd)
{
    struct stat st;
    const bool directory = ::fstat(fd, &st) == 0 && S_ISDIR(st.st_mode);
    if (const int err = directory ? faults.directorySync : faults.fileSync)
        return fail(err);
    return int(::syscall(SYS_fsync, fd));
}

extern "C" int renameat2(int fromDir, const char *from, int toDir, const char *to, unsigned int flags) __THROW
{
    if (const int err = faults.renameat2) {
        if (faults.renameOnce)
            faults.renameat2 = 0;
        return fail(err);
    }
    return int(::syscall(SYS_renameat2, fromDir, from, toDir, to, flags));
}

// Whether a descriptor is open on an atomic write's temporary file.
static bool writesATemporary(int fd)
{
    char target[4096];
    const std::string link = "/proc/self/fd/" + std::to_string(fd);
    const ssize_t n = ::readlink(link.c_str(), target, sizeof target - 1);
    return n > 0 && std::string_view(target, size_t(n)).find(".partial-") != std::string_view::npos;
}

extern "C" ssize_t write(int fd, const void *buffer, size_t size)
{
    if (faults.spaceLeft >= 0 && writesATemporary(fd)) {
        if (faults.spaceLeft == 0)
            return fail(ENOSPC);
        size = std::min(size, size_t(faults.spaceLeft));
        faults.spaceLeft -= long(size);
    }
    return ::syscall(SYS_write, fd, buffer, size);
}

extern "C" int link(const char *from, const char *to) __THROW
{
    return faults.link ? fail(faults.link) : int(::syscall(SYS_linkat, AT_FDCWD, from, AT_FDCWD, to, 0));
}

namespace zaf {
namespace {

// Clears the injected faults when a test ends, whatever happens in it.
struct FaultScope {
    explicit FaultScope(Faults f) { faults = f; }
    ~FaultScope() { faults = {}; }
};

QStringList entries(const QString &dir)
{
    return QDir(dir).entryList(QDir::AllEntries | QDir::Hidden | QDir::System | QDir::NoDotAndDotDot);
}

QByteArray contents(const QString &path)
{
    QFile f(path);
    return f.open(QIODevice::ReadOnly) ? f.readAll() : QByteArray();
}

TEST(FileManager, MoveAndCopyNeverOverwriteAndCopyWritesTheWholeFileOrNothing)
{
    test::ScratchDir scratch;
    const FileManager &fm = FileManager::defaultManager();
    const QString a = scratch.write("a", 300000);
    const QString b = scratch.write("b", 20);
    EXPECT_EQ(fm.moveItemAtPath(a, b).value_or(Error{}).code, EEXIST);
    EXPECT_EQ(fm.copyItemAtPath(a, b).value_or(Error{}).code, EEXIST);
    EXPECT_EQ(contents(b).size(), 20);
    EXPECT_EQ(contents(a).size(), 300000);

    ASSERT_TRUE(QDir(scratch.path()).mkdir("out"));
    EXPECT_FALSE(fm.copyItemAtPath(a, scratch.file("out/c")).has_value());
    EXPECT_EQ(contents(scratch.file("out/c")), contents(a));
    EXPECT_EQ(QDir(scratch.file("out")).entryList(QDir::AllEntries | QDir::Hidden | QDir::NoDotAndDotDot), QStringList{"c"})
        << "no temporaries left behind";
    // A directory or a missing file is not copied, and nothing is left behind.
    EXPECT_EQ(fm.copyItemAtPath(scratch.file("out"), scratch.file("d")).value_or(Error{}).code, EINVAL);
    EXPECT_EQ(fm.copyItemAtPath(scratch.file("none"), scratch.file("d")).value_or(Error{}).code, ENOENT);
    EXPECT_FALSE(QFile::exists(scratch.file("d")));
}

TEST(FileManager, RemoveListAndAttributesReportErrors)
{
    test::ScratchDir scratch;
    const FileManager &fm = FileManager::defaultManager();
    const QString none = scratch.file("none");
    EXPECT_EQ(fm.removeItemAtPath(none).value_or(Error{}).code, ENOENT);
    EXPECT_EQ(fm.contentsOfDirectoryAtPath(none).error.value_or(Error{}).code, ENOENT);
    EXPECT_EQ(fm.attributesOfItemAtPath(none).error.value_or(Error{}).code, ENOENT);

    ASSERT_FALSE(fm.createDirectoryAtPath(scratch.file("x/y/z"), true, 0700).has_value());
    scratch.write("x/y/z/f", 5);
    const Result<FileAttributes> attrs = fm.attributesOfItemAtPath(scratch.file("x/y/z/f"));
    ASSERT_TRUE(attrs.ok());
    EXPECT_EQ(attrs.value->size, 5);
    EXPECT_FALSE(attrs.value->isDirectory);
    EXPECT_EQ(fm.contentsOfDirectoryAtPath(scratch.file("x")).value, QStringList{"y"});
    EXPECT_FALSE(fm.removeItemAtPath(scratch.file("x")).has_value());
    EXPECT_FALSE(fm.fileExistsAtPath(scratch.file("x")));
}

// Every way the atomic write can end: the destination holds either what was there before or the
// whole new file, and nothing else is left in the directory.
TEST(AtomicFile, EndsWithTheWholeFileOrNothingAndNeverReplaces)
{
    struct Case {
        const char *name;
        Faults faults;
        std::function<void(const QString &destination)> before;   // before create()
        std::function<void(const QString &destination)> meanwhile; // between writing and commit()
        int createError;
        int commitError;    // -1: dropped without commit()
        QByteArray expected; // at the destination afterwards; empty: nothing there
    };
    const auto putOld = [](const QString &destination) {
        QFile f(destination);
        ASSERT_TRUE(f.open(QIODevice::WriteOnly));
        f.write("old");
    };
    const auto danglingLink = [](const QString &destination) {
        ASSERT_TRUE(QFile::link(QStringLiteral("nowhere"), destination));
    };
    const QList<Case> cases{
        {"written, flushed, put in place", {}, {}, {}, 0, 0, "new"},
        {"destination exists", {}, putOld, {}, EEXIST, 0, "old"},
        {"dangling link at the destination", {}, danglingLink, {}, EEXIST, 0, {}},
        {"destination appears while writing", {}, {}, putOld, 0, EEXIST, "old"},
        {"abandoned", {}, {}, {}, 0, -1, {}},
        {"flush fails", {.fileSync = EIO}, {}, {}, 0, EIO, {}},
        {"disk full at the flush", {.fileSync = ENOSPC}, {}, {}, 0, ENOSPC, {}},
        {"rename fails", {.renameat2 = EIO}, {}, {}, 0, EIO, {}},
        {"directory flush fails: only logged", {.directorySync = EIO}, {}, {}, 0, 0, "new"},
        {"no RENAME_NOREPLACE: linked into place", {.renameat2 = EINVAL}, {}, {}, 0, 0, "new"},
        {"no RENAME_NOREPLACE: link refuses", {.renameat2 = EINVAL}, {}, putOld, 0, EEXIST, "old"},
        {"no hard links: checked rename", {.renameat2 = ENOSYS, .link = EPERM}, {}, {}, 0, 0, "new"},
        {"no hard links: check refuses", {.renameat2 = EINVAL, .link = EPERM}, {}, putOld, 0, EEXIST, "old"},
        {"link fails otherwise", {.renameat2 = EINVAL, .link = EIO}, {}, {}, 0, EIO, {}},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        test::ScratchDir scratch;
        const QString destination = scratch.file(QStringLiteral("movie.mp4"));
        if (c.before)
            c.before(destination);
        const QStringList initially = entries(scratch.path());
        const FaultScope scope(c.faults);
        Result<std::unique_ptr<AtomicFile>> file = AtomicFile::create(destination);
        if (c.createError) {
            ASSERT_FALSE(file.ok());
            EXPECT_EQ(file.error->code, c.createError);
            EXPECT_TRUE(file.error->message.contains(destination)) << qPrintable(file.error->message);
        } else {
            ASSERT_TRUE(file.ok()) << qPrintable(file.error->message);
            AtomicFile &f = **file.value;
            EXPECT_TRUE(QFileInfo(f.temporaryPath()).fileName().startsWith(QStringLiteral(".movie.mp4.partial-")));
            ASSERT_EQ(::write(f.descriptor(), "new", 3), 3);
            if (c.meanwhile)
                c.meanwhile(destination);
            if (c.commitError < 0)
                file.value->reset();
            else
                EXPECT_EQ(f.commit().value_or(Error{}).code, c.commitError);
        }
        EXPECT_EQ(contents(destination), c.expected);
        const bool placed = !c.createError && c.commitError == 0;
        EXPECT_EQ(entries(scratch.path()), placed || c.meanwhile ? QStringList{"movie.mp4"} : initially) << "nothing else left";
        if (placed) {
            EXPECT_EQ(QFileInfo(destination).permissions(), QFileInfo(scratch.write("plain", 1)).permissions())
                << "a new file's usual permissions";
        }
    }
}

// Copies and moves across file systems go through the atomic write: a write that fails half-way
// (the disk fills up, the file size limit) or a failed flush leaves the destination absent and the
// source in place.
TEST(FileManager, CopyAndMoveAcrossFileSystemsLeaveNothingWhenWritingFails)
{
    test::ScratchDir scratch;
    const FileManager &fm = FileManager::defaultManager();
    const QString source = scratch.write("source", 300000);
    const QString to = scratch.file("to");

    // Moves between two directories of one file system, taken for two file systems.
    const auto moveAcross = [&](Faults f) {
        f.renameat2 = EXDEV;
        f.renameOnce = true;
        const FaultScope scope(f);
        return fm.moveItemAtPath(source, to);
    };
    {
        const FaultScope scope({.fileSync = EIO});
        EXPECT_EQ(fm.copyItemAtPath(source, to).value_or(Error{}).code, EIO);
    }
    EXPECT_EQ(moveAcross({.fileSync = EIO}).value_or(Error{}).code, EIO);
    {
        const FaultScope scope({.spaceLeft = 100000});
        EXPECT_EQ(fm.copyItemAtPath(source, to).value_or(Error{}).code, ENOSPC);
    }
    EXPECT_EQ(moveAcross({.spaceLeft = 100000}).value_or(Error{}).code, ENOSPC);
    {
        // With SIGXFSZ ignored, a write past RLIMIT_FSIZE fails with EFBIG.
        const auto oldHandler = std::signal(SIGXFSZ, SIG_IGN);
        struct rlimit old;
        ASSERT_EQ(::getrlimit(RLIMIT_FSIZE, &old), 0);
        struct rlimit limited = old;
        limited.rlim_cur = 100000;
        ASSERT_EQ(::setrlimit(RLIMIT_FSIZE, &limited), 0);
        const OptionalError copied = fm.copyItemAtPath(source, to);
        ::setrlimit(RLIMIT_FSIZE, &old);
        std::signal(SIGXFSZ, oldHandler);
        EXPECT_EQ(copied.value_or(Error{}).code, EFBIG);
    }
    EXPECT_EQ(entries(scratch.path()), QStringList{"source"});
    EXPECT_EQ(contents(source).size(), 300000);

    EXPECT_FALSE(moveAcross({}).has_value());
    EXPECT_EQ(entries(scratch.path()), QStringList{"to"});
    EXPECT_EQ(contents(to).size(), 300000);
}

} // namespace
} // namespace zaf
