// The folder watcher on real folders: a file is reported once it is closed after writing, never
// while it is still being written; a missing folder is waited for, and watched again after it went
// away and came back. (Files renamed in are in the whole-process run.)
//
// Absence is shown without sleeping: the kernel delivers a folder's events in order, so once a
// marker file finished after the event in question is reported, that event would have come first.
#include "host/watch/folder_watcher.h"
#include "tests/support/temp_dir.h"
#include "tests/support/wait_until.h"

#include <QDir>
#include <QFile>

#include <gtest/gtest.h>

namespace zaf::host::watch {
namespace {

class FolderWatcherTest : public ::testing::Test {
protected:
    void watch(const QString &folder)
    {
        QObject::connect(&watcher, &FolderWatcher::fileFinished, [this](const QString &path) { finished << path; });
        QObject::connect(&watcher, &FolderWatcher::folderWatched, [this] { ++watched; });
        QObject::connect(&watcher, &FolderWatcher::folderMissing, [this] { ++missing; });
        QString error;
        ASSERT_TRUE(watcher.start(folder, &error)) << error.toStdString();
    }
    // Writes and closes `name` in `folder`, then waits until it is reported.
    ::testing::AssertionResult finishMarker(const QString &folder, const QString &name)
    {
        QFile marker(QDir(folder).filePath(name));
        if (!marker.open(QIODevice::WriteOnly))
            return ::testing::AssertionFailure() << "cannot write " << marker.fileName().toStdString();
        marker.close();
        if (!test::waitUntil([&] { return finished.contains(marker.fileName()); }, 10000))
            return ::testing::AssertionFailure() << "the marker " << name.toStdString() << " was not reported";
        return ::testing::AssertionSuccess();
    }

    test::ScratchDir scratch;
    FolderWatcher watcher;
    QStringList finished;
    int watched = 0;
    int missing = 0;
};

TEST_F(FolderWatcherTest, ReportsAFileOnlyOnceItIsClosedAfterWriting)
{
    watch(scratch.path());
    EXPECT_TRUE(watcher.isWatchingFolder());
    QFile recording(scratch.file(QStringLiteral("recording.mp4")));
    ASSERT_TRUE(recording.open(QIODevice::WriteOnly));
    recording.write(QByteArray(100000, 'x'));
    recording.flush();
    ASSERT_TRUE(finishMarker(scratch.path(), QStringLiteral("marker-1")));
    EXPECT_EQ(finished, QStringList{scratch.file(QStringLiteral("marker-1"))}) << "reported while still being written";

    recording.write(QByteArray(100000, 'y'));
    recording.close();
    EXPECT_TRUE(test::waitUntil([&] { return finished.contains(recording.fileName()); }, 10000));
}

TEST_F(FolderWatcherTest, WaitsForAMissingFolderAndForItAgainAfterItWent)
{
    const QString folder = scratch.file(QStringLiteral("Videos/Screencasts"));
    watch(folder);
    EXPECT_FALSE(watcher.isWatchingFolder());
    EXPECT_EQ(missing, 1);
    EXPECT_FALSE(QFileInfo::exists(folder)) << "the watcher made the folder";

    ASSERT_TRUE(QDir().mkpath(folder)); // both parts at once: the second may come before the first is watched
    ASSERT_TRUE(test::waitUntil([&] { return watcher.isWatchingFolder(); }, 10000));
    ASSERT_TRUE(finishMarker(folder, QStringLiteral("first.mp4")));

    ASSERT_TRUE(QDir(scratch.file(QStringLiteral("Videos"))).removeRecursively());
    ASSERT_TRUE(test::waitUntil([&] { return missing == 2; }, 10000));
    ASSERT_TRUE(QDir().mkpath(scratch.file(QStringLiteral("Videos"))));
    ASSERT_TRUE(QDir().mkdir(folder));
    ASSERT_TRUE(test::waitUntil([&] { return watcher.isWatchingFolder(); }, 10000));
    EXPECT_EQ(watched, 2);
    ASSERT_TRUE(finishMarker(folder, QStringLiteral("second.mp4")));
}

} // namespace
} // namespace zaf::host::watch
