#include "platform/media/export_session.h"
#include "tests/support/cli_tools.h"
#include "tests/platform/media/export_test_helpers.h"
#include "tests/support/media/fixture_movies.h"
#include "tests/support/temp_dir.h"

#include <gtest/gtest.h>

namespace zaf::media {
namespace {

using zaf::fixture::FixtureSpec;
using zaf::fixture::toneFrequency;
using zaf::test::ScratchDir;

// The audio mix that names every audio track of a movie, in order.
AudioMix mixOfAllAudioTracks(const QString &path)
{
    AudioMix mix;
    for (const AssetTrack &track : MediaAsset::assetWithURL(QUrl::fromLocalFile(path))->tracksWithMediaType(MediaType::Audio))
        mix.inputParameters.append(AudioMixInputParameters{track.trackID});
    return mix;
}

class ExportMixTest : public ::testing::Test {
protected:
    QString mixed(const QString &source, const AudioMix &mix, const char *name)
    {
        const QString output = scratch.file(QString::fromLatin1(name));
        auto session = zaf::test::makeSession(source, output);
        session->setAudioMix(mix);
        EXPECT_EQ(zaf::test::runToEnd(session), ExportStatus::Completed)
            << (session->error() ? session->error()->description().toStdString() : std::string());
        return output;
    }
    ScratchDir scratch;
};

TEST_F(ExportMixTest, MixOfTwoTracksGivesOneTrackWithBothTonesAtUnityGainAndCopiesVideo)
{
    const QString source = zaf::test::makeFixtureMovie(scratch.path(), FixtureSpec{.seconds = 3, .audioTracks = 2});
    ASSERT_FALSE(source.isEmpty());
    const AudioMix mix = mixOfAllAudioTracks(source);
    ASSERT_EQ(mix.inputParameters.size(), 2);
    const QString output = mixed(source, mix, "mixed.mp4");

    const QJsonObject probe = zaf::test::ffprobe(output);
    const QList<QJsonObject> audio = zaf::test::probeStreams(probe, QStringLiteral("audio"));
    ASSERT_EQ(audio.size(), 1);
    EXPECT_EQ(audio[0].value(QStringLiteral("codec_name")).toString(), QStringLiteral("aac"));
    EXPECT_EQ(audio[0].value(QStringLiteral("sample_rate")).toString(), QStringLiteral("48000"));
    EXPECT_EQ(audio[0].value(QStringLiteral("channels")).toInt(), 2);
    // Both tones at their own level: summed, not averaged (averaging would halve them to ~0.25).
    EXPECT_GT(zaf::test::toneLevel(output, 0, toneFrequency(0)), 0.4);
    EXPECT_GT(zaf::test::toneLevel(output, 0, toneFrequency(1)), 0.4);
    const double sourceDuration = zaf::test::probeStreams(zaf::test::ffprobe(source), QStringLiteral("audio"))[0]
                                      .value(QStringLiteral("duration")).toString().toDouble();
    EXPECT_NEAR(audio[0].value(QStringLiteral("duration")).toString().toDouble(), sourceDuration, 1024.0 / 48000);

    // The video is the source's, packet for packet.
    EXPECT_EQ(zaf::test::streamMD5(output, QStringLiteral("0:v:0")), zaf::test::streamMD5(source, QStringLiteral("0:v:0")));
    EXPECT_EQ(zaf::test::probeStreams(probe, QStringLiteral("video")).size(), 1);
}

TEST_F(ExportMixTest, MixDropsAudioTracksItDoesNotList)
{
    const QString source = zaf::test::makeFixtureMovie(scratch.path(), FixtureSpec{.seconds = 2, .audioTracks = 2});
    ASSERT_FALSE(source.isEmpty());
    const AudioMix all = mixOfAllAudioTracks(source);
    ASSERT_EQ(all.inputParameters.size(), 2);
    const QString output = mixed(source, AudioMix{{all.inputParameters[1]}}, "second-only.mp4");
    ASSERT_EQ(zaf::test::probeStreams(zaf::test::ffprobe(output), QStringLiteral("audio")).size(), 1);
    EXPECT_GT(zaf::test::toneLevel(output, 0, toneFrequency(1)), 0.4);
    EXPECT_LT(zaf::test::toneLevel(output, 0, toneFrequency(0)), 0.05);
}

TEST_F(ExportMixTest, EmptyMixOfMovieWithoutAudioGivesMovieWithoutAudioTrack)
{
    const QString source = zaf::test::makeFixtureMovie(scratch.path(), FixtureSpec{.seconds = 1, .audioTracks = 0});
    ASSERT_FALSE(source.isEmpty());
    const AudioMix mix = mixOfAllAudioTracks(source);
    ASSERT_TRUE(mix.inputParameters.isEmpty());
    const QString output = mixed(source, mix, "silent.mp4");
    const QJsonObject probe = zaf::test::ffprobe(output);
    EXPECT_TRUE(zaf::test::probeStreams(probe, QStringLiteral("audio")).isEmpty());
    EXPECT_EQ(zaf::test::probeStreams(probe, QStringLiteral("video")).size(), 1);
    EXPECT_EQ(zaf::test::streamMD5(output, QStringLiteral("0:v:0")), zaf::test::streamMD5(source, QStringLiteral("0:v:0")));
}

TEST_F(ExportMixTest, MixOfLoudTracksIsLimitedBelowFullScale)
{
    // Two full-scale square-ish tones in phase would sum to twice full scale without the limiter.
    const QString source = scratch.file(QStringLiteral("loud.mp4"));
    ASSERT_TRUE(zaf::test::cli::ffmpeg(
        {QStringLiteral("-f"), QStringLiteral("lavfi"), QStringLiteral("-i"), QStringLiteral("testsrc2=size=160x120:rate=30:duration=2"),
         QStringLiteral("-f"), QStringLiteral("lavfi"), QStringLiteral("-i"), QStringLiteral("aevalsrc=0.9*sin(2*PI*200*t):s=48000:d=2"),
         QStringLiteral("-f"), QStringLiteral("lavfi"), QStringLiteral("-i"), QStringLiteral("aevalsrc=0.9*sin(2*PI*200*t):s=48000:d=2"),
         QStringLiteral("-map"), QStringLiteral("0"), QStringLiteral("-map"), QStringLiteral("1"), QStringLiteral("-map"), QStringLiteral("2"),
         QStringLiteral("-c:v"), QStringLiteral("libx264"), QStringLiteral("-preset"), QStringLiteral("ultrafast"),
         QStringLiteral("-c:a"), QStringLiteral("pcm_s16le"), QStringLiteral("-f"), QStringLiteral("mov"), source}));
    const QString output = mixed(source, mixOfAllAudioTracks(source), "limited.mp4");
    const zaf::test::cli::Run stats = zaf::test::cli::run(
        QStringLiteral("ffmpeg"), {QStringLiteral("-nostdin"), QStringLiteral("-i"), output, QStringLiteral("-map"), QStringLiteral("0:a"),
                                   QStringLiteral("-af"), QStringLiteral("astats=measure_overall=Peak_level:measure_perchannel=none"),
                                   QStringLiteral("-f"), QStringLiteral("null"), QStringLiteral("-")});
    ASSERT_TRUE(stats.ok()) << stats.err.toStdString();
    const QString text = QString::fromUtf8(stats.err);
    const qsizetype at = text.indexOf(QStringLiteral("Peak level dB:"));
    ASSERT_GE(at, 0) << stats.err.toStdString();
    const double peakDb = text.mid(at + 14).section(u'\n', 0, 0).trimmed().toDouble();
    // Summed: far above a single 0.9 track (-0.9 dB), yet no clipping (0 dB); AAC overshoots a little.
    EXPECT_LT(peakDb, 0.5);
    EXPECT_GT(peakDb, -3.0);
}

} // namespace
} // namespace zaf::media
