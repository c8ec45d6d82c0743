#include "platform/dispatch.h"
#include "platform/files/file_manager.h"
#include "tempstore/process_directory.h"
#include "tempstore/temp_directory.h"
#include "tempstore/temp_store.h"
#include "tests/support/log_capture.h"
#include "tests/support/process_temp_directory.h"
#include "tests/support/temp_dir.h"

#include <QCoreApplication>
#include <QDir>
#include <QRegularExpression>
#include <QThread>
#include <QUrl>

#include <gtest/gtest.h>

#include <chrono>
#include <ctime>
#include <future>
#include <set>
#include <sys/stat.h>

namespace zaf::test {
namespace {

// A file manager whose removals fail for chosen names and whose volume reports a chosen free size;
// everything else is the real file system.
class ScriptedFileManager : public FileManager {
public:
    std::set<QString> failingRemovals;           // entry names whose removal fails with EBUSY
    std::optional<std::uint64_t> freeSize;       // when set, the volume reports it
    bool fileSystemUnreadable = false;

    OptionalError removeItemAtPath(const QString &path) const override
    {
        if (failingRemovals.count(path.section('/', -1)))
            return Error::fromErrno(EBUSY, path);
        return FileManager::removeItemAtPath(path);
    }
    Result<FileSystemAttributes> attributesOfFileSystemForPath(const QString &path) const override
    {
        if (fileSystemUnreadable)
            return Result<FileSystemAttributes>::failure(Error::fromErrno(EIO, path));
        if (freeSize)
            return Result<FileSystemAttributes>::success({*freeSize, *freeSize});
        return FileManager::attributesOfFileSystemForPath(path);
    }
};

// A store over a private directory with a fixed "now".
class TempStoreTest : public ::testing::Test {
protected:
    static constexpr qint64 kNow = 1700000000; // whole seconds since 1970

    TempStoreTest()
        : dir(scratch.path() + "/Zafrel/")
        , store(fileManager, dir, [] { return Date(std::chrono::seconds(kNow)); })
    {
        store._srSetupTempDirectory();
        logs.clear();
    }

    // A file of `bytes` bytes in the store's directory, modified `age` seconds before now.
    QString entry(const QString &name, qint64 bytes, qint64 age)
    {
        const QString path = scratch.write("Zafrel/" + name, bytes);
        EXPECT_TRUE(setModificationTime(path, kNow - age));
        return path;
    }
    bool exists(const QString &name) const { return QFile::exists(dir + name); }
    ZafTempStore absent() const { return ZafTempStore(fileManager, scratch.path() + "/absent/"); }

