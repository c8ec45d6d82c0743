// ImageGenerator on fixture movies whose frames show their own numbers: exact and fast modes,
// maximum sizes, upright pictures of rotated movies, completions and cancellation.

#include "platform/media/image_generator.h"
#include "platform/media/media_asset.h"
#include "platform/media/movie_writer.h"
#include "tests/support/media/fixture_movies.h"
#include "tests/support/media/image_completions.h"
#include "tests/support/temp_dir.h"
#include "tools/fixture/frame_pattern.h"

#include <QUrl>

#include <gtest/gtest.h>

using zaf::media::ImageGenerator;
using zaf::media::MediaAsset;
using zaf::media::MediaTime;

namespace {

std::shared_ptr<ImageGenerator> generatorFor(const QString &path)
{
    return ImageGenerator::imageGeneratorWithAsset(MediaAsset::assetWithURL(QUrl::fromLocalFile(path)));
}

void makeExact(ImageGenerator &generator)
{
    generator.setRequestedTimeToleranceBefore(MediaTime::zero());
    generator.setRequestedTimeToleranceAfter(MediaTime::zero());
}

// 3 s at 30 fps with a keyframe every 30 frames: frames 0..89, sync frames 0, 30 and 60.
class ImageGeneratorTest : public ::testing::Test {
protected:
    static void SetUpTestSuite()
    {
        s_dir = new zaf::test::ScratchDir;
        zaf::fixture::FixtureSpec spec;
        spec.seconds = 3;
        spec.audioTracks = 1;
        s_movie = zaf::test::makeFixtureMovie(s_dir->path(), spec);
    }
    static void TearDownTestSuite()
    {
        delete s_dir;
        s_dir = nullptr;
    }
    void SetUp() override { ASSERT_FALSE(s_movie.isEmpty()); }

    static zaf::test::ScratchDir *s_dir;
    static QString s_movie;
};

zaf::test::ScratchDir *ImageGeneratorTest::s_dir = nullptr;
QString ImageGeneratorTest::s_movie;

} // namespace

TEST_F(ImageGeneratorTest, CopyImageWithZeroToleranceReturnsExactFrameInAnyRequestOrder)
{
    auto generator = generatorFor(s_movie);
    makeExact(*generator);
    // Forwards within a GOP (decoding on), backwards (seeking), across GOPs, and frame boundaries.
    const QList<int> frames = {0, 1, 2, 29, 31, 45, 44, 10, 89, 60, 59, 61, 30, 75, 3};
    for (int frame : frames) {
        for (const MediaTime &time : {MediaTime::make(frame, 30), MediaTime::make(frame * 2 + 1, 60)}) {
            MediaTime actual;
            zaf::OptionalError error;
            const QImage image = generator->copyImageAtTime(time, &actual, &error);
            ASSERT_FALSE(image.isNull()) << frame << ": " << (error ? qPrintable(error->description()) : "");
            EXPECT_FALSE(error);
            EXPECT_EQ(zaf::test::readFrameNumber(image), frame) << "at " << qPrintable(time.debugDescription());
            EXPECT_EQ(actual, MediaTime::make(frame, 30)) << qPrintable(actual.debugDescription());
        }
    }
}

TEST(ImageGeneratorReorderTest, ExactFramesComeBackFromMovieWithReorderedFrames)
{
    // The writer's default preset uses B-frames: decode order differs from presentation order.
    zaf::test::ScratchDir dir;
    const QString path = dir.file(QStringLiteral("bframes.mp4"));
    zaf::media::MovieWriter::Settings settings;
    settings.videoSize = QSize(320, 240);
    settings.gopLength = 25;
    auto created = zaf::media::MovieWriter::create(path, settings);
    ASSERT_TRUE(created.ok());
    for (int n = 0; n < 75; ++n)
        ASSERT_FALSE((*created.value)->appendVideoFrame(zaf::fixture::frameNumberImage(n, 320, 240)));
    ASSERT_FALSE((*created.value)->finish());

    auto generator = generatorFor(path);
    makeExact(*generator);
    for (int frame : {0, 24, 25, 26, 49, 3, 50, 51, 74, 40, 41, 42}) {
        MediaTime actual;
        zaf::OptionalError error;
        const QImage image = generator->copyImageAtTime(MediaTime::make(frame, 30), &actual, &error);
        EXPECT_EQ(zaf::test::readFrameNumber(image), frame);
        EXPECT_EQ(actual, MediaTime::make(frame, 30));
    }
    generator->setRequestedTimeToleranceBefore(MediaTime::positiveInfinity());
    MediaTime actual;
    zaf::OptionalError error;
    EXPECT_EQ(zaf::test::readFrameNumber(generator->copyImageAtTime(MediaTime::make(49, 30), &actual, &error)), 25);
    EXPECT_EQ(zaf::test::readFrameNumber(generator->copyImageAtTime(MediaTime::make(50, 30), &actual, &error)), 50);
}

