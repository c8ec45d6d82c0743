// ImageGenerator on fixture movies whose frames show their own numbers.

#include "platform/media/image_generator.h"
#include "platform/media/media_asset.h"
#include "platform/media/movie_writer.h"
#include "tests/support/log_capture.h"
#include "tests/support/media/fixture_movies.h"
#include "tests/support/media/image_completions.h"
#include "tests/support/media/unusable_movies.h"
#include "tests/support/temp_dir.h"
#include "tools/fixture/frame_pattern.h"

#include <QFile>
#include <QUrl>

#include <gtest/gtest.h>

using zaf::media::ImageGenerator;
using zaf::media::MediaTime;
using zaf::test::readFrameNumber;

namespace {

// 3 s at 30 fps with a keyframe every 30 frames: frames 0..89, sync frames 0, 30 and 60.
const zaf::fixture::FixtureSpec kMovie{.seconds = 3, .audioTracks = 1};

std::shared_ptr<ImageGenerator> generatorFor(const QString &path, bool exact = false)
{
    auto generator = ImageGenerator::imageGeneratorWithAsset(zaf::media::MediaAsset::assetWithURL(QUrl::fromLocalFile(path)));
    if (exact) {
        generator->setRequestedTimeToleranceBefore(MediaTime::zero());
        generator->setRequestedTimeToleranceAfter(MediaTime::zero());
    }
    return generator;
}

// The number shown by the picture copied at `time` (which must succeed), and its actual time.
int numberAt(ImageGenerator &generator, const MediaTime &time, MediaTime *actual = nullptr)
{
    MediaTime at;
    zaf::OptionalError error;
    const QImage image = generator.copyImageAtTime(time, &at, &error);
    EXPECT_FALSE(image.isNull() || error) << qPrintable(time.debugDescription()) << ": " << (error ? qPrintable(error->description()) : "");
    if (actual)
        *actual = at;
    return readFrameNumber(image);
}

// Zero tolerance gives the exact frame in any request order (forwards within a GOP, backwards,
// across GOPs, on frame boundaries and between them), and the first or last frame outside the movie.
TEST(ImageGeneratorTest, CopyImageWithZeroToleranceReturnsExactFrameInAnyRequestOrder)
{
    auto generator = generatorFor(zaf::test::sharedFixtureMovie(kMovie), true);
    for (int frame : {0, 1, 2, 29, 31, 45, 44, 10, 89, 60, 59, 61, 30, 75, 3}) {
        for (const MediaTime &time : {MediaTime::make(frame, 30), MediaTime::make(frame * 2 + 1, 60)}) {
            MediaTime actual;
            EXPECT_EQ(numberAt(*generator, time, &actual), frame) << "at " << qPrintable(time.debugDescription());
            EXPECT_EQ(actual, MediaTime::make(frame, 30)) << qPrintable(actual.debugDescription());
        }
    }
    for (const auto &[seconds, frame] : {std::pair{-1.0, 0}, {3.0, 89}, {40.0, 89}}) {
        MediaTime actual;
        EXPECT_EQ(numberAt(*generator, MediaTime::fromSeconds(seconds, 600), &actual), frame) << seconds;
        EXPECT_EQ(actual, MediaTime::make(frame, 30)) << seconds;
    }
}

// Exact frames come back from a movie whose decode order differs from presentation order (our
// writer's default preset uses B-frames); the default tolerance still picks the sync frame.
TEST(ImageGeneratorTest, ExactFramesComeBackFromMovieWithReorderedFrames)
{
    zaf::test::ScratchDir dir;
    const QString path = dir.file(QStringLiteral("bframes.mp4"));
    auto created = zaf::media::MovieWriter::create(path, {.videoSize = QSize(320, 240), .gopLength = 25});
    ASSERT_TRUE(created.ok());
    for (int n = 0; n < 75; ++n)
        ASSERT_FALSE((*created.value)->appendVideoFrame(zaf::fixture::frameNumberImage(n, 320, 240)));
    ASSERT_FALSE((*created.value)->finish());

    auto generator = generatorFor(path, true);
    for (int frame : {0, 24, 25, 26, 49, 3, 50, 51, 74, 40, 41, 42}) {
        MediaTime actual;
        EXPECT_EQ(numberAt(*generator, MediaTime::make(frame, 30), &actual), frame);
        EXPECT_EQ(actual, MediaTime::make(frame, 30));
    }
    generator->setRequestedTimeToleranceBefore(MediaTime::positiveInfinity());
    EXPECT_EQ(numberAt(*generator, MediaTime::make(49, 30)), 25);
    EXPECT_EQ(numberAt(*generator, MediaTime::make(50, 30)), 50);
}

// The default tolerance (unbounded before) gives the sync frame at or before the time; a bounded
// one takes the sync frame only inside its window, else a frame within it.
TEST(ImageGeneratorTest, ToleranceDecidesBetweenSyncFrameAndFrameWithinWindow)
{
    auto generator = generatorFor(zaf::test::sharedFixtureMovie(kMovie));
    ASSERT_TRUE(generator->requestedTimeToleranceBefore().isPositiveInfinity());
    for (const auto &[seconds, syncFrame] : {std::pair{0.0, 0}, {0.5, 0}, {0.99, 0}, {1.0, 30}, {1.7, 30}, {2.2, 60}, {2.99, 60}}) {
        MediaTime actual;
        EXPECT_EQ(numberAt(*generator, MediaTime::fromSeconds(seconds, 600), &actual), syncFrame) << "at " << seconds << " s";
        EXPECT_EQ(actual, MediaTime::make(syncFrame, 30));
    }
    generator->setRequestedTimeToleranceBefore(MediaTime::make(1, 2));
    generator->setRequestedTimeToleranceAfter(MediaTime::zero());
    EXPECT_EQ(numberAt(*generator, MediaTime::fromSeconds(1.4, 600)), 30);
    MediaTime actual;
    const int shown = numberAt(*generator, MediaTime::fromSeconds(1.8, 600), &actual); // window [1.3, 1.8]
    EXPECT_TRUE(shown >= 38 && shown <= 54) << shown;
    EXPECT_EQ(actual, MediaTime::make(shown, 30));
}

// The maximum size bounds the picture, keeping its aspect, and never scales it up.
class ImageGeneratorMaximumSize : public ::testing::TestWithParam<std::pair<QSize, QSize>> {};

TEST_P(ImageGeneratorMaximumSize, BoundsThePictureAtItsAspect)
{
    const auto [maximum, expected] = GetParam();
    auto generator = generatorFor(zaf::test::sharedFixtureMovie(kMovie));
    generator->setMaximumSize(maximum);
    const QImage image = generator->copyImageAtTime(MediaTime::make(45, 30), nullptr, nullptr);
    EXPECT_EQ(image.size(), expected);
    EXPECT_TRUE(image.format() == QImage::Format_RGB32 || image.format() == QImage::Format_ARGB32_Premultiplied);
    EXPECT_EQ(readFrameNumber(image), 30);
}

INSTANTIATE_TEST_SUITE_P(Sizes, ImageGeneratorMaximumSize,
                         ::testing::Values(std::pair{QSize(0, 0), QSize(320, 240)}, std::pair{QSize(100, 0), QSize(100, 75)},
                                           std::pair{QSize(0, 60), QSize(80, 60)}, std::pair{QSize(50, 50), QSize(50, 38)},
                                           std::pair{QSize(68, 38), QSize(51, 38)}, std::pair{QSize(1000, 900), QSize(320, 240)}),
                         [](const auto &info) {
                             const QSize m = info.param.first;
                             return "Max" + std::to_string(m.width()) + "x" + std::to_string(m.height());
                         });

// Asynchronous requests complete once per time, in request order, off the main thread; an invalid
// time fails only its own request.
TEST(ImageGeneratorTest, AsyncGenerationCompletesOncePerTimeInOrderOffMainThread)
{
    auto generator = generatorFor(zaf::test::sharedFixtureMovie(kMovie), true);
    generator->setMaximumSize(QSize(64, 64));
    QList<MediaTime> times;
    for (int frame : {80, 5, 33, 33, 61, 0, 89, 12})
        times.append(MediaTime::make(frame, 30));
    zaf::test::ImageCompletions completions;
    generator->generateImagesAsynchronouslyForTimes(times, completions.handler());
    generator->generateImagesAsynchronouslyForTimes({MediaTime::invalid(), MediaTime::make(7, 30)}, completions.handler());
    times << MediaTime::invalid() << MediaTime::make(7, 30);
    ASSERT_TRUE(completions.waitFor(times.size()));
    const QList<zaf::test::ImageCompletion> all = completions.all();
    ASSERT_EQ(all.size(), times.size());
    for (int i = 0; i < all.size(); ++i) {
        SCOPED_TRACE(i);
        const auto &c = all[i];
        EXPECT_EQ(c.requestedTime, times[i]);
        EXPECT_FALSE(c.onMainThread);
        if (!times[i].isValid()) {
            EXPECT_EQ(c.result, ImageGenerator::Result::Failed);
            EXPECT_EQ(c.error ? c.error->code : 0, zaf::media::kMediaErrorInvalidArgument);
            continue;
        }
        EXPECT_EQ(c.result, ImageGenerator::Result::Succeeded);
        EXPECT_FALSE(c.error);
        EXPECT_TRUE(c.image.width() <= 64 && c.image.height() <= 64);
        EXPECT_EQ(readFrameNumber(c.image), int(times[i].value));
        EXPECT_EQ(c.actualTime, times[i]);
    }
}

// Cancelling answers every pending request with Cancelled (a later batch cannot have started),
// and requests after it are served normally.
TEST(ImageGeneratorTest, CancelAnswersOnlyThePendingRequests)
{
    auto generator = generatorFor(zaf::test::sharedFixtureMovie(kMovie), true);
    QList<MediaTime> times;
    for (int i = 0; i < 40; ++i)
        times.append(MediaTime::make(89 - (i * 37) % 90, 30)); // jumps around: mostly seeks
    zaf::test::ImageCompletions completions;
    generator->generateImagesAsynchronouslyForTimes(times, completions.handler());
    generator->generateImagesAsynchronouslyForTimes(times, completions.handler());
    generator->cancelAllImageGeneration();
    ASSERT_TRUE(completions.waitFor(2 * times.size()));
    const QList<zaf::test::ImageCompletion> all = completions.all();
    ASSERT_EQ(all.size(), 2 * times.size());
    int cancelled = 0;
    for (int i = 0; i < all.size(); ++i) {
        const auto &c = all[i];
        EXPECT_EQ(c.requestedTime, times[i % times.size()]);
        if (c.result == ImageGenerator::Result::Cancelled) {
            ++cancelled;
            EXPECT_TRUE(c.image.isNull());
            ASSERT_TRUE(c.error);
            EXPECT_EQ(c.error->code, zaf::media::kMediaErrorCancelled);
        } else {
            EXPECT_EQ(c.result, ImageGenerator::Result::Succeeded);
        }
    }
    EXPECT_GE(cancelled, times.size());

    zaf::test::ImageCompletions after;
    generator->generateImagesAsynchronouslyForTimes({MediaTime::make(50, 30)}, after.handler());
    ASSERT_TRUE(after.waitFor(1));
    EXPECT_EQ(after.all()[0].result, ImageGenerator::Result::Succeeded);
    EXPECT_EQ(readFrameNumber(after.all()[0].image), 50);
}

// Pictures of rotated movies stand upright at the scrubber's thumbnail height, unless the preferred
// transform is switched off.
class ImageGeneratorRotationTest : public ::testing::TestWithParam<int> {};

TEST_P(ImageGeneratorRotationTest, PicturesStandUprightUnlessTransformIsSwitchedOff)
{
    const int rotation = GetParam();
    auto generator = generatorFor(zaf::test::sharedFixtureMovie({.seconds = 0.5, .width = 640, .height = 360, .rotation = rotation}));
    generator->setMaximumSize(QSize(0, 76));
    QImage image = generator->copyImageAtTime(MediaTime::make(10, 30), nullptr, nullptr);
    EXPECT_EQ(image.size(), rotation % 180 ? QSize(43, 76) : QSize(135, 76));
    EXPECT_TRUE(zaf::fixture::isUpright(image));
    EXPECT_EQ(readFrameNumber(image), 0);

    generator->setMaximumSize(QSize());
    generator->setAppliesPreferredTrackTransform(false);
    image = generator->copyImageAtTime(MediaTime::make(10, 30), nullptr, nullptr);
    EXPECT_EQ(image.size(), QSize(640, 360));
    EXPECT_EQ(zaf::fixture::isUpright(image), rotation == 0);
}

INSTANTIATE_TEST_SUITE_P(Rotations, ImageGeneratorRotationTest, ::testing::Values(0, 90, 180, 270));

// Files that are no usable movie, and a movie without video, fail every request, asynchronous or
// not, with an error and no picture, and the failure is logged.
std::vector<zaf::test::UnusableMovie> noPictures()
{
    std::vector<zaf::test::UnusableMovie> files = zaf::test::unusableMovies();
    files.push_back({"AudioOnly", [](const zaf::test::ScratchDir &) {
        return zaf::test::sharedFfmpegOutput(zaf::test::words("-f lavfi -i sine=frequency=440:duration=1 -c:a aac"), "m4a");
    }});
    return files;
}

class ImageGeneratorFailureTest : public ::testing::TestWithParam<zaf::test::UnusableMovie> {};

TEST_P(ImageGeneratorFailureTest, FileWithoutPicturesFailsEveryRequest)
{
    zaf::test::ScratchDir dir;
    zaf::test::LogCapture log;
    auto generator = generatorFor(GetParam().make(dir));
    const QList<MediaTime> times = {MediaTime::zero(), MediaTime::make(1, 2), MediaTime::make(5, 1)};
    zaf::test::ImageCompletions completions;
    generator->generateImagesAsynchronouslyForTimes(times, completions.handler());
    ASSERT_TRUE(completions.waitFor(times.size()));
    const auto all = completions.all();
    ASSERT_EQ(all.size(), times.size());
    for (int i = 0; i < all.size(); ++i) {
        EXPECT_EQ(all[i].requestedTime, times[i]);
        EXPECT_EQ(all[i].result, ImageGenerator::Result::Failed);
        EXPECT_TRUE(all[i].image.isNull());
        EXPECT_FALSE(all[i].actualTime.isValid());
        ASSERT_TRUE(all[i].error);
        EXPECT_EQ(all[i].error->domain, "zaf.media");
    }
    EXPECT_FALSE(log.messages(QStringLiteral("zaf.media")).isEmpty());

    MediaTime actual = MediaTime::zero();
    zaf::OptionalError error;
    EXPECT_TRUE(generator->copyImageAtTime(MediaTime::zero(), &actual, &error).isNull());
    EXPECT_TRUE(error);
    EXPECT_FALSE(actual.isValid());
}

INSTANTIATE_TEST_SUITE_P(Files, ImageGeneratorFailureTest, ::testing::ValuesIn(noPictures()), zaf::test::caseName);

} // namespace
