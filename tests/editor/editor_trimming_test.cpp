// Trimming through the editor on generated movies: the export, the reload, cancel and the shake.
#include "tests/editor/editor_test_support.h"

#include <QDir>
#include <QFileInfo>
#include <QRegularExpression>
#include <QThread>
#include <QThreadPool>

#include "platform/dispatch.h"
#include "platform/media/export_session.h"
#include "tempstore/temp_directory.h"

#include <ctime>

namespace zaf::test {
namespace {

QStringList tempEntries()
{
    return QDir(ZafTempStore::defaultStore()._srTempPath()).entryList(QDir::Files | QDir::Hidden | QDir::NoDotAndDotDot);
}

TEST_F(EditorTest, AppliedTrimHoldsExactlyTheSelectedFramesAndReplacesTheMovie)
{
    auto e = ready(movie(10));
    selectRange(*e, 2, 7);
    EXPECT_TRUE(e->isTrimming());
    media::Player *oldPlayer = e->mvPlayer();

    e->trimButton()->trigger();
    EXPECT_TRUE(e->isExporting());
    EXPECT_EQ(e->activityTypes(), QStringList{QString::fromLatin1(ZafActivityTypeSaveToPhotoLibrary)});
    // While the export runs, neither cancel nor the shake leaves editing.
    e->undoAction();
    e->motionEnded(ui::MotionSubtype::Shake, ui::MotionEvent{ui::MotionSubtype::Shake});
    EXPECT_TRUE(e->isTrimming());

    // Watch the reload one event-loop pass at a time: until the new item is ready, the range keeps
    // the trimmed values.
    QElapsedTimer timer;
    timer.start();
    while (timer.elapsed() < 60000 && e->isExporting())
        QCoreApplication::processEvents(QEventLoop::AllEvents, 5);
    ASSERT_FALSE(e->isExporting());
    if (e->mvPlayer()->currentItem()->status() != media::PlayerItem::Status::ReadyToPlay) {
        EXPECT_DOUBLE_EQ(e->editEndTime(), 7.0) << "the range resets only when the new movie is ready";
    }
    const QString trimmed = e->videoURL().toLocalFile();
    EXPECT_TRUE(QRegularExpression(QStringLiteral("^Recorder_\\d+\\.mp4$")).match(QFileInfo(trimmed).fileName()).hasMatch());
    EXPECT_EQ(QFileInfo(trimmed).absolutePath(), QFileInfo(ZafTempStore::defaultStore()._srTempPath()).absolutePath());
    EXPECT_NE(e->mvPlayer(), oldPlayer);
    EXPECT_FALSE(e->isTrimming()) << "the reload ends editing: preview mode";
    EXPECT_EQ(itemNames(*e, e->topToolBar()), words("done flex title flex save"));

    ASSERT_TRUE(waitUntilReady(*e));
    EXPECT_DOUBLE_EQ(e->editStartTime(), 0.0);
    EXPECT_NEAR(e->editEndTime(), 5.0, 0.05);
    const QList<int> frames = readFrameNumbers(trimmed);
    ASSERT_EQ(frames.size(), 150);
    EXPECT_EQ(frames.first(), 60);
    EXPECT_EQ(frames.last(), 209);
}

TEST_F(EditorTest, CancelledTrimKeepsTheHandleValuesAndTouchesNoFile)
{
    auto e = ready(movie(4));
    const QStringList before = tempEntries();
    selectRange(*e, 1, 2.5);
    e->cancelTrimButton()->trigger();
    EXPECT_FALSE(e->isTrimming());
    EXPECT_FALSE(e->mvTrimmer()->isEditing());
    EXPECT_DOUBLE_EQ(e->editStartTime(), 1.0);
    EXPECT_DOUBLE_EQ(e->editEndTime(), 2.5);
    EXPECT_EQ(tempEntries(), before);
    EXPECT_EQ(itemNames(*e, e->topToolBar()), words("done flex title flex save"));
}

TEST_F(EditorTest, SecondTrimWithinTheSameSecondGetsAFreeNameAndRetiresTheFirstFile)
{
    auto e = ready(movie(10));
    selectRange(*e, 2, 7);
    ASSERT_TRUE(applyTrim(*e));
    ASSERT_TRUE(waitUntilReady(*e));
    const QString first = e->videoURL().toLocalFile();

    // Names have a resolution of one second. The second trim comes at once, and the names of the
    // next seconds are taken too, so it always finds its plain name taken (by the movie it reads
    // or by another file, which must survive).
    const qint64 now = std::time(nullptr);
    QStringList taken;
    for (qint64 second = now; second <= now + 3; ++second) {
        taken << ZafTempMovieFileNameAt(ZafTempStore::defaultStore()._srTempPath() + "/Recorder_", double(second));
        QFile other(taken.last());
        if (taken.last() != first) {
            ASSERT_TRUE(other.open(QIODevice::WriteOnly) && other.write("not the movie") > 0);
        }
    }
    selectRange(*e, 1, 3);
    ASSERT_TRUE(applyTrim(*e));
    const QString second = e->videoURL().toLocalFile();
    EXPECT_NE(first, second);
    EXPECT_TRUE(QRegularExpression(QStringLiteral("^Recorder_\\d+-2\\.mp4$")).match(QFileInfo(second).fileName()).hasMatch()) << second.toStdString();
    for (const QString &other : taken) {
        QFile file(other);
        if (other != first) {
            EXPECT_TRUE(file.open(QIODevice::ReadOnly) && file.readAll() == "not the movie") << other.toStdString();
        }
    }
    const QList<int> frames = readFrameNumbers(second);
    ASSERT_EQ(frames.size(), 60);
    EXPECT_EQ(frames.first(), 90);
    EXPECT_EQ(frames.last(), 149);
    EXPECT_TRUE(waitUntil([&] { return !QFile::exists(first); }, 5000)) << "the earlier trim is removed once the new one is written";

    e.reset();
    EXPECT_TRUE(tempEntries().isEmpty()) << "destroying the editor empties the temporary directory";
}

// Destroying the editor while its trim export writes, or while the finished export's completion
// waits for the main thread to reload (the main thread handles no events here), stops the export
// before the temporary directory is emptied and leaves the completion nothing to wait for.
class EditorTrimTeardownTest : public EditorTest, public testing::WithParamInterface<bool> {};

TEST_P(EditorTrimTeardownTest, DestroyingTheEditorDuringItsTrimExportStopsItAndLeavesTheDirectoryEmpty)
{
    const bool finishing = GetParam();
    {
        auto e = ready(movie(finishing ? 3 : 10, 640, 480));
        selectRange(*e, 0.5, finishing ? 2.5 : 9.5);
        e->trimButton()->trigger();
        const auto session = e->exportSession();
        ASSERT_TRUE(session);
        const auto reached = [&] {
            return finishing ? session->status() == media::ExportStatus::Completed : session->progress() > 0.0f;
        };
        for (int i = 0; i < 12000 && !reached() && session->status() != media::ExportStatus::Failed; ++i)
            QThread::msleep(5);
        ASSERT_TRUE(reached());
        QThread::msleep(50); // a finished export's completion is now in its hop to the main thread
        e.reset();
        const media::ExportStatus status = session->status();
        EXPECT_TRUE(status == media::ExportStatus::Cancelled || status == media::ExportStatus::Completed) << int(status);
        EXPECT_TRUE(tempEntries().isEmpty());
        EXPECT_TRUE(dispatch::globalQueue(dispatch::Priority::Default).waitForDone(10000))
            << "the completion gave up its hop without the main thread";
        spin(100);
        EXPECT_TRUE(tempEntries().isEmpty()) << "nothing is written after the editor has gone";
    }
}

INSTANTIATE_TEST_SUITE_P(Moments, EditorTrimTeardownTest, testing::Bool(),
                         [](const testing::TestParamInfo<bool> &info) {
                             return std::string(info.param ? "WhileItsCompletionWaits" : "WhileItWrites");
                         });

} // namespace
} // namespace zaf::test
