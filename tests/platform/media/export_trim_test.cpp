#include "platform/media/export_session.h"
#include "tests/support/cli_tools.h"
#include "tests/platform/media/export_test_helpers.h"
#include "tests/support/media/fixture_movies.h"
#include "tests/support/temp_dir.h"

#include <QFile>

#include <gtest/gtest.h>

namespace zaf::media {
namespace {

using zaf::fixture::FixtureSpec;
using zaf::test::ScratchDir;

constexpr double kAacFrameSeconds = 1024.0 / 48000.0;

double streamSeconds(const QJsonObject &stream, const char *key)
{
    return stream.value(QLatin1String(key)).toString().toDouble();
}

class ExportTrimTest : public ::testing::Test {
protected:
    QString trim(const QString &source, const MediaTime &start, const MediaTime &end, const char *name)
    {
        const QString output = scratch.file(QString::fromLatin1(name));
        auto session = zaf::test::makeSession(source, output);
        session->setTimeRange(MediaTimeRange::fromStartEnd(start, end));
        EXPECT_EQ(zaf::test::runToEnd(session), ExportStatus::Completed)
            << (session->error() ? session->error()->description().toStdString() : std::string());
        EXPECT_FLOAT_EQ(session->progress(), 1.0f);
        return output;
    }
    ScratchDir scratch;
};

TEST_F(ExportTrimTest, TrimTwoToSevenSecondsKeepsFrames60To209AndEveryAudioTrackInSync)
{
    const QString source = zaf::test::makeFixtureMovie(scratch.path(), FixtureSpec{.seconds = 10, .audioTracks = 2});
    ASSERT_FALSE(source.isEmpty());
    // The timescale the editor's player uses (nanoseconds).
    const QString output = trim(source, MediaTime::make(2'000'000'000, 1'000'000'000),
                                MediaTime::make(7'000'000'000, 1'000'000'000), "trim.mp4");

    const QList<int> frames = zaf::test::readFrameNumbers(output);
    ASSERT_EQ(frames.size(), 150);
    EXPECT_EQ(frames.first(), 60);
    EXPECT_EQ(frames.last(), 209);
    for (int i = 0; i < frames.size(); ++i)
        ASSERT_EQ(frames[i], 60 + i) << "at output frame " << i;

    const QJsonObject probe = zaf::test::ffprobe(output);
    const QList<QJsonObject> video = zaf::test::probeStreams(probe, QStringLiteral("video"));
    const QList<QJsonObject> audio = zaf::test::probeStreams(probe, QStringLiteral("audio"));
    ASSERT_EQ(video.size(), 1);
    ASSERT_EQ(audio.size(), 2);
    EXPECT_EQ(video[0].value(QStringLiteral("codec_name")).toString(), QStringLiteral("h264"));
    EXPECT_EQ(video[0].value(QStringLiteral("width")).toInt(), 320);
    EXPECT_EQ(video[0].value(QStringLiteral("height")).toInt(), 240);
    EXPECT_EQ(video[0].value(QStringLiteral("avg_frame_rate")).toString(), QStringLiteral("30/1"));
    EXPECT_NEAR(streamSeconds(video[0], "start_time"), 0.0, 1e-3);
    const double videoSeconds = streamSeconds(video[0], "duration");
    EXPECT_NEAR(videoSeconds, 5.0, 1.0 / 30 + 1e-3);
    for (int k = 0; k < 2; ++k) {
        SCOPED_TRACE(k);
        EXPECT_EQ(audio[k].value(QStringLiteral("codec_name")).toString(), QStringLiteral("aac"));
        EXPECT_EQ(audio[k].value(QStringLiteral("sample_rate")).toString(), QStringLiteral("48000"));
        EXPECT_NEAR(streamSeconds(audio[k], "start_time"), 0.0, kAacFrameSeconds);
        EXPECT_NEAR(streamSeconds(audio[k], "duration"), videoSeconds, kAacFrameSeconds);
        // Each track still carries its own tone and not the other's.
        EXPECT_GT(zaf::test::toneLevel(output, k, zaf::fixture::toneFrequency(k)), 0.35);
        EXPECT_LT(zaf::test::toneLevel(output, k, zaf::fixture::toneFrequency(1 - k)), 0.05);
    }
}

TEST_F(ExportTrimTest, TrimStartingBetweenKeyframesBeginsWithFrameShownAtStart)
{
    const QString source = zaf::test::makeFixtureMovie(scratch.path(), FixtureSpec{.seconds = 3, .audioTracks = 1});
    ASSERT_FALSE(source.isEmpty());
    // 1.12 s falls inside frame 33 (1.100 s .. 1.133 s); keyframes sit at 0, 30 and 60.
    const QString output = trim(source, MediaTime::make(112, 100), MediaTime::make(2, 1), "mid-gop.mp4");
    const QList<int> frames = zaf::test::readFrameNumbers(output);
    ASSERT_FALSE(frames.isEmpty());
    EXPECT_EQ(frames.first(), 33);
    EXPECT_EQ(frames.last(), 59);
    EXPECT_EQ(frames.size(), 27);
    const QList<QJsonObject> audio = zaf::test::probeStreams(zaf::test::ffprobe(output), QStringLiteral("audio"));
    ASSERT_EQ(audio.size(), 1);
    EXPECT_NEAR(streamSeconds(audio[0], "duration"), 0.88, kAacFrameSeconds);
}

TEST_F(ExportTrimTest, TrimOfSourceWithBFramesIsFrameAccurate)
{
    const QString fixture = zaf::test::makeFixtureMovie(scratch.path(), FixtureSpec{.seconds = 4, .audioTracks = 1, .gop = 60});
    ASSERT_FALSE(fixture.isEmpty());
    // Re-encoded with reordered frames (B-frames) and an edit list, as camera and recorder files have.
    const QString source = scratch.file(QStringLiteral("bframes.mp4"));
    ASSERT_TRUE(zaf::test::cli::ffmpeg({QStringLiteral("-i"), fixture, QStringLiteral("-map"), QStringLiteral("0"),
                                        QStringLiteral("-c:v"), QStringLiteral("libx264"), QStringLiteral("-bf"), QStringLiteral("3"),
                                        QStringLiteral("-g"), QStringLiteral("60"), QStringLiteral("-crf"), QStringLiteral("12"),
                                        QStringLiteral("-c:a"), QStringLiteral("copy"), source}));
    const QString output = trim(source, MediaTime::make(2525, 1000), MediaTime::make(3600, 1000), "bframes-cut.mp4");
    const QList<int> frames = zaf::test::readFrameNumbers(output);
    ASSERT_EQ(frames.size(), 33); // frames 75 (2.500 s .. 2.533 s) to 107 (3.567 s .. 3.600 s)
    for (int i = 0; i < frames.size(); ++i)
        ASSERT_EQ(frames[i], 75 + i) << "at output frame " << i;
}

TEST_F(ExportTrimTest, TrimOfRotatedMovieKeepsRotationAndUprightFrames)
{
    const QString source = zaf::test::makeFixtureMovie(
        scratch.path(), FixtureSpec{.seconds = 2, .width = 320, .height = 240, .audioTracks = 0, .rotation = 90});
    ASSERT_FALSE(source.isEmpty());
    const QString output = trim(source, MediaTime::make(1, 2), MediaTime::make(3, 2), "rotated.mp4");
    const QList<QJsonObject> video = zaf::test::probeStreams(zaf::test::ffprobe(output), QStringLiteral("video"));
    ASSERT_EQ(video.size(), 1);
    EXPECT_EQ(zaf::test::probeRotation(video[0]), 90);
    EXPECT_EQ(video[0].value(QStringLiteral("width")).toInt(), 320);
    EXPECT_EQ(video[0].value(QStringLiteral("height")).toInt(), 240);
    const QList<int> frames = zaf::test::readFrameNumbers(output);
    ASSERT_EQ(frames.size(), 30);
    EXPECT_EQ(frames.first(), 15);
    EXPECT_EQ(frames.last(), 44);

    const auto track = MediaAsset::assetWithURL(QUrl::fromLocalFile(output))->tracksWithMediaType(MediaType::Video);
    ASSERT_EQ(track.size(), 1);
    EXPECT_EQ(track[0].preferredTransform, AffineTransform::rotation(90, 320, 240));
}

TEST_F(ExportTrimTest, TrimEndingPastMovieEndStopsAtLastFrame)
{
    const QString source = zaf::test::makeFixtureMovie(scratch.path(), FixtureSpec{.seconds = 2, .audioTracks = 1});
    ASSERT_FALSE(source.isEmpty());
    const QString output = trim(source, MediaTime::make(1, 1), MediaTime::make(30, 1), "tail.mp4");
    const QList<int> frames = zaf::test::readFrameNumbers(output);
    ASSERT_EQ(frames.size(), 30);
    EXPECT_EQ(frames.first(), 30);
    EXPECT_EQ(frames.last(), 59);
}

TEST_F(ExportTrimTest, TrimWithAudioMixGivesOneMixedTrackCutToTheRange)
{
    const QString source = zaf::test::makeFixtureMovie(scratch.path(), FixtureSpec{.seconds = 4, .audioTracks = 2});
    ASSERT_FALSE(source.isEmpty());
    const QString output = scratch.file(QStringLiteral("trim-mix.mp4"));
    auto session = zaf::test::makeSession(source, output);
    session->setTimeRange(MediaTimeRange::fromStartEnd(MediaTime::make(1, 1), MediaTime::make(3, 1)));
    session->setAudioMix(AudioMix{{{2}, {3}}});
    ASSERT_EQ(zaf::test::runToEnd(session), ExportStatus::Completed);
    const QList<QJsonObject> audio = zaf::test::probeStreams(zaf::test::ffprobe(output), QStringLiteral("audio"));
    ASSERT_EQ(audio.size(), 1);
    EXPECT_NEAR(streamSeconds(audio[0], "duration"), 2.0, kAacFrameSeconds);
    EXPECT_GT(zaf::test::toneLevel(output, 0, zaf::fixture::toneFrequency(0)), 0.35);
    EXPECT_GT(zaf::test::toneLevel(output, 0, zaf::fixture::toneFrequency(1)), 0.35);
    EXPECT_EQ(zaf::test::readFrameNumbers(output).size(), 60);
}

} // namespace
} // namespace zaf::media
