// MovieWriter, checked from the outside: ffprobe describes what it wrote, ffmpeg decodes the
// frames (their numbers must come back in order) and the tones of every audio track.

#include "platform/media/media_asset.h"
#include "platform/media/movie_writer.h"
#include "tests/support/log_capture.h"
#include "tests/support/media/fixture_movies.h"
#include "tests/support/temp_dir.h"
#include "tools/fixture/fixture_movie.h"
#include "tools/fixture/frame_pattern.h"

#include <QDir>
#include <QFile>
#include <QFileInfo>

#include <gtest/gtest.h>

#include <cmath>
#include <vector>

using zaf::media::MovieWriter;
namespace fx = zaf::fixture;

namespace {

std::unique_ptr<MovieWriter> createWriter(const QString &path, const MovieWriter::Settings &settings)
{
    auto created = MovieWriter::create(path, settings);
    EXPECT_TRUE(created.ok()) << (created.error ? qPrintable(created.error->description()) : "");
    return created.ok() ? std::move(*created.value) : nullptr;
}

// Appends `frames` numbered frames drawn at `pictureSize` and a tone per track to match.
void appendNumberedFrames(MovieWriter &writer, int frames, QSize pictureSize)
{
    const MovieWriter::Settings &s = writer.settings();
    const int samplesPerFrame = int(s.sampleRate / s.frameRate);
    std::vector<float> pcm(size_t(samplesPerFrame * s.channels));
    for (int n = 0; n < frames; ++n) {
        ASSERT_FALSE(writer.appendVideoFrame(fx::frameNumberImage(n, pictureSize.width(), pictureSize.height())));
        for (int k = 0; k < s.audioTracks; ++k) {
            const double w = 2 * M_PI * fx::toneFrequency(k) / s.sampleRate;
            for (int i = 0; i < samplesPerFrame; ++i)
                for (int c = 0; c < s.channels; ++c)
                    pcm[size_t(i * s.channels + c)] = float(0.5 * std::sin(w * (qint64(n) * samplesPerFrame + i)));
            ASSERT_FALSE(writer.appendAudio(k, pcm.data(), samplesPerFrame));
        }
    }
}

QList<int> range(int n)
{
    QList<int> list;
    for (int i = 0; i < n; ++i)
        list.append(i);
    return list;
}

} // namespace

TEST(MovieWriterTest, FinishWritesStreamsDescribedBySettings)
{
    zaf::test::ScratchDir dir;
    const QString path = dir.file(QStringLiteral("out.mp4"));
    MovieWriter::Settings settings;
    settings.videoSize = QSize(352, 288);
    settings.frameRate = 25;
    settings.audioTracks = 2;
    settings.channels = 1;
    settings.gopLength = 10;
    auto writer = createWriter(path, settings);
    ASSERT_TRUE(writer);
    appendNumberedFrames(*writer, 35, settings.videoSize);
    ASSERT_FALSE(writer->finish());

    const QJsonObject probe = zaf::test::ffprobe(path);
    EXPECT_TRUE(probe.value("format").toObject().value("format_name").toString().contains("mp4"));
    const QList<QJsonObject> video = zaf::test::probeStreams(probe, "video");
    ASSERT_EQ(video.size(), 1);
    EXPECT_EQ(video[0].value("codec_name").toString(), "h264");
    EXPECT_EQ(video[0].value("pix_fmt").toString(), "yuv420p");
    EXPECT_EQ(video[0].value("width").toInt(), 352);
    EXPECT_EQ(video[0].value("height").toInt(), 288);
    EXPECT_EQ(video[0].value("avg_frame_rate").toString(), "25/1");
    EXPECT_EQ(zaf::test::probeRotation(video[0]), 0);
    const QList<QJsonObject> audio = zaf::test::probeStreams(probe, "audio");
    ASSERT_EQ(audio.size(), 2);
    for (const QJsonObject &track : audio) {
        EXPECT_EQ(track.value("codec_name").toString(), "aac");
        EXPECT_EQ(track.value("sample_rate").toString(), "48000");
        EXPECT_EQ(track.value("channels").toInt(), 1);
        EXPECT_NEAR(track.value("duration").toString().toDouble(), 35 / 25.0, 0.05);
    }
    EXPECT_EQ(zaf::test::countVideoFrames(path), 35);
    EXPECT_EQ(zaf::test::keyFrameIndexes(path), QList<int>({0, 10, 20, 30}));
}

