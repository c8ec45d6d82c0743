// Trimming through the editor on generated movies: the export, the reload, cancel and the shake.
#include "tests/editor/editor_test_support.h"

#include "platform/media/playback_clock.h"
#include "platform/ui/movie_scrubber.h"

#include <QDir>
#include <QFileInfo>
#include <QRegularExpression>

namespace zaf::test {
namespace {

class EditorTrimTest : public EditorTest {
protected:
    std::unique_ptr<ZafVideoEditorViewController> ready(double seconds)
    {
        auto e = makeEditor(movie(seconds), QRectF(0, 0, 400, 700));
        EXPECT_TRUE(waitUntilReady(*e));
        e->mvPlayer()->setTimeSource(std::make_shared<media::ManualTimeSource>());
        return e;
    }
    // Drags the handles as the timeline reports it: editing begins, then both values move.
    static void selectRange(ZafVideoEditorViewController &e, double start, double end)
    {
        ui::MovieScrubber *s = e.mvTrimmer();
        if (!s->isEditing()) {
            s->setEditing(true, false);
            e.movieScrubberDidBeginEditing(s);
        }
        s->setEditingRange(start, end);
        e.movieScrubberEditingStartValueDidChange(s, start);
        e.movieScrubberEditingEndValueDidChange(s, end);
        spin(20);
    }
    // Applies the trim with the trim item and waits (bounded) for the trimmed movie to be loaded.
    static bool applyTrim(ZafVideoEditorViewController &e)
    {
        const QUrl before = e.videoURL();
        e.trimButton()->trigger();
        QElapsedTimer timer;
        timer.start();
        while (timer.elapsed() < 60000 && e.videoURL() == before)
            spin(20);
        return e.videoURL() != before;
    }
    static QStringList tempEntries()
    {
        return QDir(ZafTempStore::defaultStore()._srTempPath()).entryList(QDir::Files | QDir::Hidden | QDir::NoDotAndDotDot);
    }
};

TEST_F(EditorTrimTest, AppliedTrimHoldsExactlyTheSelectedFramesAndReplacesTheMovie)
{
    auto e = ready(10);
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

TEST_F(EditorTrimTest, CancelKeepsTheHandleValuesAndTouchesNoFile)
{
    auto e = ready(4);
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

TEST_F(EditorTrimTest, SecondTrimOfTheTrimmedMovieWorksAndRetiresTheFirstFile)
{
    auto e = ready(10);
    selectRange(*e, 2, 7);
    ASSERT_TRUE(applyTrim(*e));
    ASSERT_TRUE(waitUntilReady(*e));
    const QString first = e->videoURL().toLocalFile();

    // Names have a resolution of one second: the second trim gets a new name in the next second.
    spin(1100);
    selectRange(*e, 1, 3);
    ASSERT_TRUE(applyTrim(*e));
    const QString second = e->videoURL().toLocalFile();
    EXPECT_NE(first, second);
    const QList<int> frames = readFrameNumbers(second);
    ASSERT_EQ(frames.size(), 60);
    EXPECT_EQ(frames.first(), 90);
    EXPECT_EQ(frames.last(), 149);
    QElapsedTimer timer;
    timer.start();
    while (timer.elapsed() < 5000 && QFile::exists(first))
        spin(20);
    EXPECT_FALSE(QFile::exists(first)) << "the earlier trim is removed once the new one is written";

    e.reset();
    EXPECT_TRUE(tempEntries().isEmpty()) << "destroying the editor empties the temporary directory";
}

} // namespace
} // namespace zaf::test