    ScratchDir scratch;
    ScriptedFileManager fileManager;
    QString dir;
    ZafTempStore store;
    LogCapture logs;
};

TEST_F(TempStoreTest, SetupCreatesThePrivateDirectoryOnce)
{
    struct stat st;
    ASSERT_EQ(::stat(QFile::encodeName(dir).constData(), &st), 0);
    EXPECT_TRUE(S_ISDIR(st.st_mode));
    EXPECT_EQ(st.st_mode & 0777, 0700u);
    entry("keep.mp4", 4, 0);
    store._srSetupTempDirectory();
    EXPECT_TRUE(exists("keep.mp4"));
    EXPECT_EQ(logs.messages("zaf.tempstore"), QStringList{"_srSetupTempDirectory"});
}

TEST_F(TempStoreTest, SetupLeavesAFileInTheWayAlone)
{
    const QString file = scratch.write("file", 3);
    ZafTempStore(fileManager, file + "/")._srSetupTempDirectory();
    EXPECT_EQ(QFileInfo(file).size(), 3);
    EXPECT_EQ(logs.entries().size(), 1) << "only the informational entry";
}

TEST_F(TempStoreTest, SetupReportsAMissingParentWithoutCreatingIt)
{
    ZafTempStore(fileManager, scratch.path() + "/no/parent/Zafrel/")._srSetupTempDirectory();
    EXPECT_FALSE(QFile::exists(scratch.file("no")));
    EXPECT_EQ(logs.messages("zaf.tempstore"), QStringList({"_srSetupTempDirectory", "error creating temp directory"}));
    const QStringList console = logs.messages("default");
    ASSERT_EQ(console.size(), 1);
    EXPECT_TRUE(console[0].startsWith(QString("error: Error Domain=posix Code=%1").arg(ENOENT)));
}

// What a process does at start creates the missing parents too, private to the user.
TEST_F(TempStoreTest, PrepareAtProcessStartCreatesTheMissingParents)
{
    ZafTempStore(fileManager, scratch.path() + "/cache/deep/Zafrel/").prepareAtProcessStart();
    EXPECT_TRUE(QFileInfo(scratch.file("cache/deep/Zafrel")).isDir());
    EXPECT_EQ(QFileInfo(scratch.file("cache")).permissions() & QFileDevice::ReadOther, 0);
}

// The directory is the process's own under the root, resolved once.
TEST(TempStoreNames, DirectoryIsTheProcessesOwnUnderTheRoot)
{
    usePrivateTempDirectoryForProcess();
    const QString &dir = ZafScreenRecorderTempDirectory();
    EXPECT_EQ(&dir, &ZafScreenRecorderTempDirectory());
    EXPECT_TRUE(dir.startsWith(tempstore::perUserTempRoot() + "session-") && dir.endsWith('/')) << dir.toStdString();
    EXPECT_TRUE(QFileInfo(dir).isDir());
    EXPECT_TRUE(tempstore::ProcessDirectory::isHeldByLivingProcess(dir));
    EXPECT_EQ(ZafTempStore::defaultStore()._srTempPath(), dir);
}

TEST(TempStoreNames, MovieNameIsStemSecondsAndExtension)
{
    const qint64 before = std::time(nullptr);
    const QString name = ZafTempMovieFileName("/tmp/Zafrel//ZafReplay_Final");
    const qint64 after = std::time(nullptr);
    const QRegularExpressionMatch m = QRegularExpression("^/tmp/Zafrel//ZafReplay_Final(\\d+)\\.mp4$").match(name);
    ASSERT_TRUE(m.hasMatch()) << name.toStdString();
    EXPECT_GE(m.captured(1).toLongLong(), before);
    EXPECT_LE(m.captured(1).toLongLong(), after);
    EXPECT_TRUE(ZafTempMovieFileName("a%1b_").startsWith("a%1b_"));
}

const QString kAgeHeader = "_srDeleteFilesOlderThanTimeToLiveInSeconds: %1";
const QString kAgeReport = "error in _zavRemoveFile_srDeleteFilesOlderThanTimeToLiveInSeconds, error code: %1";

TEST_F(TempStoreTest, AgeCleanupRemovesOnlyEntriesStrictlyOlderThanTheTimeToLive)
{
    entry("old.mp4", 1000, 101);
    entry("exact.mp4", 2000, 100);
    entry("young.mp4", 4000, 99);
    entry("future.mp4", 8000, -500);
    EXPECT_EQ(store._srDeleteFilesOlderThanTimeToLiveInSeconds(100.0), 1000);
    EXPECT_FALSE(exists("old.mp4"));
    for (const char *kept : {"exact.mp4", "young.mp4", "future.mp4"})
        EXPECT_TRUE(exists(kept)) << kept;
    EXPECT_EQ(logs.messages("zaf.tempstore"), QStringList({kAgeHeader.arg(100), "deleting old file"}));
}

TEST_F(TempStoreTest, DeleteAllEmptiesTheDirectoryFutureEntriesAndDirectoriesIncluded)
{
    entry("a.mp4", 300, 5);
    entry("future.mp4", 700, -3600);
    entry(".hidden", 11, 0);
    ASSERT_TRUE(QDir(dir).mkdir("sub"));
    entry("sub/inner.mp4", 5000, 1000);
    const qint64 subSize = QFileInfo(dir + "sub").size();
    EXPECT_EQ(store._srDeleteAllTempFiles(), 300 + 700 + 11 + subSize);
    EXPECT_EQ(entryNames(dir), QStringList());
    EXPECT_TRUE(QDir(dir).exists());
}

TEST_F(TempStoreTest, AgeCleanupGoesOnPastAFailedRemovalCountingOnlyTheRemoved)
{
    entry("a.mp4", 100, 50);
    entry("stuck.mp4", 200, 50);
    entry("c.mp4", 400, 50);
    fileManager.failingRemovals = {"stuck.mp4"};
    EXPECT_EQ(store._srDeleteFilesOlderThanTimeToLiveInSeconds(10.0), 500);
    EXPECT_TRUE(exists("stuck.mp4"));
    EXPECT_FALSE(exists("a.mp4") || exists("c.mp4"));
    EXPECT_EQ(logs.count(kAgeReport.arg(EBUSY)), 1);
    const QStringList console = logs.messages("default");
    ASSERT_EQ(console.size(), 1);
    EXPECT_TRUE(console[0].startsWith("error = Error Domain=posix Code=16")) << console[0].toStdString();
}

// Each run reports the missing directory once and logs its time to live truncated toward zero.
TEST_F(TempStoreTest, AgeCleanupOfAMissingDirectoryReportsEachRun)
{
    EXPECT_EQ(absent()._srDeleteFilesOlderThanTimeToLiveInSeconds(-7.9), 0);
    EXPECT_EQ(absent()._srDeleteFilesOlderThanTimeToLiveInSeconds(86399.99), 0);
    EXPECT_EQ(logs.messages("zaf.tempstore"),
              QStringList({kAgeHeader.arg(-7), kAgeReport.arg(ENOENT), kAgeHeader.arg(86399), kAgeReport.arg(ENOENT)}));
    EXPECT_EQ(logs.messages("default").size(), 2);
}

TEST_F(TempStoreTest, SizeOfTempDirIsTheDirectoryEntrysOwnSize)
{
    entry("big.mp4", 3 << 20, 0);
    OptionalError error;
    const std::int64_t size = store._srSizeOfTempDir(&error);
    EXPECT_FALSE(error.has_value());
    EXPECT_EQ(size, QFileInfo(dir).size());
    EXPECT_LT(size, 3 << 20);
}

TEST_F(TempStoreTest, SizeOfAMissingTempDirIsZeroWithTheError)
{
    OptionalError error;
    EXPECT_EQ(absent()._srSizeOfTempDir(&error), 0);
    EXPECT_EQ(error.value_or(Error{}).code, ENOENT);
}

TEST_F(TempStoreTest, FreeSpaceMustExceedTheRequiredSpaceStrictly)
{
    fileManager.freeSize = 100000000;
    EXPECT_EQ(store._srDeviceFreeDiskSpace(), 100000000u);
    EXPECT_FALSE(store._srDeviceHasSufficientFreeSpaceForRecording());
    fileManager.freeSize = 100000001;
    EXPECT_TRUE(store._srDeviceHasSufficientFreeSpaceForRecording());
    EXPECT_GT(ZafTempStore(FileManager::defaultManager(), dir)._srDeviceFreeDiskSpace(), 0u) << "a real volume reports its free space";
}

TEST_F(TempStoreTest, UnknownFreeSpaceReadsZero)
{
    fileManager.fileSystemUnreadable = true;
    EXPECT_EQ(store._srDeviceFreeDiskSpace(), 0u);
    EXPECT_FALSE(store._srDeviceHasSufficientFreeSpaceForRecording());

    ZafTempStore missing(FileManager::defaultManager(), scratch.path() + "/absent/");
    EXPECT_EQ(missing._srDeviceFreeDiskSpace(), 0u);
    EXPECT_FALSE(missing._srDeviceHasSufficientFreeSpaceForRecording());
}

struct CompletionResult {
    OptionalError error;
    bool onMainThread = true;
};

// Runs an operation with a completion and waits for the completion's result.
template <typename Op>
CompletionResult await(Op op)
{
    std::promise<CompletionResult> promise;
    op([&promise](const OptionalError &e) {
        promise.set_value({e, QThread::currentThread() == QCoreApplication::instance()->thread()});
    });
    auto future = promise.get_future();
    EXPECT_EQ(future.wait_for(std::chrono::seconds(10)), std::future_status::ready);
    return future.get();
}

QUrl url(const QString &path)
{
    return QUrl::fromLocalFile(path);
}

TEST_F(TempStoreTest, RemoveFileRemovesOffTheMainThread)
{
    const QString path = entry("gone.mp4", 10, 0);
    const CompletionResult r = await([&](auto done) { store._srRemoveFile(url(path), done); });
    EXPECT_FALSE(r.error.has_value());
    EXPECT_FALSE(r.onMainThread);
    EXPECT_FALSE(QFile::exists(path));
}

TEST_F(TempStoreTest, RemoveFileOfNothingThereSucceedsQuietly)
{
    const CompletionResult r = await([&](auto done) { store._srRemoveFile(url(dir + "gone.mp4"), done); });
    EXPECT_FALSE(r.error.has_value());
    EXPECT_TRUE(logs.entries().isEmpty());
}

TEST_F(TempStoreTest, RemoveFileReportsAndLogsAFailure)
{
    const QString stuck = entry("stuck.mp4", 10, 0);
    fileManager.failingRemovals = {"stuck.mp4"};
    const CompletionResult r = await([&](auto done) { store._srRemoveFile(url(stuck), done); });
    EXPECT_EQ(r.error.value_or(Error{}).code, EBUSY);
    EXPECT_EQ(logs.count(QString("_zavRemoveFile error: %1").arg(EBUSY)), 1);
    EXPECT_TRUE(QFile::exists(stuck));
}

TEST_F(TempStoreTest, RemoveFileWithoutACompletionStillRemoves)
{
    const QString quiet = entry("quiet.mp4", 10, 0);
    store._srRemoveFile(url(quiet));
    dispatch::waitForGlobalQueue(dispatch::Priority::Background);
    EXPECT_FALSE(QFile::exists(quiet));
}

TEST_F(TempStoreTest, MoveReplacesAnExistingDestination)
{
    const QString from = entry("from.mp4", 123, 0);
    const QString to = entry("to.mp4", 9, 0);
    const CompletionResult r = await([&](auto done) { store._srMoveFileFromURL(url(from), url(to), done); });
    EXPECT_FALSE(r.error.has_value());
    EXPECT_FALSE(r.onMainThread);
    EXPECT_FALSE(QFile::exists(from));
    EXPECT_EQ(QFileInfo(to).size(), 123);
}

// Without a source the move fails and the destination stays as it was.
TEST_F(TempStoreTest, MoveOfAMissingSourceLeavesTheDestinationAlone)
{
    const QString from = dir + "from.mp4";
    const QString to = entry("to.mp4", 123, 0);
    const CompletionResult r = await([&](auto done) { store._srMoveFileFromURL(url(from), url(to), done); });
    EXPECT_EQ(r.error.value_or(Error{}).code, ENOENT);
    EXPECT_EQ(QFileInfo(to).size(), 123);
    EXPECT_EQ(logs.count(QString("_zavMoveFileFromURL error: %1").arg(ENOENT)), 1);
}

// Names match ignoring case and diacritics; a matching directory goes whole.
TEST_F(TempStoreTest, PrefixCleanupRemovesWhatMatches)
{
    const QStringList matching = {"ZafReplay_Final1.mp4", "zafreplay_final2.mp4", "ZÀFRÉPLAY_FINAL3.mp4", "Zafreplay_Fiñal4.mp4"};
    for (const QString &name : matching)
        entry(name, 1, 0);
    entry("Other_ZafReplay_Final.mp4", 1, 0);
    entry("ZafReplay_Fina", 1, 0);
    ASSERT_TRUE(QDir(dir).mkpath("ZAFREPLAY_FINALdir/deeper"));
    entry("ZAFREPLAY_FINALdir/deeper/x.mp4", 1, 0);
    ASSERT_TRUE(QDir(dir).mkdir("keep"));
    entry("keep/ZafReplay_Final9.mp4", 1, 0);

    store._srDeleteFilesWithPrefix("zafreplay_final");
    dispatch::waitForGlobalQueue(dispatch::Priority::Default);
    for (const QString &name : matching + QStringList{"ZAFREPLAY_FINALdir"})
        EXPECT_FALSE(exists(name)) << name.toStdString();
    EXPECT_TRUE(exists("Other_ZafReplay_Final.mp4"));
    EXPECT_TRUE(exists("ZafReplay_Fina"));
    EXPECT_TRUE(exists("keep/ZafReplay_Final9.mp4")) << "the clean-up never descends";
}

TEST_F(TempStoreTest, PrefixCleanupLogsEachFailedRemovalAndGoesOn)
{
    for (const char *name : {"ZafReplay_YouTube1.mp4", "ZafReplay_YouTube2.mp4", "ZafReplay_YouTube3.mp4"})
        entry(name, 1, 0);
    fileManager.failingRemovals = {"ZafReplay_YouTube1.mp4", "ZafReplay_YouTube3.mp4"};
    store._srDeleteFilesWithPrefix("ZafReplay_YouTube");
    dispatch::waitForGlobalQueue(dispatch::Priority::Default);
    EXPECT_FALSE(exists("ZafReplay_YouTube2.mp4"));
    EXPECT_EQ(logs.messages("zaf.tempstore"), QStringList(2, QString("_zavDeleteFilesWithPrefix error: %1").arg(EBUSY)));
    EXPECT_EQ(logs.entries().size(), 2) << "nothing else, in any category";
}

TEST_F(TempStoreTest, PrefixCleanupOfAMissingDirectoryDoesNothing)
{
    absent()._srDeleteFilesWithPrefix("x");
    dispatch::waitForGlobalQueue(dispatch::Priority::Default);
    EXPECT_TRUE(logs.entries().isEmpty());
}

// Editors running side by side: each process claims a locked directory of its own under the root.
// flock belongs to an open file description, so two claims in one test process stand for two
// processes exactly as the kernel sees them.
class ProcessDirectoryTest : public ::testing::Test {
protected:
    QString root() const { return scratch.path() + "/Zafrel/"; }
    tempstore::ProcessDirectory claim() const { return tempstore::ProcessDirectory::claim(fileManager, root()); }

