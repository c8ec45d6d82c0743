// The fixture generator and its frame-number pattern: what other media tests rely on to tell
// frames apart, to check pictures stand upright and to tell audio tracks apart.

#include "tests/support/media/fixture_movies.h"
#include "tests/support/temp_dir.h"
#include "tools/fixture/fixture_movie.h"
#include "tools/fixture/frame_pattern.h"

#include <QFileInfo>
#include <QTransform>

#include <gtest/gtest.h>

namespace fx = zaf::fixture;

TEST(FramePatternTest, ReadFrameNumberReturnsDrawnNumberAtManySizes)
{
    const QList<int> numbers = {0, 1, 2, 255, 256, 4097, 30000, 43690, 65535};
    const QList<QSize> sizes = {QSize(1920, 1080), QSize(320, 240), QSize(64, 36), QSize(28, 38), QSize(1080, 1920)};
    for (const QSize &size : sizes)
        for (int n : numbers)
            EXPECT_EQ(fx::readFrameNumber(fx::frameNumberImage(n, size.width(), size.height())), n)
                << n << " at " << size.width() << "x" << size.height();
}

TEST(FramePatternTest, ReadFrameNumberSurvivesSmoothScalingToThumbnailSize)
{
    for (int n : {12345, 54321, 7}) {
        const QImage big = fx::frameNumberImage(n, 1920, 1080);
        const QImage thumb = big.scaled(68, 38, Qt::IgnoreAspectRatio, Qt::SmoothTransformation);
        EXPECT_EQ(fx::readFrameNumber(thumb), n);
        EXPECT_TRUE(fx::isUpright(thumb));
    }
}

TEST(FramePatternTest, TurnedOrMirroredPictureIsNotUprightAndReadsNoNumber)
{
    const QImage upright = fx::frameNumberImage(4242, 320, 240);
    ASSERT_TRUE(fx::isUpright(upright));
    for (int degrees : {90, 180, 270}) {
        const QImage turned = upright.transformed(QTransform().rotate(degrees));
        EXPECT_FALSE(fx::isUpright(turned)) << degrees;
        EXPECT_EQ(fx::readFrameNumber(turned), -1) << degrees;
    }
    EXPECT_FALSE(fx::isUpright(upright.mirrored(true, false)));
    EXPECT_FALSE(fx::isUpright(upright.mirrored(false, true)));
}

TEST(FramePatternTest, ReadFrameNumberRejectsPicturesWithoutPattern)
{
    QImage black(320, 240, QImage::Format_RGB32);
    black.fill(Qt::black);
    EXPECT_EQ(fx::readFrameNumber(black), -1);
    QImage grey(320, 240, QImage::Format_RGB32);
    grey.fill(QColor(128, 128, 128));
    fx::drawFrameNumber(grey, 9); // then wash the bit cells out to grey
    for (int y = 48; y < 240; ++y)
        for (int x = 0; x < 320; ++x)
            grey.setPixel(x, y, qRgb(128, 128, 128));
    EXPECT_TRUE(fx::isUpright(grey));
    EXPECT_EQ(fx::readFrameNumber(grey), -1);
    EXPECT_EQ(fx::readFrameNumber(QImage()), -1);
    EXPECT_FALSE(fx::isUpright(QImage(3, 3, QImage::Format_RGB32)));
}

TEST(FixtureMovieTest, ToneFrequenciesAreDistinctAndNoHarmonicsOfEachOther)
{
    for (int i = 0; i < 6; ++i)
        for (int j = 0; j < 6; ++j) {
            if (i == j)
                continue;
            const double ratio = fx::toneFrequency(i) / fx::toneFrequency(j);
            EXPECT_GT(std::abs(ratio - std::round(ratio)), 0.05) << i << " vs " << j;
        }
    EXPECT_NE(fx::toneFrequency(6), fx::toneFrequency(7));
}

TEST(FixtureMovieTest, WriteFixtureMovieNumbersFramesAndTonesTracks)
{
    zaf::test::ScratchDir dir;
    fx::FixtureSpec spec;
    spec.seconds = 1.5;
    spec.fps = 20;
    spec.audioTracks = 2;
    spec.channels = 1;
    spec.gop = 7;
    const QString path = zaf::test::makeFixtureMovie(dir.path(), spec);
    ASSERT_FALSE(path.isEmpty());
    QList<int> expected;
    for (int i = 0; i < 30; ++i)
        expected.append(i);
    EXPECT_EQ(zaf::test::readFrameNumbers(path), expected);
    EXPECT_EQ(zaf::test::keyFrameIndexes(path), QList<int>({0, 7, 14, 21, 28}));
    EXPECT_NEAR(zaf::test::toneLevel(path, 0, 440), 0.5, 0.05);
    EXPECT_NEAR(zaf::test::toneLevel(path, 1, 660), 0.5, 0.05);
    EXPECT_LT(zaf::test::toneLevel(path, 0, 660), 0.02);
    EXPECT_LT(zaf::test::toneLevel(path, 1, 440), 0.02);
}

class FixtureRotationTest : public ::testing::TestWithParam<int> {};

TEST_P(FixtureRotationTest, RotatedFixtureShowsUprightNumberedFramesWhenDisplayed)
{
    zaf::test::ScratchDir dir;
    fx::FixtureSpec spec;
    spec.seconds = 0.2;
    spec.rotation = GetParam();
    spec.audioTracks = 0;
    const QString path = zaf::test::makeFixtureMovie(dir.path(), spec);
    ASSERT_FALSE(path.isEmpty());
    const QList<QJsonObject> video = zaf::test::probeStreams(zaf::test::ffprobe(path), "video");
    ASSERT_EQ(video.size(), 1);
    EXPECT_EQ(video[0].value("width").toInt(), 320);
    EXPECT_EQ(video[0].value("height").toInt(), 240);
    EXPECT_EQ(zaf::test::probeRotation(video[0]), spec.rotation);
    EXPECT_EQ(zaf::test::readFrameNumbers(path), QList<int>({0, 1, 2, 3, 4, 5}));
}

INSTANTIATE_TEST_SUITE_P(Rotations, FixtureRotationTest, ::testing::Values(0, 90, 180, 270));

TEST(FixtureMovieTest, MakeFixtureMovieGivesEachCallItsOwnFile)
{
    zaf::test::ScratchDir dir;
    fx::FixtureSpec spec;
    spec.seconds = 0.1;
    const QString a = zaf::test::makeFixtureMovie(dir.path(), spec);
    const QString b = zaf::test::makeFixtureMovie(dir.path(), spec);
    ASSERT_FALSE(a.isEmpty());
    ASSERT_FALSE(b.isEmpty());
    EXPECT_NE(a, b);
    EXPECT_TRUE(QFileInfo::exists(a) && QFileInfo::exists(b));
}