TEST(MovieWriterTest, FinishKeepsEveryFrameInOrderAndEachTrackItsTone)
{
    zaf::test::ScratchDir dir;
    const QString path = dir.file(QStringLiteral("tones.mp4"));
    MovieWriter::Settings settings;
    settings.videoSize = QSize(320, 240);
    settings.audioTracks = 3;
    auto writer = createWriter(path, settings);
    ASSERT_TRUE(writer);
    appendNumberedFrames(*writer, 60, settings.videoSize);
    ASSERT_FALSE(writer->finish());
    EXPECT_EQ(writer->videoFramesWritten(), 60);

    EXPECT_EQ(zaf::test::readFrameNumbers(path), range(60));
    for (int k = 0; k < 3; ++k) {
        for (int j = 0; j < 3; ++j) {
            const double level = zaf::test::toneLevel(path, k, fx::toneFrequency(j));
            if (j == k)
                EXPECT_NEAR(level, 0.5, 0.05) << "track " << k << " lacks its tone";
            else
                EXPECT_LT(level, 0.02) << "track " << k << " carries the tone of track " << j;
        }
    }
}

TEST(MovieWriterTest, AppendVideoFrameScalesAndConvertsPicturesOfAnyFormat)
{
    zaf::test::ScratchDir dir;
    const QString path = dir.file(QStringLiteral("formats.mp4"));
    MovieWriter::Settings settings;
    settings.videoSize = QSize(256, 160);
    auto writer = createWriter(path, settings);
    ASSERT_TRUE(writer);
    const QList<QImage::Format> formats = {QImage::Format_RGB888, QImage::Format_ARGB32_Premultiplied,
                                           QImage::Format_RGBA8888, QImage::Format_RGB16, QImage::Format_BGR30};
    const QList<QSize> sizes = {QSize(64, 48), QSize(1000, 700), QSize(256, 160), QSize(333, 91), QSize(50, 400)};
    for (int n = 0; n < formats.size(); ++n) {
        const QImage picture = fx::frameNumberImage(n + 100, sizes[n].width(), sizes[n].height()).convertToFormat(formats[n]);
        ASSERT_FALSE(writer->appendVideoFrame(picture));
    }
    ASSERT_FALSE(writer->appendVideoFrame(QImage())); // a null picture is a black frame
    ASSERT_FALSE(writer->finish());
    EXPECT_EQ(zaf::test::readFrameNumbers(path), QList<int>({100, 101, 102, 103, 104, -1}));
}

class MovieWriterRotationTest : public ::testing::TestWithParam<int> {};

TEST_P(MovieWriterRotationTest, FinishStoresRotationAsDisplayMatrix)
{
    const int rotation = GetParam();
    zaf::test::ScratchDir dir;
    const QString path = dir.file(QStringLiteral("rotated.mp4"));
    MovieWriter::Settings settings;
    settings.videoSize = QSize(320, 240);
    settings.rotation = rotation;
    auto writer = createWriter(path, settings);
    ASSERT_TRUE(writer);
    appendNumberedFrames(*writer, 3, settings.videoSize);
    ASSERT_FALSE(writer->finish());

    const QList<QJsonObject> video = zaf::test::probeStreams(zaf::test::ffprobe(path), "video");
    ASSERT_EQ(video.size(), 1);
    EXPECT_EQ(video[0].value("width").toInt(), 320); // the stored picture keeps its size
    EXPECT_EQ(zaf::test::probeRotation(video[0]), rotation);

    // Our own reader sees the same transform.
    auto asset = zaf::media::MediaAsset::assetWithURL(QUrl::fromLocalFile(path));
    const auto tracks = asset->tracksWithMediaType(zaf::media::MediaType::Video);
    ASSERT_EQ(tracks.size(), 1);
    EXPECT_EQ(tracks[0].preferredTransform.rotationDegrees(), rotation);
}

INSTANTIATE_TEST_SUITE_P(Rotations, MovieWriterRotationTest, ::testing::Values(0, 90, 180, 270));

TEST(MovieWriterTest, MovieAppearsUnderFinalNameOnlyAfterFinish)
{
    zaf::test::ScratchDir dir;
    const QString path = dir.file(QStringLiteral("late.mp4"));
    auto writer = createWriter(path, MovieWriter::Settings{QSize(128, 96)});
    ASSERT_TRUE(writer);
    appendNumberedFrames(*writer, 5, QSize(128, 96));
    EXPECT_FALSE(QFileInfo::exists(path));
    const QStringList during = QDir(dir.path()).entryList(QDir::Files | QDir::Hidden);
    ASSERT_EQ(during.size(), 1);
    EXPECT_TRUE(during[0].startsWith(".late.mp4")) << qPrintable(during[0]);

    ASSERT_FALSE(writer->finish());
    EXPECT_EQ(QDir(dir.path()).entryList(QDir::Files | QDir::Hidden), QStringList({"late.mp4"}));
    EXPECT_EQ(zaf::test::countVideoFrames(path), 5);
}

