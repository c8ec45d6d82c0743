// MediaAsset: its tracks, duration and transform as ffprobe sees them, its failures and threads.
#include "platform/media/media_asset.h"
#include "tests/support/log_capture.h"
#include "tests/support/media/fixture_movies.h"
#include "tests/support/media/unusable_movies.h"
#include "tests/support/temp_dir.h"

#include <QCoreApplication>
#include <QFile>
#include <QFileInfo>
#include <QJsonArray>
#include <QThread>

#include <gtest/gtest.h>

#include <atomic>
#include <future>
#include <thread>

namespace zaf::media {
namespace {

using zaf::test::ffmpeg;
using zaf::test::ScratchDir;
using zaf::test::words;

std::shared_ptr<MediaAsset> openAsset(const QString &path)
{
    return MediaAsset::assetWithURL(QUrl::fromLocalFile(path));
}

// Made by ffmpeg, not by our writer: 2 s of test pattern (libx264, 30 fps) and two AAC tracks, with
// the header (moov) at the end as ffmpeg writes it by default.
QString twoAudioMovie()
{
    return zaf::test::sharedFfmpegOutput(words("-f lavfi -i testsrc2=size=320x240:rate=30 -f lavfi -i sine=frequency=440:sample_rate=48000"
                                               " -f lavfi -i sine=frequency=660:sample_rate=48000 -map 0:v -map 1:a -map 2:a -t 2"
                                               " -c:v libx264 -preset ultrafast -g 30 -pix_fmt yuv420p -c:a aac -ac 2"));
}

// Expects our track to say what ffprobe says about the same stream.
void expectTrackMatchesProbe(const AssetTrack &track, const QJsonObject &stream)
{
    EXPECT_EQ(track.streamIndex, stream["index"].toInt());
    EXPECT_EQ(track.trackID, track.streamIndex + 1);
    EXPECT_EQ(track.codecName, stream["codec_name"].toString());
    const QStringList timeBase = stream["time_base"].toString().split(u'/');
    ASSERT_EQ(timeBase.size(), 2);
    ASSERT_EQ(timeBase[0], QStringLiteral("1"));
    ASSERT_TRUE(track.duration.isNumeric());
    EXPECT_EQ(track.duration.timescale, timeBase[1].toInt());
    EXPECT_EQ(track.duration.value, stream["duration_ts"].toInteger());
    if (stream["codec_type"].toString() == QStringLiteral("video")) {
        EXPECT_EQ(track.mediaType, MediaType::Video);
        EXPECT_EQ(track.naturalSize, QSizeF(stream["width"].toInt(), stream["height"].toInt()));
        EXPECT_NEAR(track.nominalFrameRate, 30.0, 1e-6);
    } else {
        EXPECT_EQ(track.mediaType, MediaType::Audio);
        EXPECT_EQ(track.sampleRate, stream["sample_rate"].toString().toInt());
        EXPECT_EQ(track.channelCount, stream["channels"].toInt());
    }
}

TEST(AffineTransformTest, RotationMatrices)
{
    EXPECT_EQ(AffineTransform::rotation(0, 320, 240), AffineTransform::identity());
    EXPECT_EQ(AffineTransform::rotation(90, 320, 240), (AffineTransform{0, 1, -1, 0, 240, 0}));
    EXPECT_EQ(AffineTransform::rotation(-270, 320, 240), AffineTransform::rotation(90, 320, 240));
}

class QuarterTurn : public ::testing::TestWithParam<int> {};

const auto kDegreesName = [](const auto &info) { return "Degrees" + std::to_string(info.param); };

// A quarter turn tells its angle, gives the shown size, and maps every corner into the shown rectangle.
TEST_P(QuarterTurn, MapsTheFrameOntoTheShownRectangle)
{
    const int degrees = GetParam();
    const AffineTransform t = AffineTransform::rotation(degrees, 320, 240);
    EXPECT_EQ(t.rotationDegrees(), degrees);
    const QSizeF shown = t.mapSize(QSizeF(320, 240));
    EXPECT_EQ(shown, degrees % 180 ? QSizeF(240, 320) : QSizeF(320, 240));
    for (const auto &[x, y] : {std::pair{0.0, 0.0}, {320.0, 0.0}, {0.0, 240.0}, {320.0, 240.0}}) {
        const double mx = t.a * x + t.c * y + t.tx, my = t.b * x + t.d * y + t.ty;
        EXPECT_TRUE(mx >= 0 && my >= 0 && mx <= shown.width() && my <= shown.height()) << x << "," << y;
    }
}

INSTANTIATE_TEST_SUITE_P(Angles, QuarterTurn, ::testing::Values(0, 90, 180, 270), kDegreesName);

// Tracks come in stream order and agree with ffprobe on every field.
TEST(AssetProbeTest, LoadListsTracksInStreamOrderMatchingProbeForTwoAudioTracks)
{
    const auto asset = openAsset(twoAudioMovie());
    EXPECT_FALSE(asset->isLoaded());
    ASSERT_TRUE(asset->load());
    EXPECT_TRUE(asset->isLoaded());
    EXPECT_TRUE(asset->isPlayable());
    EXPECT_FALSE(asset->loadError().has_value());

    const QJsonArray probed = zaf::test::ffprobe(twoAudioMovie())["streams"].toArray();
    const QList<AssetTrack> tracks = asset->tracks();
    ASSERT_EQ(tracks.size(), 3);
    ASSERT_EQ(probed.size(), 3);
    for (int i = 0; i < tracks.size(); ++i) {
        SCOPED_TRACE(i);
        expectTrackMatchesProbe(tracks[i], probed[i].toObject());
    }
    const QList<AssetTrack> audio = asset->tracksWithMediaType(MediaType::Audio);
    ASSERT_EQ(audio.size(), 2);
    EXPECT_EQ(audio[0].trackID, 2);
    EXPECT_EQ(audio[1].trackID, 3);
    ASSERT_EQ(asset->tracksWithMediaType(MediaType::Video).size(), 1);
    EXPECT_EQ(asset->tracksWithMediaType(MediaType::Video)[0].preferredTransform, AffineTransform::identity());
    EXPECT_TRUE(asset->containerName().contains(QStringLiteral("mp4")));
}

// The asset's duration is its longest track's, in that track's timescale.
TEST(AssetProbeTest, DurationIsTheLongestTrackInItsOwnTimescale)
{
    ScratchDir scratch;
    const QString path = scratch.file(QStringLiteral("long-audio.mp4")); // audio a second longer than video
    ASSERT_TRUE(ffmpeg(words("-f lavfi -i testsrc2=size=160x120:rate=30:duration=1 -f lavfi -i sine=frequency=500:duration=2"
                             " -c:v libx264 -preset ultrafast -c:a aac")
                       << path));
    const auto asset = openAsset(path);
    const QList<AssetTrack> tracks = asset->tracks();
    ASSERT_EQ(tracks.size(), 2);
    EXPECT_EQ(asset->duration(), tracks[1].duration);
    EXPECT_EQ(asset->duration().timescale, tracks[1].duration.timescale);
    EXPECT_GT(asset->duration(), tracks[0].duration);
    const double probed = zaf::test::ffprobe(path)["format"].toObject()["duration"].toString().toDouble();
    EXPECT_NEAR(asset->duration().seconds(), probed, 0.05);
}

// A display matrix written by ffmpeg becomes the video track's preferred transform.
class DisplayMatrix : public ::testing::TestWithParam<int> {};

TEST_P(DisplayMatrix, BecomesThePreferredTransform)
{
    const int clockwise = GetParam();
    // ffmpeg turns the stream-copy tag "rotate=R" into a matrix of R degrees counter-clockwise.
    const QString rotated = zaf::test::sharedFfmpegOutput(QStringList{QStringLiteral("-i"), twoAudioMovie()} << words("-map 0 -c copy -metadata:s:v:0")
                                                          << QStringLiteral("rotate=%1").arg(360 - clockwise));
    ASSERT_EQ(zaf::test::probeRotation(zaf::test::probeStreams(rotated, "video").value(0)), clockwise);
    const auto video = openAsset(rotated)->tracksWithMediaType(MediaType::Video);
    ASSERT_EQ(video.size(), 1);
    EXPECT_EQ(video[0].naturalSize, QSizeF(320, 240));
    EXPECT_EQ(video[0].preferredTransform, AffineTransform::rotation(clockwise, 320, 240));
}

INSTANTIATE_TEST_SUITE_P(Angles, DisplayMatrix, ::testing::Values(90, 180, 270), kDegreesName);

// A cover picture is a track of its own kind, not a video track, and the song stays playable.
TEST(AssetProbeTest, CoverArtOfASongIsNotAVideoTrack)
{
    ScratchDir scratch;
    const QString cover = scratch.file(QStringLiteral("cover.png"));
    ASSERT_TRUE(ffmpeg(words("-f lavfi -i color=red:size=64x64 -frames:v 1") << cover));
    const QString path = scratch.file(QStringLiteral("song.m4a"));
    ASSERT_TRUE(ffmpeg(words("-f lavfi -i sine=frequency=300:duration=1 -i") << cover
                       << words("-map 0 -map 1 -c:a aac -c:v png -disposition:v attached_pic") << path));
    const auto asset = openAsset(path);
    ASSERT_TRUE(asset->load());
    ASSERT_EQ(asset->tracks().size(), 2);
    EXPECT_EQ(asset->tracks()[1].mediaType, MediaType::Other);
    EXPECT_TRUE(asset->tracksWithMediaType(MediaType::Video).isEmpty());
    EXPECT_EQ(asset->tracksWithMediaType(MediaType::Audio).size(), 1);
}

// An unusable file fails to load with `code`, and the failure is logged once.
void expectLoadFailure(const QString &path, int code)
{
    zaf::test::LogCapture log;
    const auto asset = openAsset(path);
    EXPECT_FALSE(asset->load());
    EXPECT_TRUE(asset->isLoaded());
    EXPECT_FALSE(asset->isPlayable());
    ASSERT_TRUE(asset->loadError().has_value());
    EXPECT_EQ(asset->loadError()->domain, QString::fromLatin1(kMediaErrorDomain));
    EXPECT_EQ(asset->loadError()->code, code);
    EXPECT_FALSE(asset->duration().isNumeric() && code == kMediaErrorCannotOpen);
    EXPECT_EQ(log.messages(QStringLiteral("zaf.media")).size(), 1);
}

class AssetLoadFailure : public ::testing::TestWithParam<zaf::test::UnusableMovie> {};

TEST_P(AssetLoadFailure, CannotOpen)
{
    ScratchDir scratch;
    expectLoadFailure(GetParam().make(scratch), kMediaErrorCannotOpen);
}

INSTANTIATE_TEST_SUITE_P(Files, AssetLoadFailure, ::testing::ValuesIn(zaf::test::unusableMovies()), zaf::test::caseName);

TEST(AssetProbeTest, SubtitlesAloneAreNoTracks)
{
    ScratchDir scratch;
    QFile srt(scratch.file("subs.srt"));
    ASSERT_TRUE(srt.open(QIODevice::WriteOnly) && srt.write("1\n00:00:00,000 --> 00:00:01,000\nhello\n\n") > 0);
    srt.close();
    ASSERT_TRUE(ffmpeg(QStringList{"-i", srt.fileName(), "-c:s", "srt", scratch.file("subs.mkv")}));
    expectLoadFailure(scratch.file("subs.mkv"), kMediaErrorNoTracks);
}

// The asynchronous load completes off the main thread even when the asset is released first.
TEST(AssetProbeTest, LoadAsynchronouslyCompletesOffTheMainThreadEvenWhenAssetIsReleased)
{
    std::promise<bool> onMainThread;
    auto future = onMainThread.get_future();
    auto asset = openAsset(twoAudioMovie());
    std::weak_ptr<MediaAsset> weak = asset;
    asset->loadAsynchronously([&onMainThread, weak] {
        onMainThread.set_value(QThread::currentThread() == qApp->thread());
        if (auto a = weak.lock()) {
            EXPECT_TRUE(a->isLoaded());
        }
    });
    asset.reset();
    ASSERT_EQ(future.wait_for(std::chrono::seconds(30)), std::future_status::ready);
    EXPECT_FALSE(future.get());
}

TEST(AssetProbeTest, AssetAnswersFromAnyThread)
{
    auto asset = openAsset(twoAudioMovie());
    std::atomic<int> playable{0};
    std::vector<std::thread> readers;
    for (int i = 0; i < 4; ++i)
        readers.emplace_back([&] { playable += asset->isPlayable() ? 1 : 0; });
    for (auto &t : readers)
        t.join();
    EXPECT_EQ(playable.load(), 4);
}

} // namespace
} // namespace zaf::media
