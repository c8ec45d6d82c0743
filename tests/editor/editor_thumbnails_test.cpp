// The timeline's data source: timestamps, thumbnail sizes, and the thumbnail cache.
#include "tests/editor/editor_test_support.h"

#include "platform/media/image_generator.h"
#include "platform/ui/movie_scrubber.h"
#include "platform/ui/transition_coordinator.h"

#include <QSignalSpy>

#include <cmath>

namespace zaf::test {
namespace {

class EditorThumbnailTest : public EditorTest {
protected:
    std::unique_ptr<ZafVideoEditorViewController> ready(double seconds)
    {
        auto editor = makeEditor(movie(seconds, 320, 240, 0, 0), QRectF(0, 0, 400, 700));
        EXPECT_TRUE(waitUntilReady(*editor));
        spin(100);
        return editor;
    }
    static QList<double> timestamps(ZafVideoEditorViewController &e, int count, double start, double end)
    {
        return e.movieScrubberEvenlySpacedTimestampsStartingAtEndingAt(e.mvTrimmer(), count, start, end);
    }
};

TEST_F(EditorThumbnailTest, TimestampsAreAccumulatedAndStopAtTheDuration)
{
    auto ten = ready(10);
    ASSERT_DOUBLE_EQ(ten->getPlayerDuration(), 10.0);
    EXPECT_EQ(timestamps(*ten, 10, 0, 10), (QList<double>{0, 1, 2, 3, 4, 5, 6, 7, 8, 9}));
    EXPECT_TRUE(timestamps(*ten, 0, 0, 10).isEmpty());
    EXPECT_EQ(timestamps(*ten, 5, 0, 0.0), (QList<double>{0.0}));

    auto five = ready(5);
    EXPECT_EQ(timestamps(*five, 4, 0, 8), (QList<double>{0, 2, 4}));

    auto one = ready(1);
    const double step = 1.0 / 3.0;
    const QList<double> thirds = timestamps(*one, 3, 0, 1);
    ASSERT_EQ(thirds.size(), 3);
    EXPECT_EQ(thirds[1], step);
    EXPECT_EQ(thirds[2], step + step) << "accumulated, not 2/3 computed directly";
}

TEST_F(EditorThumbnailTest, TimestampsBeforeTheMovieIsReadyAreTheStartAlone)
{
    auto e = makeEditor(scratch.file(QStringLiteral("none.mp4")), QRectF(0, 0, 400, 700));
    EXPECT_TRUE(std::isnan(e->getPlayerDuration()));
    EXPECT_EQ(timestamps(*e, 4, 1.5, 8), (QList<double>{1.5}));
}

TEST(EditorThumbnailSize, FollowsTheDisplaySizeAndScaleWithSinglePrecisionTiesToEven)
{
    struct Case {
        QSizeF video;
        double scale;
        QSizeF expected;
    };
    const Case cases[] = {
        {{1920, 1080}, 1, {68, 38}},  {{1920, 1080}, 2, {270, 76}}, {{1920, 1080}, 3, {609, 114}},
        {{1536, 2048}, 1, {28, 38}},  {{1536, 2048}, 2, {114, 76}}, {{1536, 2048}, 3, {258, 114}},
    };
    for (const Case &c : cases) {
        EXPECT_EQ(ZafVideoEditorViewController::thumbnailSizeForVideoSize(c.video, c.scale), c.expected)
            << c.video.width() << "x" << c.video.height() << " at " << c.scale;
    }
}

TEST_F(EditorThumbnailTest, CacheServesRepeatsOnALaterPassAndUncachedRequestsGoToTheGenerator)
{
    auto e = ready(3);
    ui::MovieScrubber *scrubber = e->mvTrimmer();
    QSignalSpy received(scrubber, &ui::MovieScrubber::thumbnailImageReceived);
    // Wait for the timeline's own first round of thumbnails.
    QElapsedTimer timer;
    timer.start();
    while (timer.elapsed() < 10000 && (!e->cachedTimeStamps() || e->cachedTimeStamps()->size() < scrubber->thumbnailTimestamps().size()))
        spin(20);
    const double t = scrubber->thumbnailTimestamps().first();
    ASSERT_TRUE(e->cachedTimeStamps()->contains(t));
    const int calls = e->thumbnailGenerator()->requestedTimeCount();
    received.clear();

    e->movieScrubberRequestThumbnailImageForTimestamp(scrubber, t);
    EXPECT_EQ(e->thumbnailGenerator()->requestedTimeCount(), calls) << "a cached timestamp makes no generator call";
    EXPECT_EQ(received.count(), 0) << "the hand-over comes on a later pass of the main loop";
    spin(50);
    EXPECT_EQ(received.count(), 1);

    // Two early requests of the same new timestamp: two generator calls and two hand-overs.
    const double fresh = 1.2345;
    scrubber->setThumbnailImageForTimestamp(QImage(), fresh); // not asked by the timeline: ignored
    e->movieScrubberRequestThumbnailImageForTimestamp(scrubber, fresh);
    e->movieScrubberRequestThumbnailImageForTimestamp(scrubber, fresh);
    EXPECT_EQ(e->thumbnailGenerator()->requestedTimeCount(), calls + 2);
    timer.restart();
    while (timer.elapsed() < 5000 && !e->cachedTimeStamps()->contains(fresh))
        spin(20);
    EXPECT_TRUE(e->cachedTimeStamps()->contains(fresh));
}

TEST_F(EditorThumbnailTest, CacheAndGeneratorAreDiscardedOnRotation)
{
    auto e = ready(2);
    spin(300);
    ASSERT_TRUE(e->cachedTimeStamps().has_value());
    const auto before = e->thumbnailGenerator();
    ui::TransitionCoordinator c(QSizeF(700, 400));
    e->view()->resize(700, 400);
    e->viewWillTransitionToSize(QSizeF(700, 400), c);
    // The reload after the discard starts again with a new generator and an empty cache.
    EXPECT_NE(e->thumbnailGenerator(), before);
    EXPECT_TRUE(!e->cachedTimeStamps() || e->cachedTimeStamps()->isEmpty());
}

} // namespace
} // namespace zaf::test