    ScratchDir scratch;
    FileManager fileManager;
};

TEST_F(ProcessDirectoryTest, EmptyingOneEditorsDirectoryLeavesTheOtherEditorsMovieAlone)
{
    const tempstore::ProcessDirectory a = claim();
    const tempstore::ProcessDirectory b = claim();
    ASSERT_TRUE(a.isClaimed() && b.isClaimed());
    ASSERT_NE(a.path(), b.path());
    EXPECT_EQ(QFileInfo(root()).permissions() & (QFileDevice::ReadOther | QFileDevice::ReadGroup), 0);
    EXPECT_EQ(QFileInfo(a.path()).permissions() & (QFileDevice::ReadOther | QFileDevice::ReadGroup), 0);

    const QString trimmedByA = scratch.write("Zafrel/" + a.path().section('/', -2, -2) + "/Recorder_1.mp4", 500);
    scratch.write("Zafrel/" + b.path().section('/', -2, -2) + "/Recorder_2.mp4", 700);
    const ZafTempStore storeOfB(fileManager, b.path(), {}, [&b] { b.sweepAbandonedSiblings(); });
    EXPECT_EQ(storeOfB._srDeleteAllTempFiles(), 700);
    EXPECT_TRUE(QFile::exists(trimmedByA)) << "B's emptying removed A's trimmed movie";
    EXPECT_EQ(claim().sweepAbandonedSiblings(), 0) << "a living editor's directory is never swept";
    EXPECT_TRUE(QFile::exists(trimmedByA));
}

TEST_F(ProcessDirectoryTest, WhatEndedProcessesLeftIsSweptAtClaimAndAtEmptying)
{
    std::optional<tempstore::ProcessDirectory> ended(claim());
    const QString endedPath = ended->path();
    scratch.write("Zafrel/" + endedPath.section('/', -2, -2) + "/Recorder_1.mp4", 10);
    ended.reset(); // as a process that exits normally
    EXPECT_FALSE(QFileInfo::exists(endedPath)) << "a process that ends normally removes its own directory";

    // A crashed process's directory: there, unlocked. Loose files from versions that wrote into the
    // root itself go once they are a day old.
    ASSERT_TRUE(QDir().mkpath(root() + "session-crashed/sub"));
    scratch.write("Zafrel/session-crashed/sub/Recorder_9.mp4", 10);
    const QString oldLoose = scratch.write("Zafrel/Recorder_1600000000.mp4", 10);
    ASSERT_TRUE(setModificationTime(oldLoose, std::time(nullptr) - 2 * 24 * 3600));
    const QString freshLoose = scratch.write("Zafrel/ZafReplay_Final1700000000.mp4", 10);

    const tempstore::ProcessDirectory living = claim();
    EXPECT_FALSE(QFileInfo::exists(root() + "session-crashed"));
    EXPECT_FALSE(QFileInfo::exists(oldLoose));
    EXPECT_TRUE(QFileInfo::exists(freshLoose));

    // A process killed while this one runs is swept by this one's next emptying.
    ASSERT_TRUE(QDir().mkpath(root() + "session-killed"));
    const ZafTempStore store(fileManager, living.path(), {}, [&living] { living.sweepAbandonedSiblings(); });
    store._srDeleteAllTempFiles();
    EXPECT_EQ(entryNames(root()), QStringList({"ZafReplay_Final1700000000.mp4", living.path().section('/', -2, -2)}));
}

TEST_F(ProcessDirectoryTest, ARootThatCannotBeMadeLeavesTheDirectoryUnclaimedWithALoggedError)
{
    LogCapture logs;
    scratch.write("file", 1);
    const tempstore::ProcessDirectory d = tempstore::ProcessDirectory::claim(fileManager, scratch.file("file/Zafrel"));
    EXPECT_FALSE(d.isClaimed());
    EXPECT_TRUE(d.path().startsWith(scratch.file("file/Zafrel/session-")) && d.path().endsWith('/'));
    EXPECT_EQ(logs.messages("zaf.tempstore").size(), 1);
}

} // namespace
} // namespace zaf::test