TEST_F(ImageGeneratorTest, CopyImageWithDefaultToleranceReturnsSyncFrameAtOrBeforeTime)
{
    auto generator = generatorFor(s_movie);
    ASSERT_TRUE(generator->requestedTimeToleranceBefore().isPositiveInfinity());
    const QList<QPair<double, int>> cases = {{0.0, 0}, {0.5, 0}, {0.99, 0}, {1.0, 30}, {1.7, 30}, {2.2, 60}, {2.99, 60}};
    for (const auto &[seconds, syncFrame] : cases) {
        MediaTime actual;
        zaf::OptionalError error;
        const QImage image = generator->copyImageAtTime(MediaTime::fromSeconds(seconds, 600), &actual, &error);
        ASSERT_FALSE(image.isNull()) << seconds;
        const int shown = zaf::test::readFrameNumber(image);
        EXPECT_EQ(shown, syncFrame) << "at " << seconds << " s";
        EXPECT_LE(actual.seconds(), seconds + 1e-9);
        EXPECT_EQ(actual, MediaTime::make(shown, 30));
    }
}

TEST_F(ImageGeneratorTest, ToleranceWindowAcceptsSyncFrameOnlyWhenInside)
{
    auto generator = generatorFor(s_movie);
    generator->setRequestedTimeToleranceBefore(MediaTime::make(1, 2)); // half a second
    generator->setRequestedTimeToleranceAfter(MediaTime::zero());
    MediaTime actual;
    zaf::OptionalError error;
    // 1.4 s: the sync frame at 1.0 s lies within 0.5 s before.
    QImage image = generator->copyImageAtTime(MediaTime::fromSeconds(1.4, 600), &actual, &error);
    EXPECT_EQ(zaf::test::readFrameNumber(image), 30);
    // 1.8 s: it does not, so a frame shown within [1.3, 1.8] comes back.
    image = generator->copyImageAtTime(MediaTime::fromSeconds(1.8, 600), &actual, &error);
    const int shown = zaf::test::readFrameNumber(image);
    EXPECT_GE(shown, 38);
    EXPECT_LE(shown, 54);
    EXPECT_EQ(actual, MediaTime::make(shown, 30));
}

TEST_F(ImageGeneratorTest, TimesOutsideMovieGiveFirstOrLastFrame)
{
    auto generator = generatorFor(s_movie);
    makeExact(*generator);
    MediaTime actual;
    zaf::OptionalError error;
    EXPECT_EQ(zaf::test::readFrameNumber(generator->copyImageAtTime(MediaTime::fromSeconds(-1, 600), &actual, &error)), 0);
    EXPECT_EQ(zaf::test::readFrameNumber(generator->copyImageAtTime(MediaTime::fromSeconds(3.0, 600), &actual, &error)), 89);
    EXPECT_EQ(zaf::test::readFrameNumber(generator->copyImageAtTime(MediaTime::fromSeconds(40, 600), &actual, &error)), 89);
    EXPECT_EQ(actual, MediaTime::make(89, 30));
}

TEST_F(ImageGeneratorTest, MaximumSizeBoundsPictureAndKeepsAspectWithoutUpscaling)
{
    auto generator = generatorFor(s_movie);
    const QList<QPair<QSize, QSize>> cases = {
        {QSize(0, 0), QSize(320, 240)},   {QSize(100, 0), QSize(100, 75)}, {QSize(0, 60), QSize(80, 60)},
        {QSize(50, 50), QSize(50, 38)},   {QSize(68, 38), QSize(51, 38)},  {QSize(1000, 900), QSize(320, 240)},
    };
    for (const auto &[maximum, expected] : cases) {
        generator->setMaximumSize(maximum);
        MediaTime actual;
        zaf::OptionalError error;
        const QImage image = generator->copyImageAtTime(MediaTime::make(45, 30), &actual, &error);
        EXPECT_EQ(image.size(), expected) << "maximum " << maximum.width() << "x" << maximum.height();
        EXPECT_TRUE(image.format() == QImage::Format_RGB32 || image.format() == QImage::Format_ARGB32_Premultiplied);
        EXPECT_EQ(zaf::test::readFrameNumber(image), 30);
    }
}

