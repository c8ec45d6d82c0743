// Playback through the editor on generated movies, with the player's clock stepped by the test.
#include "tests/editor/editor_test_support.h"

#include "editor/date_extensions.h"
#include "overlay/video_overlay_button.h"
#include "platform/media/playback_clock.h"
#include "platform/ui/movie_scrubber.h"
#include "platform/ui/view_animation.h"

#include <QLocale>
#include <QWidget>

#include <cmath>

namespace zaf::test {
namespace {

using media::ManualTimeSource;

// An editor on a ready movie whose player runs on a clock the test advances.
struct ReadyEditor {
    std::unique_ptr<ZafVideoEditorViewController> editor;
    std::shared_ptr<ManualTimeSource> clock;
};

class EditorPlaybackTest : public EditorTest {
protected:
    ReadyEditor ready(double seconds, int width = 320, int height = 240, int rotation = 0)
    {
        ReadyEditor r;
        r.editor = makeEditor(movie(seconds, width, height, rotation), QRectF(0, 0, 400, 700));
        EXPECT_TRUE(waitUntilReady(*r.editor));
        r.clock = std::make_shared<ManualTimeSource>();
        r.editor->mvPlayer()->setTimeSource(r.clock);
        return r;
    }
    // Steps the clock in frame-sized steps up to `seconds` more, handling events between steps.
    void run(ManualTimeSource &clock, double seconds)
    {
        for (double t = 0; t < seconds; t += 1.0 / 30) {
            clock.advance(1.0 / 30);
            QCoreApplication::processEvents();
        }
    }
};

TEST_F(EditorPlaybackTest, ReadinessMakesTheEditorTheTimelinesSourceAndResetsTheRange)
{
    ReadyEditor r = ready(3);
    ZafVideoEditorViewController &e = *r.editor;
    EXPECT_EQ(e.mvTrimmer()->delegate(), static_cast<ui::MovieScrubberDelegate *>(&e));
    EXPECT_EQ(e.mvTrimmer()->dataSource(), static_cast<ui::MovieScrubberDataSource *>(&e));
    EXPECT_EQ(e.editStartTime(), 0);
    EXPECT_NEAR(e.editEndTime(), 3.0, 0.05);
    EXPECT_NEAR(e.getPlayerDuration(), 3.0, 0.05);
    // The reload asked for thumbnails at once, from a generator made for this movie.
    EXPECT_FALSE(e.mvTrimmer()->thumbnailTimestamps().isEmpty());
    EXPECT_TRUE(e.thumbnailGenerator());
}

TEST_F(EditorPlaybackTest, TrimmedPlaybackStartsAtTheRangeStartAndPausesAtItsEnd)
{
    ReadyEditor r = ready(12);
    ZafVideoEditorViewController &e = *r.editor;
    e.setTrimming(true);
    e.setEditStartTime(5);
    e.setEditEndTime(10);
    e.playAction();
    spin();
    EXPECT_NEAR(e.mvPlayer()->currentTime().seconds(), 5.0, 1e-6);
    EXPECT_GT(e.mvPlayer()->rate(), 0);
    run(*r.clock, 6);
    EXPECT_EQ(e.mvPlayer()->rate(), 0);
    EXPECT_NEAR(e.mvPlayer()->currentTime().seconds(), 10.0, 1e-6);
    EXPECT_TRUE(e.bottomToolBar()->items().contains(e.playButton()));
    EXPECT_FALSE(e.bottomToolBar()->items().contains(e.pauseButton()));
}

TEST_F(EditorPlaybackTest, EndOfMoviePausesShowsTheControlsAndRewinds)
{
    ReadyEditor r = ready(2);
    ZafVideoEditorViewController &e = *r.editor;
    e.playAction();
    EXPECT_TRUE(e.isUIHidden()) << "controls fade out when playback starts";
    EXPECT_FALSE(e.isIntroMode());
    EXPECT_EQ(ui::superview(e.videoOverlayPlayButton()->widget()), nullptr);
    run(*r.clock, 2.5);
    spin();
    EXPECT_EQ(e.mvPlayer()->rate(), 0);
    EXPECT_FALSE(e.isUIHidden());
    EXPECT_EQ(ui::alpha(e.topToolBar()), 1.0);
    EXPECT_EQ(e.mvPlayer()->currentTime().seconds(), 0.0);
    EXPECT_TRUE(e.bottomToolBar()->items().contains(e.playButton()));

    e.playAction();
    EXPECT_EQ(ui::superview(e.videoOverlayPlayButton()->widget()), nullptr) << "the overlay never comes back";
    EXPECT_LT(e.mvPlayer()->currentTime().seconds(), 0.1);
}

TEST_F(EditorPlaybackTest, PlayheadFollowsPlaybackUnlessTheUserScrubs)
{
    ReadyEditor r = ready(3);
    ZafVideoEditorViewController &e = *r.editor;
    e.playAction();
    run(*r.clock, 1.0);
    EXPECT_NEAR(e.mvTrimmer()->value(), e.mvPlayer()->currentTime().seconds(), 0.05);
    EXPECT_GT(e.mvTrimmer()->value(), 0.9);
    e.setScrubbing(true);
    e.mvTrimmer()->setValue(0.2);
    run(*r.clock, 0.5);
    EXPECT_EQ(e.mvTrimmer()->value(), 0.2);
}

TEST_F(EditorPlaybackTest, VideoSizeAndAspectFollowTheRotation)
{
    ReadyEditor upright = ready(1, 192, 108, 0);
    EXPECT_EQ(upright.editor->getVideoSize(), QSizeF(192, 108));
    EXPECT_DOUBLE_EQ(upright.editor->movieScrubberThumbnailAspectRatio(upright.editor->mvTrimmer()), 192.0 / 108.0);
    ReadyEditor turned = ready(1, 192, 108, 90);
    EXPECT_EQ(turned.editor->getVideoSize(), QSizeF(108, 192));
    EXPECT_DOUBLE_EQ(turned.editor->movieScrubberThumbnailAspectRatio(turned.editor->mvTrimmer()), 108.0 / 192.0);
}

TEST_F(EditorPlaybackTest, UnreadableMovieLeavesTheTimelineInert)
{
    auto e = makeEditor(scratch.write(QStringLiteral("garbage.mp4"), 3000), QRectF(0, 0, 400, 700));
    spin(300);
    EXPECT_EQ(e->mvTrimmer()->delegate(), nullptr);
    EXPECT_TRUE(std::isnan(e->getPlayerDuration()));
    EXPECT_EQ(e->getVideoSize(), QSizeF(0, 0));
    e->playAction(); // no crash, toolbars still change
    EXPECT_TRUE(e->bottomToolBar()->items().contains(e->pauseButton()));
}

TEST(EditorTitle, DateLineOfAMovieMadeFiveMinutesAfterMidnight)
{
    QLocale::setDefault(QLocale(QStringLiteral("en_US")));
    const QDateTime date(QDate(2026, 11, 16), QTime(0, 5));
    const QString text = ZafDateExtensions::_srGetStringFromDate(date);
    EXPECT_EQ(text, QStringLiteral("November 16 12:05 AM"));
    EXPECT_EQ(ZafDateExtensions::_srGetStringFromDate(QDateTime(QDate(2026, 11, 16), QTime(16, 47))),
              QStringLiteral("November 16 04:47 PM"));
    EXPECT_TRUE(ZafDateExtensions::_srGetStringFromDate(std::nullopt).isEmpty());
    EXPECT_FALSE(ZafDateExtensions::_srGetCreationDateForFile(QUrl::fromLocalFile(QStringLiteral("/nonexistent"))));
}

} // namespace
} // namespace zaf::test