TEST(MovieWriterTest, DestroyingUnfinishedWriterLeavesNoFile)
{
    zaf::test::ScratchDir dir;
    {
        auto writer = createWriter(dir.file(QStringLiteral("abandoned.mp4")), MovieWriter::Settings{QSize(128, 96)});
        ASSERT_TRUE(writer);
        appendNumberedFrames(*writer, 5, QSize(128, 96));
    }
    EXPECT_TRUE(QDir(dir.path()).entryList(QDir::Files | QDir::Hidden).isEmpty());
}

TEST(MovieWriterTest, CreateRefusesExistingFileAndLeavesItUntouched)
{
    zaf::test::ScratchDir dir;
    const QString path = dir.write(QStringLiteral("taken.mp4"), 1234);
    auto created = MovieWriter::create(path, MovieWriter::Settings{});
    ASSERT_FALSE(created.ok());
    EXPECT_EQ(created.error->code, zaf::media::kMediaErrorOutputExists);
    EXPECT_EQ(QFileInfo(path).size(), 1234);
    EXPECT_EQ(QDir(dir.path()).entryList(QDir::Files | QDir::Hidden).size(), 1);
}

TEST(MovieWriterTest, CreateFailsWithLoggedErrorForUnwritableDirectory)
{
    zaf::test::LogCapture log;
    auto created = MovieWriter::create(QStringLiteral("/nonexistent-dir-zaf/out.mp4"), MovieWriter::Settings{});
    ASSERT_FALSE(created.ok());
    EXPECT_EQ(created.error->domain, "zaf.media");
    EXPECT_EQ(created.error->code, zaf::media::kMediaErrorWriteFailed);
    const QStringList messages = log.messages(QStringLiteral("zaf.media"));
    ASSERT_FALSE(messages.isEmpty());
    EXPECT_TRUE(messages.last().contains("/nonexistent-dir-zaf")) << qPrintable(messages.last());
}

TEST(MovieWriterTest, CreateRejectsUnsupportedSettings)
{
    zaf::test::ScratchDir dir;
    auto expectInvalid = [&](const MovieWriter::Settings &settings, const char *what) {
        auto created = MovieWriter::create(dir.file(QStringLiteral("bad.mp4")), settings);
        ASSERT_FALSE(created.ok()) << what;
        EXPECT_EQ(created.error->code, zaf::media::kMediaErrorInvalidArgument) << what;
    };
    MovieWriter::Settings s;
    s.rotation = 45;
    expectInvalid(s, "rotation 45");
    s = {};
    s.channels = 3;
    s.audioTracks = 1;
    expectInvalid(s, "3 channels");
    s = {};
    s.videoSize = QSize(0, 100);
    expectInvalid(s, "empty picture");
    s = {};
    s.frameRate = 0;
    expectInvalid(s, "no frame rate");
    EXPECT_TRUE(QDir(dir.path()).entryList(QDir::Files | QDir::Hidden).isEmpty());
}

TEST(MovieWriterTest, AppendRejectsUnknownTrackAndAnythingAfterFinish)
{
    zaf::test::ScratchDir dir;
    MovieWriter::Settings settings{QSize(128, 96)};
    settings.audioTracks = 1;
    auto writer = createWriter(dir.file(QStringLiteral("closed.mp4")), settings);
    ASSERT_TRUE(writer);
    const float samples[4] = {0, 0, 0, 0};
    const zaf::OptionalError unknown = writer->appendAudio(1, samples, 2);
    ASSERT_TRUE(unknown);
    EXPECT_EQ(unknown->code, zaf::media::kMediaErrorInvalidArgument);
    ASSERT_FALSE(writer->appendVideoFrame(fx::frameNumberImage(0, 128, 96)));
    ASSERT_FALSE(writer->appendAudio(0, samples, 2));
    ASSERT_FALSE(writer->finish());
    EXPECT_TRUE(writer->appendVideoFrame(fx::frameNumberImage(1, 128, 96)));
    EXPECT_TRUE(writer->appendAudio(0, samples, 2));
    EXPECT_TRUE(writer->finish());
    EXPECT_EQ(zaf::test::countVideoFrames(dir.file(QStringLiteral("closed.mp4"))), 1);
}
