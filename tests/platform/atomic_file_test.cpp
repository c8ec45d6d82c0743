// The atomic write: the destination holds either what was there before or the whole new file, never
// a replaced item, and nothing else is left in its directory, whatever fails and wherever.
#include "platform/files/atomic_file.h"
#include "tests/platform/file_faults.h"
#include "tests/support/named_cases.h"
#include "tests/support/temp_dir.h"

#include <QDir>
#include <QFile>
#include <QFileInfo>
#include <gtest/gtest.h>

#include <cerrno>
#include <functional>
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

// Every way an atomic write of "new" can end.
struct EndingCase {
    const char *name;
    Faults faults = {};
    std::function<void(const QString &destination)> before = {};    // before create()
    std::function<void(const QString &destination)> meanwhile = {}; // between writing and commit()
    int createError = 0;
    int commitError = 0;                   // -1: dropped without commit()
    QByteArray expected = {};              // at the destination afterwards; empty: nothing there
    const char *destination = "movie.mp4"; // inside the scratch directory; "" for the empty name
    const char *named = nullptr;           // what a create error names there; null: the destination
};

class AtomicFileEnding : public ::testing::TestWithParam<EndingCase> {};

TEST_P(AtomicFileEnding, LeavesTheWholeFileOrWhatWasThere)
{
    const EndingCase &c = GetParam();
    test::ScratchDir scratch;
    const QString destination = *c.destination ? scratch.file(c.destination) : QString();
    if (c.before)
        c.before(destination);
    const QStringList initially = entryNames(scratch.path());
    const FaultScope scope(c.faults);
    Result<std::unique_ptr<AtomicFile>> file = AtomicFile::create(destination);
    if (c.createError) {
        ASSERT_FALSE(file.ok());
        EXPECT_EQ(file.error->code, c.createError);
        EXPECT_TRUE(file.error->message.contains(c.named ? scratch.file(c.named) : destination)) << qPrintable(file.error->message);
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
    ::testing::Values(EndingCase{.name = "WrittenFlushedPutInPlace", .expected = "new"},
                      EndingCase{.name = "DestinationExists", .before = putOld, .createError = EEXIST, .expected = "old"},
                      EndingCase{.name = "DanglingLinkAtTheDestination", .before = danglingLink, .createError = EEXIST},
                      EndingCase{.name = "EmptyName", .createError = ENOENT, .destination = ""},
                      EndingCase{.name = "MissingDirectory", .createError = ENOENT, .destination = "none/movie.mp4", .named = "none"},
                      EndingCase{.name = "DestinationAppearsWhileWriting", .meanwhile = putOld, .commitError = EEXIST, .expected = "old"},
                      EndingCase{.name = "Abandoned", .commitError = -1},
                      EndingCase{.name = "FlushFails", .faults = {.fileSync = EIO}, .commitError = EIO},
                      EndingCase{.name = "DiskFullAtTheFlush", .faults = {.fileSync = ENOSPC}, .commitError = ENOSPC},
                      // The file is in place before its directory is flushed; that failure is only logged.
                      EndingCase{.name = "DirectoryFlushFails", .faults = {.directorySync = EIO}, .expected = "new"},
                      EndingCase{.name = "RenameFails", .faults = {.renameat2 = EIO}, .commitError = EIO},
                      EndingCase{.name = "NoRenameNoReplaceLinkedIntoPlace", .faults = {.renameat2 = EINVAL}, .expected = "new"},
                      EndingCase{.name = "NoRenameNoReplaceLinkRefuses", .faults = {.renameat2 = EINVAL}, .meanwhile = putOld,
                                 .commitError = EEXIST, .expected = "old"},
                      EndingCase{.name = "NoHardLinksCheckedRename", .faults = {.renameat2 = ENOSYS, .link = EPERM}, .expected = "new"},
                      EndingCase{.name = "NoHardLinksCheckRefuses", .faults = {.renameat2 = EINVAL, .link = EPERM}, .meanwhile = putOld,
                                 .commitError = EEXIST, .expected = "old"},
                      EndingCase{.name = "LinkFailsOtherwise", .faults = {.renameat2 = EINVAL, .link = EIO}, .commitError = EIO}),
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

} // namespace
} // namespace zaf
