// The timeline's data source: timestamps, thumbnail sizes, and the thumbnail cache.
#include "tests/editor/editor_test_support.h"

#include "platform/media/image_generator.h"

#include <QSignalSpy>

#include <cmath>

namespace zaf::test {
namespace {

QList<double> timestamps(ZafVideoEditorViewController &e, int count, double start, double end)
{
    return e.movieScrubberEvenlySpacedTimestampsStartingAtEndingAt(e.mvTrimmer(), count, start, end);
}

TEST_F(EditorTest, TimestampsAreAccumulatedAndStopAtTheDurationOrAreTheStartAloneBeforeReadiness)
{
    auto unready = makeEditor(noMovie());
    EXPECT_TRUE(std::isnan(unready->getPlayerDuration()));
    EXPECT_EQ(timestamps(*unready, 4, 1.5, 8), (QList<double>{1.5}));

    auto ten = ready(movie(10, 320, 240, 0, 0));
    ASSERT_DOUBLE_EQ(ten->getPlayerDuration(), 10.0);
    EXPECT_EQ(timestamps(*ten, 10, 0, 10), (QList<double>{0, 1, 2, 3, 4, 5, 6, 7, 8, 9}));
    EXPECT_TRUE(timestamps(*ten, 0, 0, 10).isEmpty());
    EXPECT_EQ(timestamps(*ten, 5, 0, 0.0), (QList<double>{0.0}));
    EXPECT_EQ(timestamps(*ten, 4, 5, 13), (QList<double>{5, 7, 9}));

    auto one = ready(movie(1, 320, 240, 0, 0));
    const double step = 1.0 / 3.0;
    const QList<double> thirds = timestamps(*one, 3, 0, 1);
    ASSERT_EQ(thirds.size(), 3);
    EXPECT_EQ(thirds[1], step);
    EXPECT_EQ(thirds[2], step + step) << "accumulated, not 2/3 computed directly";
}

TEST(EditorThumbnailSize, FollowsTheDisplaySizeAndScaleWithSinglePrecisionTiesToEven)
{
    const struct {
        QSizeF video;
        double scale;
        QSizeF expected;
    } cases[] = {
        {{1920, 1080}, 1, {68, 38}}, {{1920, 1080}, 2, {270, 76}}, {{1920, 1080}, 3, {609, 114}},
        {{1536, 2048}, 1, {28, 38}}, {{1536, 2048}, 2, {114, 76}}, {{1536, 2048}, 3, {258, 114}},
    };
    for (const auto &c : cases) {
        EXPECT_EQ(ZafVideoEditorViewController::thumbnailSizeForVideoSize(c.video, c.scale), c.expected)
            << c.video.width() << "x" << c.video.height() << " at " << c.scale;
    }
}

TEST_F(EditorTest, CacheServesRepeatsOnALaterPassUncachedRequestsGoToTheGeneratorAndRotationDiscardsBoth)
{
    auto e = ready(movie(3, 320, 240, 0, 0));
    spin(100);   // the view settles its width, which may ask for another round of thumbnails
    ui::MovieScrubber *scrubber = e->mvTrimmer();
    QSignalSpy received(scrubber, &ui::MovieScrubber::thumbnailImageReceived);
    // Wait for the timeline's own first round of thumbnails.
    ASSERT_TRUE(waitUntil([&] {
        return e->cachedTimeStamps() && e->cachedTimeStamps()->size() >= scrubber->thumbnailTimestamps().size();
    }, 10000));
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
    scrubber->setThumbnailImageForTimestamp(QImage(), fresh);   // not asked by the timeline: ignored
    e->movieScrubberRequestThumbnailImageForTimestamp(scrubber, fresh);
    e->movieScrubberRequestThumbnailImageForTimestamp(scrubber, fresh);
    EXPECT_EQ(e->thumbnailGenerator()->requestedTimeCount(), calls + 2);
    EXPECT_TRUE(waitUntil([&] { return e->cachedTimeStamps()->contains(fresh); }, 5000));

    // A rotation starts again with a new generator and an empty cache.
    const auto before = e->thumbnailGenerator();
    rotate(*e, 700, 400);
    EXPECT_NE(e->thumbnailGenerator(), before);
    EXPECT_TRUE(!e->cachedTimeStamps() || e->cachedTimeStamps()->isEmpty());
}

} // namespace
} // namespace zaf::test