TEST_F(ImageGeneratorTest, AsyncGenerationCompletesOncePerTimeInOrderOffMainThread)
{
    auto generator = generatorFor(s_movie);
    generator->setMaximumSize(QSize(64, 64));
    makeExact(*generator);
    QList<MediaTime> times;
    for (int frame : {80, 5, 33, 33, 61, 0, 89, 12})
        times.append(MediaTime::make(frame, 30));
    zaf::test::ImageCompletions completions;
    generator->generateImagesAsynchronouslyForTimes(times, completions.handler());
    generator->generateImagesAsynchronouslyForTimes({MediaTime::make(7, 30)}, completions.handler());
    ASSERT_TRUE(completions.waitFor(times.size() + 1));
    const QList<zaf::test::ImageCompletion> all = completions.all();
    ASSERT_EQ(all.size(), times.size() + 1);
    times.append(MediaTime::make(7, 30));
    for (int i = 0; i < all.size(); ++i) {
        const auto &c = all[i];
        EXPECT_EQ(c.requestedTime, times[i]);
        EXPECT_EQ(c.result, ImageGenerator::Result::Succeeded);
        EXPECT_FALSE(c.error);
        EXPECT_FALSE(c.onMainThread);
        EXPECT_LE(c.image.width(), 64);
        EXPECT_LE(c.image.height(), 64);
        EXPECT_EQ(zaf::test::readFrameNumber(c.image), int(times[i].value)) << "completion " << i;
        EXPECT_EQ(c.actualTime, times[i]);
    }
}

TEST_F(ImageGeneratorTest, CancelAnswersPendingRequestsWithCancelledAndLaterRequestsNormally)
{
    auto generator = generatorFor(s_movie);
    makeExact(*generator);
    QList<MediaTime> times;
    for (int i = 0; i < 40; ++i)
        times.append(MediaTime::make(89 - (i * 37) % 90, 30)); // jumps around: mostly seeks
    zaf::test::ImageCompletions completions;
    generator->generateImagesAsynchronouslyForTimes(times, completions.handler());
    generator->generateImagesAsynchronouslyForTimes(times, completions.handler());
    generator->cancelAllImageGeneration();
    ASSERT_TRUE(completions.waitFor(2 * times.size()));
    int cancelled = 0;
    const QList<zaf::test::ImageCompletion> all = completions.all();
    ASSERT_EQ(all.size(), 2 * times.size());
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
    // The second call cannot have started before the cancellation.
    EXPECT_GE(cancelled, times.size());

    zaf::test::ImageCompletions after;
    generator->generateImagesAsynchronouslyForTimes({MediaTime::make(50, 30)}, after.handler());
    ASSERT_TRUE(after.waitFor(1));
    EXPECT_EQ(after.all()[0].result, ImageGenerator::Result::Succeeded);
    EXPECT_EQ(zaf::test::readFrameNumber(after.all()[0].image), 50);
}

class ImageGeneratorRotationTest : public ::testing::TestWithParam<int> {};

TEST_P(ImageGeneratorRotationTest, PicturesStandUprightUnlessTransformIsSwitchedOff)
{
    const int rotation = GetParam();
    zaf::test::ScratchDir dir;
    zaf::fixture::FixtureSpec spec;
    spec.seconds = 0.5;
    spec.width = 640;
    spec.height = 360;
    spec.rotation = rotation;
    const QString movie = zaf::test::makeFixtureMovie(dir.path(), spec);
    ASSERT_FALSE(movie.isEmpty());
    auto generator = generatorFor(movie);
    const bool quarterTurn = rotation % 180 != 0;

    generator->setMaximumSize(QSize(0, 76)); // thumbnail height of the scrubber at scale 2
    MediaTime actual;
    zaf::OptionalError error;
    QImage image = generator->copyImageAtTime(MediaTime::make(10, 30), &actual, &error);
    ASSERT_FALSE(image.isNull());
    EXPECT_EQ(image.size(), quarterTurn ? QSize(43, 76) : QSize(135, 76));
    EXPECT_TRUE(zaf::fixture::isUpright(image));
    EXPECT_EQ(zaf::test::readFrameNumber(image), 0);

    generator->setMaximumSize(QSize());
    generator->setAppliesPreferredTrackTransform(false);
    image = generator->copyImageAtTime(MediaTime::make(10, 30), &actual, &error);
    EXPECT_EQ(image.size(), QSize(640, 360));
    EXPECT_EQ(zaf::fixture::isUpright(image), rotation == 0);
}

INSTANTIATE_TEST_SUITE_P(Rotations, ImageGeneratorRotationTest, ::testing::Values(0, 90, 180, 270));
