#include "platform/media/media_asset.h"
#include "tests/support/cli_tools.h"
#include "tests/support/log_capture.h"
#include "tests/support/temp_dir.h"

#include <QFile>
#include <QCoreApplication>
#include <QThread>

#include <gtest/gtest.h>

#include <atomic>
#include <cmath>
#include <future>
#include <thread>

namespace zaf::media {
namespace {

using zaf::test::ScratchDir;
namespace cli = zaf::test::cli;

std::shared_ptr<MediaAsset> openAsset(const QString &path)
{
    return MediaAsset::assetWithURL(QUrl::fromLocalFile(path));
}

// Expects our track to say what ffprobe says about the same stream.
void expectTrackMatchesProbe(const AssetTrack &track, const QJsonObject &stream)
{
    EXPECT_EQ(track.streamIndex, stream.value(QStringLiteral("index")).toInt());
    EXPECT_EQ(track.trackID, track.streamIndex + 1);
    EXPECT_EQ(track.codecName, stream.value(QStringLiteral("codec_name")).toString());
    const QStringList timeBase = stream.value(QStringLiteral("time_base")).toString().split(u'/');
    ASSERT_EQ(timeBase.size(), 2);
    ASSERT_EQ(timeBase[0], QStringLiteral("1"));
    ASSERT_TRUE(track.duration.isNumeric());
    EXPECT_EQ(track.duration.timescale, timeBase[1].toInt());
    EXPECT_EQ(track.duration.value, stream.value(QStringLiteral("duration_ts")).toInteger());
    const QString type = stream.value(QStringLiteral("codec_type")).toString();
    if (type == QStringLiteral("video")) {
        EXPECT_EQ(track.mediaType, MediaType::Video);
        EXPECT_EQ(track.naturalSize, QSizeF(stream.value(QStringLiteral("width")).toInt(),
                                            stream.value(QStringLiteral("height")).toInt()));
        EXPECT_NEAR(track.nominalFrameRate, 30.0, 1e-6);
    } else if (type == QStringLiteral("audio")) {
        EXPECT_EQ(track.mediaType, MediaType::Audio);
        EXPECT_EQ(track.sampleRate, stream.value(QStringLiteral("sample_rate")).toString().toInt());
        EXPECT_EQ(track.channelCount, stream.value(QStringLiteral("channels")).toInt());
    }
}

TEST(AffineTransformTest, RotationByQuarterTurnsGivesUprightTransformsInPositiveQuadrant)
{
    EXPECT_EQ(AffineTransform::rotation(0, 320, 240), AffineTransform::identity());
    EXPECT_EQ(AffineTransform::rotation(90, 320, 240), (AffineTransform{0, 1, -1, 0, 240, 0}));
    EXPECT_EQ(AffineTransform::rotation(-270, 320, 240), AffineTransform::rotation(90, 320, 240));
    for (int degrees : {0, 90, 180, 270}) {
        const AffineTransform t = AffineTransform::rotation(degrees, 320, 240);
        EXPECT_EQ(t.rotationDegrees(), degrees);
        const QSizeF shown = t.mapSize(QSizeF(320, 240));
        EXPECT_EQ(shown, degrees % 180 ? QSizeF(240, 320) : QSizeF(320, 240));
        // Every corner of the picture lands inside the shown rectangle.
        for (const auto &[x, y] : {std::pair{0.0, 0.0}, {320.0, 0.0}, {0.0, 240.0}, {320.0, 240.0}}) {
            const double mx = t.a * x + t.c * y + t.tx, my = t.b * x + t.d * y + t.ty;
            EXPECT_GE(mx, 0);
            EXPECT_GE(my, 0);
            EXPECT_LE(mx, shown.width());
            EXPECT_LE(my, shown.height());
        }
    }
    // A 90 degree turn clockwise brings the picture's top-left corner to the top-right.
    const AffineTransform quarter = AffineTransform::rotation(90, 320, 240);
    EXPECT_EQ(quarter.a * 0 + quarter.c * 0 + quarter.tx, 240);
}

class AssetProbeTest : public ::testing::Test {
protected:
    ScratchDir scratch;
};

TEST_F(AssetProbeTest, LoadListsTracksInStreamOrderMatchingProbeForTwoAudioTracks)
{
    const QString path = scratch.file(QStringLiteral("two-audio.mp4"));
    ASSERT_TRUE(cli::makeMovie(path, 2.0, {440, 660}));
    const auto asset = openAsset(path);
    EXPECT_FALSE(asset->isLoaded());
    ASSERT_TRUE(asset->load());
    EXPECT_TRUE(asset->isLoaded());
    EXPECT_TRUE(asset->isPlayable());
    EXPECT_FALSE(asset->loadError().has_value());

    const QJsonArray probed = cli::streams(path);
    const QList<AssetTrack> tracks = asset->tracks();
    ASSERT_EQ(tracks.size(), probed.size());
    ASSERT_EQ(tracks.size(), 3);
    for (int i = 0; i < tracks.size(); ++i) {
        SCOPED_TRACE(i);
        expectTrackMatchesProbe(tracks[i], probed[i].toObject());
    }
    const QList<AssetTrack> audio = asset->tracksWithMediaType(MediaType::Audio);
    ASSERT_EQ(audio.size(), 2);
    EXPECT_EQ(audio[0].trackID, 2);
    EXPECT_EQ(audio[1].trackID, 3);
    EXPECT_EQ(asset->tracksWithMediaType(MediaType::Video).size(), 1);
    EXPECT_EQ(asset->tracksWithMediaType(MediaType::Video)[0].preferredTransform, AffineTransform::identity());
    EXPECT_TRUE(asset->containerName().contains(QStringLiteral("mp4")));
}

TEST_F(AssetProbeTest, DurationIsTheLongestTrackInItsOwnTimescale)
{
    // The audio runs a second longer than the video.
    const QString path = scratch.file(QStringLiteral("long-audio.mp4"));
    ASSERT_TRUE(cli::ffmpeg({QStringLiteral("-f"), QStringLiteral("lavfi"), QStringLiteral("-i"),
                             QStringLiteral("testsrc2=size=160x120:rate=30:duration=1"), QStringLiteral("-f"),
                             QStringLiteral("lavfi"), QStringLiteral("-i"), QStringLiteral("sine=frequency=500:duration=2"),
                             QStringLiteral("-c:v"), QStringLiteral("libx264"), QStringLiteral("-preset"),
                             QStringLiteral("ultrafast"), QStringLiteral("-c:a"), QStringLiteral("aac"), path}));
    const auto asset = openAsset(path);
    const QList<AssetTrack> tracks = asset->tracks();
    ASSERT_EQ(tracks.size(), 2);
    const AssetTrack &audio = tracks[1];
    EXPECT_EQ(asset->duration(), audio.duration);
    EXPECT_EQ(asset->duration().timescale, audio.duration.timescale);
    EXPECT_GT(asset->duration(), tracks[0].duration);
    const double probedSeconds = cli::probe(path).value(QStringLiteral("format")).toObject()
                                     .value(QStringLiteral("duration")).toString().toDouble();
    EXPECT_NEAR(asset->duration().seconds(), probedSeconds, 0.05);
}

TEST_F(AssetProbeTest, PreferredTransformFollowsDisplayMatrixForEachRotation)
{
    const QString plain = scratch.file(QStringLiteral("plain.mp4"));
    ASSERT_TRUE(cli::makeMovie(plain, 0.5, {}, QStringLiteral("320x240")));
    for (int clockwise : {90, 180, 270}) {
        SCOPED_TRACE(clockwise);
        const QString rotated = scratch.file(QStringLiteral("rot%1.mp4").arg(clockwise));
        ASSERT_TRUE(cli::rotateCopy(plain, rotated, clockwise));
        const auto videoStreams = cli::streamsOfType(rotated, QStringLiteral("video"));
        ASSERT_EQ(videoStreams.size(), 1);
        // ffprobe reports counter-clockwise degrees.
        ASSERT_EQ(((-cli::probedRotation(videoStreams[0])) % 360 + 360) % 360, clockwise);

        const auto video = openAsset(rotated)->tracksWithMediaType(MediaType::Video);
        ASSERT_EQ(video.size(), 1);
        EXPECT_EQ(video[0].naturalSize, QSizeF(320, 240));
        EXPECT_EQ(video[0].preferredTransform, AffineTransform::rotation(clockwise, 320, 240));
        EXPECT_EQ(video[0].preferredTransform.rotationDegrees(), clockwise);
        const QSizeF shown = video[0].preferredTransform.mapSize(video[0].naturalSize);
        EXPECT_EQ(shown, clockwise == 180 ? QSizeF(320, 240) : QSizeF(240, 320));
    }
    const auto clockwise90 = openAsset(scratch.file(QStringLiteral("rot90.mp4")))->tracksWithMediaType(MediaType::Video);
    ASSERT_EQ(clockwise90.size(), 1);
    EXPECT_EQ(clockwise90[0].preferredTransform, (AffineTransform{0, 1, -1, 0, 240, 0}));
}

TEST_F(AssetProbeTest, AudioOnlyFileIsPlayableAndCoverArtIsNotAVideoTrack)
{
    const QString cover = scratch.file(QStringLiteral("cover.png"));
    ASSERT_TRUE(cli::ffmpeg({QStringLiteral("-f"), QStringLiteral("lavfi"), QStringLiteral("-i"),
                             QStringLiteral("color=red:size=64x64"), QStringLiteral("-frames:v"), QStringLiteral("1"), cover}));
    const QString path = scratch.file(QStringLiteral("song.m4a"));
    ASSERT_TRUE(cli::ffmpeg({QStringLiteral("-f"), QStringLiteral("lavfi"), QStringLiteral("-i"),
                             QStringLiteral("sine=frequency=300:duration=1"), QStringLiteral("-i"), cover,
                             QStringLiteral("-map"), QStringLiteral("0"), QStringLiteral("-map"), QStringLiteral("1"),
                             QStringLiteral("-c:a"), QStringLiteral("aac"), QStringLiteral("-c:v"), QStringLiteral("png"),
                             QStringLiteral("-disposition:v"), QStringLiteral("attached_pic"), path}));
    const auto asset = openAsset(path);
    ASSERT_TRUE(asset->load());
    ASSERT_EQ(asset->tracks().size(), 2);
    EXPECT_EQ(asset->tracks()[1].mediaType, MediaType::Other);
    EXPECT_TRUE(asset->tracksWithMediaType(MediaType::Video).isEmpty());
    EXPECT_EQ(asset->tracksWithMediaType(MediaType::Audio).size(), 1);
}

struct BadFile {
    const char *name;
    std::function<QString(const ScratchDir &)> make;
    int expectedCode;
};

TEST_F(AssetProbeTest, LoadFailsWithLoggedErrorForMissingEmptyTruncatedAndNonMovieFiles)
{
    const QString good = scratch.file(QStringLiteral("good.mp4"));
    ASSERT_TRUE(cli::makeMovie(good, 1.0, {440}));
    const QList<BadFile> cases{
        {"missing", [](const ScratchDir &s) { return s.file(QStringLiteral("nothing-here.mp4")); }, kMediaErrorCannotOpen},
        {"empty", [](const ScratchDir &s) { return s.write(QStringLiteral("empty.mp4"), 0); }, kMediaErrorCannotOpen},
        {"text", [](const ScratchDir &s) { return s.write(QStringLiteral("text.mp4"), 5000); }, kMediaErrorCannotOpen},
        {"directory", [](const ScratchDir &s) { return s.path(); }, kMediaErrorCannotOpen},
        {"truncated",
         [&good](const ScratchDir &s) {
             QFile in(good);
             in.open(QIODevice::ReadOnly);
             const QString path = s.file(QStringLiteral("truncated.mp4"));
             QFile out(path);
             out.open(QIODevice::WriteOnly);
             out.write(in.read(in.size() / 2)); // the header (moov) sits at the end and is lost
             return path;
         },
         kMediaErrorCannotOpen},
        {"subtitles only",
         [](const ScratchDir &s) {
             const QString srt = s.file(QStringLiteral("subs.srt"));
             QFile f(srt);
             f.open(QIODevice::WriteOnly);
             f.write("1\n00:00:00,000 --> 00:00:01,000\nhello\n\n");
             f.close();
             const QString path = s.file(QStringLiteral("subs.mkv"));
             cli::ffmpeg({QStringLiteral("-i"), srt, QStringLiteral("-c:s"), QStringLiteral("srt"), path});
             return path;
         },
         kMediaErrorNoTracks},
    };
    for (const BadFile &bad : cases) {
        SCOPED_TRACE(bad.name);
        zaf::test::LogCapture log;
        const auto asset = openAsset(bad.make(scratch));
        EXPECT_FALSE(asset->load());
        EXPECT_TRUE(asset->isLoaded());
        EXPECT_FALSE(asset->isPlayable());
        ASSERT_TRUE(asset->loadError().has_value());
        EXPECT_EQ(asset->loadError()->domain, QString::fromLatin1(kMediaErrorDomain));
        EXPECT_EQ(asset->loadError()->code, bad.expectedCode);
        EXPECT_FALSE(asset->duration().isNumeric() && bad.expectedCode == kMediaErrorCannotOpen);
        // One logged error, however many times the answers are read.
        EXPECT_EQ(log.messages(QStringLiteral("zaf.media")).size(), 1);
    }
}

TEST_F(AssetProbeTest, LoadAsynchronouslyCompletesOffTheMainThreadEvenWhenAssetIsReleased)
{
    const QString path = scratch.file(QStringLiteral("async.mp4"));
    ASSERT_TRUE(cli::makeMovie(path, 0.5, {440}));
    std::promise<bool> onMainThread;
    auto future = onMainThread.get_future();
    auto asset = openAsset(path);
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

    // Loaded once: later reads answer the same and from any thread.
    auto again = openAsset(path);
    std::atomic<int> playable{0};
    std::vector<std::thread> readers;
    for (int i = 0; i < 4; ++i)
        readers.emplace_back([&] { playable += again->isPlayable() ? 1 : 0; });
    for (auto &t : readers)
        t.join();
    EXPECT_EQ(playable.load(), 4);
}

} // namespace
} // namespace zaf::media
