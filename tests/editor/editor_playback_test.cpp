// Playback through the editor on generated movies, with the player's clock stepped by the test.
#include "tests/editor/editor_test_support.h"

#include "editor/date_extensions.h"
#include "overlay/video_overlay_button.h"
#include "platform/ui/view_animation.h"

#include <QFileInfo>
#include <QLabel>
#include <QLocale>

#include <functional>

namespace zaf::test {
namespace {

class EditorPlaybackTest : public EditorTest {
protected:
    // Steps the clock in frame-sized steps up to `seconds` more, handling events between steps.
    void run(double seconds)
    {
        for (double t = 0; t < seconds; t += 1.0 / 30) {
            clock->advance(1.0 / 30);
            QCoreApplication::processEvents();
        }
    }
};

TEST_F(EditorPlaybackTest, TrimmedPlaybackStartsAtTheRangeStartAndPausesAtItsEnd)
{
    auto e = ready(movie(12));
    selectRange(*e, 5, 10);
    e->playAction();
    spin();
    EXPECT_NEAR(e->mvPlayer()->currentTime().seconds(), 5.0, 1e-6);
    EXPECT_GT(e->mvPlayer()->rate(), 0);
    run(6);
    EXPECT_EQ(e->mvPlayer()->rate(), 0);
    EXPECT_NEAR(e->mvPlayer()->currentTime().seconds(), 10.0, 1e-6);
    EXPECT_TRUE(e->bottomToolBar()->items().contains(e->playButton()));
    EXPECT_FALSE(e->bottomToolBar()->items().contains(e->pauseButton()));
}

TEST_F(EditorPlaybackTest, EndOfMoviePausesShowsTheControlsAndRewinds)
{
    auto e = ready(movie(2));
    e->playAction();
    EXPECT_TRUE(e->isUIHidden()) << "controls fade out when playback starts";
    EXPECT_FALSE(e->isIntroMode());
    EXPECT_EQ(ui::superview(e->videoOverlayPlayButton()->widget()), nullptr);
    run(2.5);
    spin();
    EXPECT_EQ(e->mvPlayer()->rate(), 0);
    EXPECT_FALSE(e->isUIHidden());
    EXPECT_EQ(ui::alpha(e->topToolBar()), 1.0);
    EXPECT_EQ(e->mvPlayer()->currentTime().seconds(), 0.0);
    EXPECT_TRUE(e->bottomToolBar()->items().contains(e->playButton()));

    e->playAction();
    EXPECT_EQ(ui::superview(e->videoOverlayPlayButton()->widget()), nullptr) << "the overlay never comes back";
    EXPECT_LT(e->mvPlayer()->currentTime().seconds(), 0.1);
}

TEST_F(EditorPlaybackTest, ReadinessSetsUpTheTimelineWhosePlayheadFollowsPlaybackUnlessTheUserScrubs)
{
    auto e = ready(movie(3));
    EXPECT_EQ(e->mvTrimmer()->delegate(), static_cast<ui::MovieScrubberDelegate *>(e.get()));
    EXPECT_EQ(e->mvTrimmer()->dataSource(), static_cast<ui::MovieScrubberDataSource *>(e.get()));
    EXPECT_EQ(e->editStartTime(), 0);
    EXPECT_NEAR(e->editEndTime(), 3.0, 0.05);
    EXPECT_NEAR(e->getPlayerDuration(), 3.0, 0.05);
    // The reload asked for thumbnails at once, from a generator made for this movie.
    EXPECT_FALSE(e->mvTrimmer()->thumbnailTimestamps().isEmpty());
    EXPECT_TRUE(e->thumbnailGenerator());

    e->playAction();
    run(1.0);
    EXPECT_NEAR(e->mvTrimmer()->value(), e->mvPlayer()->currentTime().seconds(), 0.05);
    EXPECT_GT(e->mvTrimmer()->value(), 0.9);
    e->movieScrubberDidBeginScrubbingWithHandle(e->mvTrimmer(), ui::MovieScrubberHandle::Playhead);
    EXPECT_TRUE(e->isScrubbing());
    e->mvTrimmer()->setValue(0.2);
    run(0.5);
    EXPECT_EQ(e->mvTrimmer()->value(), 0.2);
}

class EditorRotationTest : public EditorPlaybackTest, public testing::WithParamInterface<int> {};

TEST_P(EditorRotationTest, VideoSizeAndThumbnailAspectFollowTheRotation)
{
    const int rotation = GetParam();
    auto e = ready(movie(1, 192, 108, rotation));
    const QSizeF shown = rotation ? QSizeF(108, 192) : QSizeF(192, 108);
    EXPECT_EQ(e->getVideoSize(), shown);
    EXPECT_DOUBLE_EQ(e->movieScrubberThumbnailAspectRatio(e->mvTrimmer()), shown.width() / shown.height());
}

INSTANTIATE_TEST_SUITE_P(Degrees, EditorRotationTest, testing::Values(0, 90));

// Files the editor cannot play: it says so in the video area with the file's name and a plain
// reason, leaves only Cancel (nothing to play, trim, save or share), and Cancel reports nothing.
struct UnplayableMovie {
    const char *name;
    std::function<QString(const ScratchDir &)> make;
    const char *reason;
};

class EditorUnplayableMovieTest : public EditorPlaybackTest, public ::testing::WithParamInterface<UnplayableMovie> {};

TEST_P(EditorUnplayableMovieTest, SaysWhyInTheVideoAreaAndLeavesOnlyCancel)
{
    const QString path = GetParam().make(scratch);
    auto e = makeEditor(path);
    RecordingDelegate delegate;
    e->setDelegate(&delegate);
    ASSERT_TRUE(waitUntil([&] { return e->unplayableMovieMessage() != nullptr; }, 10000));
    const QString message = e->unplayableMovieMessage()->text();
    EXPECT_TRUE(message.contains(QFileInfo(path).fileName())) << message.toStdString();
    EXPECT_TRUE(message.contains(GetParam().reason)) << message.toStdString();
    EXPECT_TRUE(e->unplayableMovieMessage()->isVisibleTo(e->view()));

    EXPECT_EQ(e->mvTrimmer()->delegate(), nullptr);
    EXPECT_EQ(ui::superview(e->videoOverlayPlayButton()->widget()), nullptr);
    for (ui::BarButtonItem *item : {e->saveButton(), e->shareButton(), e->playButton()})
        EXPECT_FALSE(item->isEnabled());
    EXPECT_TRUE(e->cancelButton()->isEnabled());
    e->playAction(); // Space
    e->saveAction(); // Ctrl+S
    EXPECT_EQ(e->mvPlayer()->rate(), 0);
    EXPECT_TRUE(e->activityTypes().isEmpty());

    e->cancelButton()->trigger();
    ASSERT_EQ(delegate.reports.size(), 1);
    EXPECT_TRUE(delegate.reports.first().isEmpty());
}

const char *const kNotAMovie = "This file is not a movie this editor can play.";

INSTANTIATE_TEST_SUITE_P(Files, EditorUnplayableMovieTest, ::testing::Values(
    UnplayableMovie{"Missing", [](const ScratchDir &t) { return t.file("gone.mp4"); }, "This file could not be found."},
    UnplayableMovie{"Empty", [](const ScratchDir &t) { return t.write("empty.mp4", 0); }, kNotAMovie},
    UnplayableMovie{"Garbage", [](const ScratchDir &t) { return t.write("garbage.mp4", 3000); }, kNotAMovie},
    UnplayableMovie{"SoundOnly", [](const ScratchDir &t) {
        const QString path = t.file("sound.mp4");
        ffmpeg(words("-f lavfi -i sine=frequency=440:duration=1 -c:a aac") << path);
        return path;
    }, kNotAMovie}),
    caseName);

TEST(EditorTitle, DateLineShowsMonthDayAndTwelveHourTime)
{
    QLocale::setDefault(QLocale(QStringLiteral("en_US")));
    EXPECT_EQ(ZafDateExtensions::_srGetStringFromDate(QDateTime(QDate(2026, 11, 16), QTime(0, 5))),
              QStringLiteral("November 16 12:05 AM"));
    EXPECT_EQ(ZafDateExtensions::_srGetStringFromDate(QDateTime(QDate(2026, 11, 16), QTime(16, 47))),
              QStringLiteral("November 16 04:47 PM"));
    EXPECT_TRUE(ZafDateExtensions::_srGetStringFromDate(std::nullopt).isEmpty());
    EXPECT_FALSE(ZafDateExtensions::_srGetCreationDateForFile(QUrl::fromLocalFile(QStringLiteral("/nonexistent"))));
}

} // namespace
} // namespace zaf::test
