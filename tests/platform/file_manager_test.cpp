// The file operations whose failure would lose data: moves and copies never overwrite, files are
// whole or absent, and failures carry the errno.
#include "platform/files/file_manager.h"
#include "tests/platform/file_faults.h"
#include "tests/support/named_cases.h"
#include "tests/support/temp_dir.h"

#include <QDir>
#include <gtest/gtest.h>

#include <cerrno>
#include <csignal>
#include <functional>
#include <sys/resource.h>

namespace zaf {
namespace {

using test::entryNames;
using test::Faults;
using test::FaultScope;
using test::fileContents;

ZAF_PRINT_CASES_AS_NAMES

const FileManager &fm()
{
    return FileManager::defaultManager();
}

// A refused operation reports its errno and leaves the directory as it was: "a" (300000 bytes),
// "b" (20 bytes) and the empty directory "out".
struct RefusalCase {
    const char *name;
    std::function<OptionalError(const test::ScratchDir &)> operation;
    int error;
};

class FileManagerRefusal : public ::testing::TestWithParam<RefusalCase> {};

TEST_P(FileManagerRefusal, ReportsTheErrnoAndChangesNothing)
{
    test::ScratchDir scratch;
    scratch.write("a", 300000);
    scratch.write("b", 20);
    ASSERT_TRUE(QDir(scratch.path()).mkdir("out"));
    const QStringList before = entryNames(scratch.path());
    EXPECT_EQ(GetParam().operation(scratch).value_or(Error{}).code, GetParam().error);
    EXPECT_EQ(entryNames(scratch.path()), before);
    EXPECT_EQ(fileContents(scratch.file("a")).size(), 300000);
    EXPECT_EQ(fileContents(scratch.file("b")).size(), 20);
    EXPECT_EQ(entryNames(scratch.file("out")), QStringList());
}

INSTANTIATE_TEST_SUITE_P(
    Cases, FileManagerRefusal,
    ::testing::Values(RefusalCase{"MoveOntoAFile", [](auto &s) { return fm().moveItemAtPath(s.file("a"), s.file("b")); }, EEXIST},
                      RefusalCase{"MoveOntoADirectory", [](auto &s) { return fm().moveItemAtPath(s.file("a"), s.file("out")); }, EEXIST},
                      RefusalCase{"CopyOntoAFile", [](auto &s) { return fm().copyItemAtPath(s.file("a"), s.file("b")); }, EEXIST},
                      RefusalCase{"CopyOfADirectory", [](auto &s) { return fm().copyItemAtPath(s.file("out"), s.file("d")); }, EINVAL},
                      RefusalCase{"CopyOfNothing", [](auto &s) { return fm().copyItemAtPath(s.file("none"), s.file("d")); }, ENOENT},
                      RefusalCase{"CloneOntoAFile", [](auto &s) { return fm().cloneItemAtPath(s.file("a"), s.file("b")); }, EEXIST},
                      RefusalCase{"CloneOfADirectory", [](auto &s) { return fm().cloneItemAtPath(s.file("out"), s.file("d")); }, EINVAL},
                      RefusalCase{"CloneOfNothing", [](auto &s) { return fm().cloneItemAtPath(s.file("none"), s.file("d")); }, ENOENT},
                      RefusalCase{"RemoveNothing", [](auto &s) { return fm().removeItemAtPath(s.file("none")); }, ENOENT},
                      RefusalCase{"ListNothing", [](auto &s) { return fm().contentsOfDirectoryAtPath(s.file("none")).error; }, ENOENT},
                      RefusalCase{"AttributesOfNothing", [](auto &s) { return fm().attributesOfItemAtPath(s.file("none")).error; }, ENOENT}),
    test::caseName);

TEST(FileManager, CreateDirectoryMakesTheMissingParents)
{
    test::ScratchDir scratch;
    ASSERT_FALSE(fm().createDirectoryAtPath(scratch.file("x/y/z"), true, 0700).has_value());
    EXPECT_TRUE(QDir(scratch.file("x/y/z")).exists());
    EXPECT_EQ(fm().contentsOfDirectoryAtPath(scratch.file("x")).value, QStringList{"y"});
}

TEST(FileManager, AttributesOfAFile)
{
    test::ScratchDir scratch;
    const Result<FileAttributes> attrs = fm().attributesOfItemAtPath(scratch.write("f", 5));
    ASSERT_TRUE(attrs.ok());
    EXPECT_EQ(attrs.value->size, 5);
    EXPECT_FALSE(attrs.value->isDirectory);
}

// A clone holds the same bytes, and removing it leaves the source as it was.
TEST(FileManager, CloneHoldsTheBytesAndItsRemovalLeavesTheSource)
{
    test::ScratchDir scratch;
    const QString source = scratch.write("movie.mp4", 300000);
    const QByteArray before = fileContents(source);
    FileManager::CloneKind kind = FileManager::CloneKind::Copy;
    ASSERT_FALSE(fm().cloneItemAtPath(source, scratch.file("clone.mp4"), &kind).has_value());
    EXPECT_EQ(fileContents(scratch.file("clone.mp4")), before);
    ASSERT_FALSE(fm().removeItemAtPath(scratch.file("clone.mp4")).has_value());
    EXPECT_EQ(fileContents(source), before);
    EXPECT_EQ(entryNames(scratch.path()), QStringList{QStringLiteral("movie.mp4")}) << "no temporary is left";
}

TEST(FileManager, RemoveTakesADirectoryWithItsContents)
{
    test::ScratchDir scratch;
    ASSERT_TRUE(QDir(scratch.path()).mkpath("x/y"));
    scratch.write("x/y/f", 5);
    EXPECT_FALSE(fm().removeItemAtPath(scratch.file("x")).has_value());
    EXPECT_FALSE(fm().fileExistsAtPath(scratch.file("x")));
}

// Copies, and moves across file systems, go through the atomic write: the whole file arrives (a move
// then removes the source), and a write that fails half-way (the disk fills up, the file size limit) or a failed flush
// leaves the destination absent and the source in place. A move between two directories of one file
// system is taken for one across two when its first rename fails with EXDEV.
struct AcrossCase {
    const char *name;
    bool move;
    Faults faults;
    rlim_t fileSizeLimit; // RLIMIT_FSIZE while it runs; 0: none
    int error;
};

class FileManagerAcrossFileSystems : public ::testing::TestWithParam<AcrossCase> {};

TEST_P(FileManagerAcrossFileSystems, WritesTheWholeFileOrLeavesOnlyTheSource)
{
    const AcrossCase &c = GetParam();
    test::ScratchDir scratch;
    const QString source = scratch.write("source", 300000);
    Faults faults = c.faults;
    if (c.move) {
        faults.renameat2 = EXDEV;
        faults.renameOnce = true;
    }
    // With SIGXFSZ ignored, a write past RLIMIT_FSIZE fails with EFBIG.
    const auto oldHandler = std::signal(SIGXFSZ, SIG_IGN);
    struct rlimit old;
    ASSERT_EQ(::getrlimit(RLIMIT_FSIZE, &old), 0);
    struct rlimit limited = old;
    if (c.fileSizeLimit)
        limited.rlim_cur = c.fileSizeLimit;
    ASSERT_EQ(::setrlimit(RLIMIT_FSIZE, &limited), 0);
    OptionalError failure;
    {
        const FaultScope scope(faults);
        failure = c.move ? fm().moveItemAtPath(source, scratch.file("to")) : fm().copyItemAtPath(source, scratch.file("to"));
    }
    ::setrlimit(RLIMIT_FSIZE, &old);
    std::signal(SIGXFSZ, oldHandler);
    EXPECT_EQ(failure.value_or(Error{}).code, c.error);
    EXPECT_EQ(entryNames(scratch.path()), c.error ? QStringList{"source"} : c.move ? QStringList{"to"} : QStringList({"source", "to"}));
    EXPECT_EQ(fileContents(scratch.file(c.error ? "source" : "to")), QByteArray(300000, 'z'));
}

INSTANTIATE_TEST_SUITE_P(Cases, FileManagerAcrossFileSystems,
                         ::testing::Values(AcrossCase{"Copy", false, {}, 0, 0}, AcrossCase{"Move", true, {}, 0, 0},
                                           AcrossCase{"CopyFlushFails", false, {.fileSync = EIO}, 0, EIO},
                                           AcrossCase{"MoveFlushFails", true, {.fileSync = EIO}, 0, EIO},
                                           AcrossCase{"CopyFillsTheDisk", false, {.spaceLeft = 100000}, 0, ENOSPC},
                                           AcrossCase{"MoveFillsTheDisk", true, {.spaceLeft = 100000}, 0, ENOSPC},
                                           AcrossCase{"CopyPastTheFileSizeLimit", false, {}, 100000, EFBIG},
                                           AcrossCase{"MovePastTheFileSizeLimit", true, {}, 100000, EFBIG}),
                         test::caseName);

} // namespace
} // namespace zaf
