// The atomic write: the destination holds either what was there before or the whole new file, never
// a replaced item, and nothing else is left in its directory, whatever fails and wherever.
#include "platform/files/atomic_file.h"
#include "tests/platform/file_faults.h"
#include "tests/support/log_capture.h"
#include "tests/support/named_cases.h"
#include "tests/support/private_mounts.h"
#include "tests/support/temp_dir.h"

#include <QDir>
#include <QFile>
#include <QFileInfo>
#include <gtest/gtest.h>

#include <cerrno>
#include <functional>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

namespace zaf {
namespace {

using test::entryNames;
using test::Faults;
using test::FaultScope;
using test::fileContents;

ZAF_PRINT_CASES_AS_NAMES

void putOld(const QString &destination)
{
    QFile f(destination);
    ASSERT_TRUE(f.open(QIODevice::WriteOnly));
    f.write("old");
}

void danglingLink(const QString &destination)
{
    ASSERT_TRUE(QFile::link(QStringLiteral("nowhere"), destination));
}

// Every way an atomic write of "new" to "movie.mp4" can end.
struct EndingCase {
    const char *name;
    Faults faults;
    std::function<void(const QString &destination)> before;    // before create()
    std::function<void(const QString &destination)> meanwhile; // between writing and commit()
    int createError;
    int commitError;     // -1: dropped without commit()
    QByteArray expected; // at the destination afterwards; empty: nothing there
};

class AtomicFileEnding : public ::testing::TestWithParam<EndingCase> {};

TEST_P(AtomicFileEnding, LeavesTheWholeFileOrWhatWasThere)
{
    const EndingCase &c = GetParam();
    test::ScratchDir scratch;
    const QString destination = scratch.file(QStringLiteral("movie.mp4"));
    if (c.before)
        c.before(destination);
    const QStringList initially = entryNames(scratch.path());
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
    EXPECT_EQ(fileContents(destination), c.expected);
    const bool placed = !c.createError && c.commitError == 0;
    EXPECT_EQ(entryNames(scratch.path()), placed || c.meanwhile ? QStringList{"movie.mp4"} : initially) << "nothing else left";
}

INSTANTIATE_TEST_SUITE_P(
    Cases, AtomicFileEnding,
    ::testing::Values(EndingCase{"WrittenFlushedPutInPlace", {}, {}, {}, 0, 0, "new"},
                      EndingCase{"DestinationExists", {}, putOld, {}, EEXIST, 0, "old"},
                      EndingCase{"DanglingLinkAtTheDestination", {}, danglingLink, {}, EEXIST, 0, {}},
                      EndingCase{"DestinationAppearsWhileWriting", {}, {}, putOld, 0, EEXIST, "old"},
                      EndingCase{"Abandoned", {}, {}, {}, 0, -1, {}},
                      EndingCase{"FlushFails", {.fileSync = EIO}, {}, {}, 0, EIO, {}},
                      EndingCase{"DiskFullAtTheFlush", {.fileSync = ENOSPC}, {}, {}, 0, ENOSPC, {}},
                      EndingCase{"RenameFails", {.renameat2 = EIO}, {}, {}, 0, EIO, {}},
                      EndingCase{"NoRenameNoReplaceLinkedIntoPlace", {.renameat2 = EINVAL}, {}, {}, 0, 0, "new"},
                      EndingCase{"NoRenameNoReplaceLinkRefuses", {.renameat2 = EINVAL}, {}, putOld, 0, EEXIST, "old"},
                      EndingCase{"NoHardLinksCheckedRename", {.renameat2 = ENOSYS, .link = EPERM}, {}, {}, 0, 0, "new"},
                      EndingCase{"NoHardLinksCheckRefuses", {.renameat2 = EINVAL, .link = EPERM}, {}, putOld, 0, EEXIST, "old"},
                      EndingCase{"LinkFailsOtherwise", {.renameat2 = EINVAL, .link = EIO}, {}, {}, 0, EIO, {}}),
    test::caseName);

// The finished file gets the permissions any new file of the user gets: 0666 less the umask.
class AtomicFilePermissions : public ::testing::TestWithParam<mode_t> {};

TEST_P(AtomicFilePermissions, FollowTheUmask)
{
    test::ScratchDir scratch;
    const mode_t old = ::umask(GetParam());
    Result<std::unique_ptr<AtomicFile>> file = AtomicFile::create(scratch.file("movie.mp4"));
    const OptionalError committed = file.ok() ? (*file.value)->commit() : file.error;
    ::umask(old);
    ASSERT_FALSE(committed.has_value()) << qPrintable(committed->message);
    struct stat st;
    ASSERT_EQ(::stat(QFile::encodeName(scratch.file("movie.mp4")).constData(), &st), 0);
    EXPECT_EQ(st.st_mode & 0777, 0666 & ~GetParam());
}

INSTANTIATE_TEST_SUITE_P(Umasks, AtomicFilePermissions, ::testing::Values(mode_t(022), mode_t(077), mode_t(002)),
                         [](const auto &info) { return "Umask0" + std::to_string(info.param >> 3 & 7) + std::to_string(info.param & 7); });

// After the first end of the write, commit() and discard() change nothing.
struct SecondEndCase {
    const char *name;
    bool commitFirst;
    bool commitSecond;
    QByteArray expected; // at the destination afterwards
};

class AtomicFileSecondEnd : public ::testing::TestWithParam<SecondEndCase> {};

TEST_P(AtomicFileSecondEnd, ChangesNothing)
{
    test::ScratchDir scratch;
    const QString destination = scratch.file("movie.mp4");
    Result<std::unique_ptr<AtomicFile>> file = AtomicFile::create(destination);
    ASSERT_TRUE(file.ok());
    AtomicFile &f = **file.value;
    ASSERT_EQ(::write(f.descriptor(), "new", 3), 3);
    const auto end = [&](bool commit) { return commit ? f.commit() : (f.discard(), OptionalError()); };
    ASSERT_FALSE(end(GetParam().commitFirst).has_value());
    EXPECT_FALSE(end(GetParam().commitSecond).has_value());
    file.value->reset();
    EXPECT_EQ(fileContents(destination), GetParam().expected);
    EXPECT_EQ(entryNames(scratch.path()), GetParam().expected.isEmpty() ? QStringList() : QStringList{"movie.mp4"});
}

INSTANTIATE_TEST_SUITE_P(Cases, AtomicFileSecondEnd,
                         ::testing::Values(SecondEndCase{"CommitThenCommit", true, true, "new"},
                                           SecondEndCase{"CommitThenDiscard", true, false, "new"},
                                           SecondEndCase{"DiscardThenCommit", false, true, {}},
                                           SecondEndCase{"DiscardThenDiscard", false, false, {}}),
                         test::caseName);

// The temporary's name stays within NAME_MAX however long the destination's is.
TEST(AtomicFile, LongDestinationNameKeepsTheTemporaryWithinNameMax)
{
    test::ScratchDir scratch;
    const QString name = QString(250, QLatin1Char('n'));
    Result<std::unique_ptr<AtomicFile>> file = AtomicFile::create(scratch.file(name));
    ASSERT_TRUE(file.ok()) << qPrintable(file.error->message);
    EXPECT_LE(QFile::encodeName(QFileInfo((*file.value)->temporaryPath()).fileName()).size(), NAME_MAX);
    EXPECT_FALSE((*file.value)->commit().has_value());
    EXPECT_EQ(entryNames(scratch.path()), QStringList{name});
}

// The file is in place when the flush of its directory fails; the failure is only logged.
TEST(AtomicFile, DirectoryFlushFailureIsOnlyLogged)
{
    test::ScratchDir scratch;
    Result<std::unique_ptr<AtomicFile>> file = AtomicFile::create(scratch.file("movie.mp4"));
    ASSERT_TRUE(file.ok());
    test::LogCapture logs;
    const FaultScope scope({.directorySync = EIO});
    EXPECT_FALSE((*file.value)->commit().has_value());
    EXPECT_EQ(entryNames(scratch.path()), QStringList{"movie.mp4"});
    EXPECT_TRUE(logs.messages("zaf.files").join('\n').contains("cannot flush the directory " + scratch.path()));
}

// Where a destination cannot be reserved, the error names it or its directory.
struct CreateErrorCase {
    const char *name;
    const char *destination; // inside the scratch directory; "" for the empty name
    int error;
    const char *named; // what the message names, inside the scratch directory; null: nothing to name
};

class AtomicFileCreateError : public ::testing::TestWithParam<CreateErrorCase> {};

TEST_P(AtomicFileCreateError, NamesThePath)
{
    test::ScratchDir scratch;
    const QString destination = *GetParam().destination ? scratch.file(GetParam().destination) : QString();
    const Result<std::unique_ptr<AtomicFile>> file = AtomicFile::create(destination);
    ASSERT_FALSE(file.ok());
    EXPECT_EQ(file.error->code, GetParam().error);
    if (GetParam().named) {
        EXPECT_TRUE(file.error->message.contains(scratch.file(GetParam().named))) << qPrintable(file.error->message);
    }
    EXPECT_EQ(entryNames(scratch.path()), QStringList());
}

INSTANTIATE_TEST_SUITE_P(Cases, AtomicFileCreateError,
                         ::testing::Values(CreateErrorCase{"EmptyName", "", ENOENT, nullptr},
                                           CreateErrorCase{"MissingDirectory", "none/movie.mp4", ENOENT, "none"}),
                         test::caseName);

// moveWithoutReplacing() for files and directories, with each step of its chain.
struct MoveCase {
    const char *name;
    bool directory; // the item moved is a directory, else a file
    Faults faults;
    bool toExists; // an item is at the destination already
    int error;
};

class MoveWithoutReplacing : public ::testing::TestWithParam<MoveCase> {};

TEST_P(MoveWithoutReplacing, MovesOrLeavesBothInPlace)
{
    const MoveCase &c = GetParam();
    test::ScratchDir scratch;
    const QString from = c.directory ? scratch.file("from") : scratch.write("from", 10);
    if (c.directory) {
        ASSERT_TRUE(QDir().mkpath(from + "/inside"));
    }
    if (c.toExists)
        scratch.write("to", 3);
    const FaultScope scope(c.faults);
    const OptionalError moved = moveWithoutReplacing(from, scratch.file("to"));
    EXPECT_EQ(moved.value_or(Error{}).code, c.error);
    if (c.error) {
        EXPECT_TRUE(moved->message.contains(scratch.file(c.error == EEXIST ? "to" : "from"))) << qPrintable(moved->message);
        EXPECT_EQ(entryNames(scratch.path()), c.toExists ? QStringList({"from", "to"}) : QStringList{"from"});
    } else {
        EXPECT_EQ(entryNames(scratch.path()), QStringList{"to"});
        if (c.directory) {
            EXPECT_EQ(entryNames(scratch.file("to")), QStringList{"inside"});
        }
    }
}

INSTANTIATE_TEST_SUITE_P(Cases, MoveWithoutReplacing,
                         ::testing::Values(MoveCase{"File", false, {}, false, 0},
                                           MoveCase{"FileOntoAFile", false, {}, true, EEXIST},
                                           MoveCase{"Directory", true, {}, false, 0},
                                           MoveCase{"DirectoryOntoAFile", true, {}, true, EEXIST},
                                           MoveCase{"DirectoryWithoutRenameNoReplace", true, {.renameat2 = EINVAL}, false, 0},
                                           MoveCase{"DirectoryWithoutRenameNoReplaceOntoAFile", true, {.renameat2 = EINVAL}, true, EEXIST},
                                           MoveCase{"RenameFails", false, {.renameat2 = EIO}, false, EIO}),
                         test::caseName);

// On a file system of its own that fails the write: a full one, where the caller's write stops with
// ENOSPC, and a read-only one, where nothing can be reserved. The other file there stays as it was,
// and no temporary is left.
struct VolumeCase {
    const char *name;
    bool readOnly;
    int createError; // 0: the write runs into the full disk instead
};

class AtomicFileOnItsOwnVolume : public ::testing::TestWithParam<VolumeCase> {};

TEST_P(AtomicFileOnItsOwnVolume, FailsKeepingTheOtherFile)
{
    if (!test::insidePrivateMounts())
        return test::runThisTestInPrivateMounts();
    test::ScratchDir scratch;
    const QString volumePath = scratch.file("volume");
    ASSERT_TRUE(QDir().mkpath(volumePath));
    const test::ScopedTmpfs volume(volumePath, 256 * 1024);
    if (!volume.mounted())
        return;
    const QString other = volumePath + "/old.mp4";
    {
        QFile f(other);
        ASSERT_TRUE(f.open(QIODevice::WriteOnly));
        ASSERT_EQ(f.write(QByteArray(64 * 1024, 'o')), 64 * 1024);
    }
    if (GetParam().readOnly) {
        ASSERT_EQ(::mount(nullptr, QFile::encodeName(volumePath).constData(), nullptr, MS_REMOUNT | MS_RDONLY, nullptr), 0);
    }

    Result<std::unique_ptr<AtomicFile>> file = AtomicFile::create(volumePath + "/new.mp4");
    if (GetParam().createError) {
        ASSERT_FALSE(file.ok());
        EXPECT_EQ(file.error->code, GetParam().createError);
        EXPECT_TRUE(file.error->message.contains(volumePath)) << qPrintable(file.error->message);
    } else {
        ASSERT_TRUE(file.ok()) << qPrintable(file.error->message);
        const QByteArray chunk(64 * 1024, 'n');
        ssize_t written = 0;
        for (int i = 0; i < 16 && written >= 0; ++i)
            written = ::write((*file.value)->descriptor(), chunk.constData(), size_t(chunk.size()));
        EXPECT_EQ(written, -1);
        EXPECT_EQ(errno, ENOSPC);
        file.value->reset();
    }
    EXPECT_EQ(entryNames(volumePath), QStringList{"old.mp4"});
    EXPECT_EQ(fileContents(other), QByteArray(64 * 1024, 'o'));
}

INSTANTIATE_TEST_SUITE_P(Cases, AtomicFileOnItsOwnVolume,
                         ::testing::Values(VolumeCase{"FullDisk", false, 0}, VolumeCase{"ReadOnly", true, EROFS}), test::caseName);

} // namespace
} // namespace zaf
