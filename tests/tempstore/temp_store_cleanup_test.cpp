// The synchronous clean-ups: by age, in full, and their error reports.
#include "tests/tempstore/temp_store_fixture.h"

#include <QDir>

namespace zaf::test {
namespace {

const QString kAgeReport = QStringLiteral("error in _zavRemoveFile_srDeleteFilesOlderThanTimeToLiveInSeconds, error code: %1");

TEST_F(TempStoreTest, AgeCleanupRemovesOnlyEntriesStrictlyOlderThanTheTimeToLive)
{
    entry(QStringLiteral("old.mp4"), 1000, 101);
    entry(QStringLiteral("exact.mp4"), 2000, 100);
    entry(QStringLiteral("young.mp4"), 4000, 99);
    entry(QStringLiteral("future.mp4"), 8000, -500);

    EXPECT_EQ(store._srDeleteFilesOlderThanTimeToLiveInSeconds(100.0), 1000);

    EXPECT_FALSE(exists(QStringLiteral("old.mp4")));
    EXPECT_TRUE(exists(QStringLiteral("exact.mp4")));
    EXPECT_TRUE(exists(QStringLiteral("young.mp4")));
    EXPECT_TRUE(exists(QStringLiteral("future.mp4")));
    EXPECT_EQ(logs.messages(QStringLiteral("zaf.tempstore")),
              QStringList({QStringLiteral("_srDeleteFilesOlderThanTimeToLiveInSeconds: 100"),
                           QStringLiteral("deleting old file")}));
}

TEST_F(TempStoreTest, ZeroTimeToLiveRemovesEverythingIncludingFutureEntriesAndDirectories)
{
    entry(QStringLiteral("a.mp4"), 300, 5);
    entry(QStringLiteral("future.mp4"), 700, -3600);
    entry(QStringLiteral(".hidden"), 11, 0);
    ASSERT_TRUE(QDir(dir).mkdir(QStringLiteral("sub")));
    entry(QStringLiteral("sub/inner.mp4"), 5000, 1000);
    const qint64 subSize = QFileInfo(dir + QStringLiteral("sub")).size();

    EXPECT_EQ(store._srDeleteAllTempFiles(), 300 + 700 + 11 + subSize);
    EXPECT_TRUE(QDir(dir).isEmpty(QDir::AllEntries | QDir::Hidden | QDir::System | QDir::NoDotAndDotDot));
    EXPECT_TRUE(QDir(dir).exists()) << "the directory itself stays";
}

TEST_F(TempStoreTest, AgeCleanupTotalCountsOnlySuccessfulRemovalsAndGoesOn)
{
    entry(QStringLiteral("a.mp4"), 100, 50);
    entry(QStringLiteral("stuck.mp4"), 200, 50);
    entry(QStringLiteral("c.mp4"), 400, 50);
    fileManager.failingRemovals = {QStringLiteral("stuck.mp4")};

    EXPECT_EQ(store._srDeleteFilesOlderThanTimeToLiveInSeconds(10.0), 500);
    EXPECT_TRUE(exists(QStringLiteral("stuck.mp4")));
    EXPECT_FALSE(exists(QStringLiteral("a.mp4")));
    EXPECT_FALSE(exists(QStringLiteral("c.mp4")));
    EXPECT_EQ(logs.count(kAgeReport.arg(EBUSY)), 1);
    const QStringList console = logs.messages(QStringLiteral("default"));
    ASSERT_EQ(console.size(), 1);
    EXPECT_TRUE(console[0].startsWith(QStringLiteral("error = Error Domain=posix Code=16"))) << console[0].toStdString();
}

TEST_F(TempStoreTest, AgeCleanupOfMissingDirectoryRemovesNothingAfterOneReport)
{
    ZafTempStore missing(fileManager, scratch.path() + QStringLiteral("/absent/"));
    EXPECT_EQ(missing._srDeleteFilesOlderThanTimeToLiveInSeconds(0.0), 0);
    EXPECT_EQ(logs.count(kAgeReport.arg(ENOENT)), 1);
    EXPECT_EQ(logs.messages(QStringLiteral("default")).size(), 1);
}

TEST_F(TempStoreTest, AgeCleanupLogsTheTimeToLiveTruncatedTowardZero)
{
    store._srDeleteFilesOlderThanTimeToLiveInSeconds(-7.9);
    store._srDeleteFilesOlderThanTimeToLiveInSeconds(86399.99);
    EXPECT_EQ(logs.messages(QStringLiteral("zaf.tempstore")),
              QStringList({QStringLiteral("_srDeleteFilesOlderThanTimeToLiveInSeconds: -7"),
                           QStringLiteral("_srDeleteFilesOlderThanTimeToLiveInSeconds: 86399")}));
}

TEST_F(TempStoreTest, SizeOfTempDirIsTheDirectoryEntrysOwnSize)
{
    entry(QStringLiteral("big.mp4"), 3 << 20, 0);
    OptionalError error;
    const std::int64_t size = store._srSizeOfTempDir(&error);
    EXPECT_FALSE(error.has_value());
    EXPECT_EQ(size, QFileInfo(dir).size());
    EXPECT_LT(size, 3 << 20);

    ZafTempStore missing(fileManager, scratch.path() + QStringLiteral("/absent/"));
    EXPECT_EQ(missing._srSizeOfTempDir(&error), 0);
    ASSERT_TRUE(error.has_value());
    EXPECT_EQ(error->code, ENOENT);
}

TEST_F(TempStoreTest, FreeSpaceMustExceedTheRequiredSpaceStrictly)
{
    fileManager.freeSize = 100000000;
    EXPECT_EQ(store._srDeviceFreeDiskSpace(), 100000000u);
    EXPECT_FALSE(store._srDeviceHasSufficientFreeSpaceForRecording());
    fileManager.freeSize = 100000001;
    EXPECT_TRUE(store._srDeviceHasSufficientFreeSpaceForRecording());
    fileManager.fileSystemUnreadable = true;
    EXPECT_EQ(store._srDeviceFreeDiskSpace(), 0u);
    EXPECT_FALSE(store._srDeviceHasSufficientFreeSpaceForRecording());
}

TEST_F(TempStoreTest, FreeSpaceOfMissingDirectoryReadsZero)
{
    ZafTempStore missing(FileManager::defaultManager(), scratch.path() + QStringLiteral("/absent/"));
    EXPECT_EQ(missing._srDeviceFreeDiskSpace(), 0u);
    EXPECT_FALSE(missing._srDeviceHasSufficientFreeSpaceForRecording());
    EXPECT_GT(store._srDeviceFreeDiskSpace(), 0u) << "a real volume reports its free space";
}

} // namespace
} // namespace zaf::test
