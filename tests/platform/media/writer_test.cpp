// MovieWriter, the fixture movies built on it and their frame-number pattern, checked with ffprobe and ffmpeg.

#include "platform/media/media_asset.h"
#include "platform/media/movie_writer.h"
#include "tests/support/log_capture.h"
#include "tests/support/media/fixture_movies.h"
#include "tests/support/named_cases.h"
#include "tests/support/temp_dir.h"
#include "tools/fixture/fixture_movie.h"
#include "tools/fixture/frame_pattern.h"

#include <QFileInfo>
#include <QTransform>

#include <gtest/gtest.h>

#include <cmath>
#include <numeric>
#include <vector>

using zaf::media::MovieWriter;
namespace fx = zaf::fixture;

namespace {

ZAF_PRINT_CASES_AS_NAMES

QList<int> range(int n)
{
    QList<int> list(n);
    std::iota(list.begin(), list.end(), 0);
    return list;
}

std::unique_ptr<MovieWriter> createWriter(const QString &path, const MovieWriter::Settings &settings)
{
    auto created = MovieWriter::create(path, settings);
    EXPECT_TRUE(created.ok()) << (created.error ? qPrintable(created.error->description()) : "");
    return created.ok() ? std::move(*created.value) : nullptr;
}

// Appends `frames` numbered frames and a tone per track to match.
void appendNumberedFrames(MovieWriter &writer, int frames)
{
    const MovieWriter::Settings &s = writer.settings();
    const int samplesPerFrame = int(s.sampleRate / s.frameRate);
    std::vector<float> pcm(size_t(samplesPerFrame * s.channels));
    for (int n = 0; n < frames; ++n) {
        ASSERT_FALSE(writer.appendVideoFrame(fx::frameNumberImage(n, s.videoSize.width(), s.videoSize.height())));
        for (int k = 0; k < s.audioTracks; ++k) {
            const double w = 2 * M_PI * fx::toneFrequency(k) / s.sampleRate;
            for (int i = 0; i < samplesPerFrame; ++i)
                for (int c = 0; c < s.channels; ++c)
                    pcm[size_t(i * s.channels + c)] = float(0.5 * std::sin(w * (qint64(n) * samplesPerFrame + i)));
            ASSERT_FALSE(writer.appendAudio(k, pcm.data(), samplesPerFrame));
        }
    }
}

// The drawn number reads back, and the picture is upright, at any size, and drawn large then smoothly
// scaled to a thumbnail.
class FramePatternSize : public ::testing::TestWithParam<std::pair<QSize, QSize>> {};

TEST_P(FramePatternSize, ReadsBackTheDrawnNumber)
{
    const auto [drawn, shown] = GetParam();
    for (int n : {0, 1, 2, 7, 255, 256, 4097, 12345, 30000, 43690, 54321, 65535}) {
        const QImage image = fx::frameNumberImage(n, drawn.width(), drawn.height()).scaled(shown, Qt::IgnoreAspectRatio, Qt::SmoothTransformation);
        EXPECT_EQ(fx::readFrameNumber(image), n) << n;
        EXPECT_TRUE(fx::isUpright(image)) << n;
    }
}

INSTANTIATE_TEST_SUITE_P(Sizes, FramePatternSize,
                         ::testing::Values(std::pair{QSize(1920, 1080), QSize(1920, 1080)}, std::pair{QSize(320, 240), QSize(320, 240)},
                                           std::pair{QSize(64, 36), QSize(64, 36)}, std::pair{QSize(28, 38), QSize(28, 38)},
                                           std::pair{QSize(1080, 1920), QSize(1080, 1920)}, std::pair{QSize(1920, 1080), QSize(68, 38)}),
                         [](const auto &info) {
                             const QSize drawn = info.param.first;
                             return "Size" + std::to_string(drawn.width()) + "x" + std::to_string(drawn.height()) + "Shown" + std::to_string(info.param.second.width());
                         });

// Turned, mirrored, blank or washed-out pictures are not upright or read no number.
struct PatternLessPicture {
    const char *name;
    std::function<QImage(const QImage &upright)> make;
    bool upright;
};

class FramePatternMissing : public ::testing::TestWithParam<PatternLessPicture> {};

TEST_P(FramePatternMissing, PictureReadsNoNumber)
{
    const QImage picture = GetParam().make(fx::frameNumberImage(4242, 320, 240));
    EXPECT_EQ(fx::isUpright(picture), GetParam().upright);
    EXPECT_EQ(fx::readFrameNumber(picture), -1);
}

QImage filled(QColor colour)
{
    QImage image(320, 240, QImage::Format_RGB32);
    image.fill(colour);
    return image;
}

INSTANTIATE_TEST_SUITE_P(
    Pictures, FramePatternMissing,
    ::testing::Values(PatternLessPicture{"Turned90", [](const QImage &u) { return u.transformed(QTransform().rotate(90)); }, false},
                      PatternLessPicture{"Turned180", [](const QImage &u) { return u.transformed(QTransform().rotate(180)); }, false},
                      PatternLessPicture{"Turned270", [](const QImage &u) { return u.transformed(QTransform().rotate(270)); }, false},
                      PatternLessPicture{"MirroredSideways", [](const QImage &u) { return u.mirrored(true, false); }, false},
                      PatternLessPicture{"UpsideDown", [](const QImage &u) { return u.mirrored(false, true); }, false},
                      PatternLessPicture{"Black", [](const QImage &) { return filled(Qt::black); }, false},
                      PatternLessPicture{"BitCellsWashedOut", [](const QImage &) {
                                             QImage grey = filled(QColor(128, 128, 128));
                                             fx::drawFrameNumber(grey, 9);
                                             for (int y = 48; y < 240; ++y) // wash the bit cells out to grey
                                                 for (int x = 0; x < 320; ++x)
                                                     grey.setPixel(x, y, qRgb(128, 128, 128));
                                             return grey;
                                         }, true},
                      PatternLessPicture{"Null", [](const QImage &) { return QImage(); }, false},
                      PatternLessPicture{"ThreeByThree", [](const QImage &) { return QImage(3, 3, QImage::Format_RGB32); }, false}),
    zaf::test::caseName);

// No tone frequency is another's or a harmonic of another, so tracks can be told apart.
TEST(FixtureMovieTest, ToneFrequenciesAreDistinctAndNoHarmonicsOfEachOther)
{
    for (int i = 0; i < 6; ++i)
        for (int j = 0; j < 6; ++j) {
            const double ratio = fx::toneFrequency(i) / fx::toneFrequency(j);
            EXPECT_TRUE(i == j || std::abs(ratio - std::round(ratio)) > 0.05) << i << " vs " << j;
        }
    EXPECT_NE(fx::toneFrequency(6), fx::toneFrequency(7));
}

// A fixture movie follows its shape (frame rate, GOP, a tone per track), and every call writes its own file.
TEST(FixtureMovieTest, WriteFixtureMovieNumbersFramesAndTonesTracks)
{
    zaf::test::ScratchDir dir;
    const fx::FixtureSpec shape{.seconds = 1.5, .fps = 20, .audioTracks = 2, .channels = 1, .gop = 7};
    const QString path = zaf::test::makeFixtureMovie(dir.path(), shape);
    ASSERT_FALSE(path.isEmpty());
    EXPECT_EQ(zaf::test::readFrameNumbers(path), range(30));
    EXPECT_EQ(zaf::test::keyFrameIndexes(path), QList<int>({0, 7, 14, 21, 28}));
    for (int k = 0; k < 2; ++k)
        for (int j = 0; j < 2; ++j)
            EXPECT_NEAR(zaf::test::toneLevel(path, k, j ? 660 : 440), j == k ? 0.5 : 0.0, j == k ? 0.05 : 0.02) << j << " in " << k;

    const QString other = zaf::test::makeFixtureMovie(dir.path(), shape);
    EXPECT_NE(other, path);
    EXPECT_TRUE(QFileInfo::exists(other) && QFileInfo::exists(path));
}

// A rotated fixture stores the picture turned back with a display matrix, so it shows upright.
class FixtureRotationTest : public ::testing::TestWithParam<int> {};

TEST_P(FixtureRotationTest, RotatedFixtureShowsUprightNumberedFramesWhenDisplayed)
{
    const QString path = zaf::test::sharedFixtureMovie({.seconds = 0.2, .audioTracks = 0, .rotation = GetParam()});
    const QList<QJsonObject> video = zaf::test::probeStreams(path, "video");
    ASSERT_EQ(video.size(), 1);
    EXPECT_EQ(video[0]["width"].toInt(), 320);
    EXPECT_EQ(video[0]["height"].toInt(), 240);
    EXPECT_EQ(zaf::test::probeRotation(video[0]), GetParam());
    EXPECT_EQ(zaf::test::readFrameNumbers(path), range(6));
}

INSTANTIATE_TEST_SUITE_P(Rotations, FixtureRotationTest, ::testing::Values(0, 90, 180, 270));

// The finished movie has the streams the settings describe, every frame in order, the GOP asked
// for, and each audio track its own tone only.
TEST(MovieWriterTest, FinishWritesStreamsDescribedBySettingsWithEveryFrameAndTone)
{
    zaf::test::ScratchDir dir;
    const QString path = dir.file(QStringLiteral("out.mp4"));
    const MovieWriter::Settings settings{.videoSize = QSize(352, 288), .frameRate = 25, .audioTracks = 3, .channels = 1, .gopLength = 10};
    auto writer = createWriter(path, settings);
    ASSERT_TRUE(writer);
    appendNumberedFrames(*writer, 35);
    ASSERT_FALSE(writer->finish());
    EXPECT_EQ(writer->videoFramesWritten(), 35);

    const QJsonObject probe = zaf::test::ffprobe(path);
    EXPECT_TRUE(probe["format"].toObject()["format_name"].toString().contains("mp4"));
    const QList<QJsonObject> video = zaf::test::probeStreams(probe, "video");
    ASSERT_EQ(video.size(), 1);
    EXPECT_EQ(video[0]["codec_name"].toString(), "h264");
    EXPECT_EQ(video[0]["pix_fmt"].toString(), "yuv420p");
    EXPECT_EQ(video[0]["width"].toInt(), 352);
    EXPECT_EQ(video[0]["height"].toInt(), 288);
    EXPECT_EQ(video[0]["avg_frame_rate"].toString(), "25/1");
    EXPECT_EQ(zaf::test::probeRotation(video[0]), 0);
    const QList<QJsonObject> audio = zaf::test::probeStreams(probe, "audio");
    ASSERT_EQ(audio.size(), 3);
    for (const QJsonObject &track : audio) {
        EXPECT_EQ(track["codec_name"].toString(), "aac");
        EXPECT_EQ(track["sample_rate"].toString(), "48000");
        EXPECT_EQ(track["channels"].toInt(), 1);
        EXPECT_NEAR(track["duration"].toString().toDouble(), 35 / 25.0, 0.05);
    }
    EXPECT_EQ(zaf::test::keyFrameIndexes(path), QList<int>({0, 10, 20, 30}));
    EXPECT_EQ(zaf::test::readFrameNumbers(path), range(35));
    for (int k = 0; k < 3; ++k)
        for (int j = 0; j < 3; ++j)
            EXPECT_NEAR(zaf::test::toneLevel(path, k, fx::toneFrequency(j)), j == k ? 0.5 : 0.0, j == k ? 0.05 : 0.02)
                << "tone of track " << j << " in track " << k;
}

// Pictures of any format and size are converted and scaled; a null picture is a black frame.
TEST(MovieWriterTest, AppendVideoFrameScalesAndConvertsPicturesOfAnyFormat)
{
    zaf::test::ScratchDir dir;
    const QString path = dir.file(QStringLiteral("formats.mp4"));
    auto writer = createWriter(path, MovieWriter::Settings{QSize(256, 160)});
    ASSERT_TRUE(writer);
    const QList<QImage::Format> formats = {QImage::Format_RGB888, QImage::Format_ARGB32_Premultiplied, QImage::Format_RGBA8888,
                                           QImage::Format_RGB16, QImage::Format_BGR30};
    const QList<QSize> sizes = {QSize(64, 48), QSize(1000, 700), QSize(256, 160), QSize(333, 91), QSize(50, 400)};
    for (int n = 0; n < formats.size(); ++n)
        ASSERT_FALSE(writer->appendVideoFrame(fx::frameNumberImage(n + 100, sizes[n].width(), sizes[n].height()).convertToFormat(formats[n])));
    ASSERT_FALSE(writer->appendVideoFrame(QImage()));
    ASSERT_FALSE(writer->finish());
    EXPECT_EQ(zaf::test::readFrameNumbers(path), QList<int>({100, 101, 102, 103, 104, -1}));
}

// The movie is written under a hidden temporary name named after it and appears under its own name
// only when finished; an abandoned writer leaves nothing, and a file that takes the name meanwhile
// is kept while the movie goes.
enum class Ending { Finished, Abandoned, NameTakenMeanwhile };
const char *const kEndingNames[] = {"Finished", "Abandoned", "NameTakenMeanwhile"};

class MovieWriterEnding : public ::testing::TestWithParam<Ending> {};

TEST_P(MovieWriterEnding, LeavesTheWholeMovieOrNothing)
{
    zaf::test::ScratchDir dir;
    const QString path = dir.file(QStringLiteral("late.mp4"));
    auto writer = createWriter(path, MovieWriter::Settings{QSize(128, 96)});
    ASSERT_TRUE(writer);
    appendNumberedFrames(*writer, 5);
    const QStringList during = zaf::test::entryNames(dir.path());
    ASSERT_EQ(during.size(), 1);
    EXPECT_TRUE(during[0].startsWith(".late.mp4")) << qPrintable(during[0]);
    if (GetParam() == Ending::Abandoned) {
        writer.reset();
        EXPECT_EQ(zaf::test::entryNames(dir.path()), QStringList());
    } else if (GetParam() == Ending::NameTakenMeanwhile) {
        dir.write(QStringLiteral("late.mp4"), 77);
        EXPECT_EQ(writer->finish().value_or(zaf::Error{}).code, zaf::media::kMediaErrorOutputExists);
        EXPECT_EQ(QFileInfo(path).size(), 77);
        EXPECT_EQ(zaf::test::entryNames(dir.path()), QStringList({"late.mp4"}));
    } else {
        ASSERT_FALSE(writer->finish());
        EXPECT_EQ(zaf::test::entryNames(dir.path()), QStringList({"late.mp4"}));
        EXPECT_EQ(zaf::test::countVideoFrames(path), 5);
    }
}

INSTANTIATE_TEST_SUITE_P(Endings, MovieWriterEnding, ::testing::Values(Ending::Finished, Ending::Abandoned, Ending::NameTakenMeanwhile),
                         [](const auto &info) { return kEndingNames[int(info.param)]; });

// Creation fails, leaving no file and an existing one untouched, for an existing path, an
// unwritable directory (logged with the path) and unsupported settings.
struct CreateFailure {
    const char *name;
    const char *path; // in the scratch directory unless absolute
    MovieWriter::Settings settings;
    int code;
};

class MovieWriterCreateFailure : public ::testing::TestWithParam<CreateFailure> {};

TEST_P(MovieWriterCreateFailure, LeavesNoFile)
{
    const CreateFailure &c = GetParam();
    zaf::test::ScratchDir dir;
    const QString taken = dir.write(QStringLiteral("taken.mp4"), 1234);
    zaf::test::LogCapture log;
    auto created = MovieWriter::create(c.path[0] == '/' ? QString::fromLatin1(c.path) : dir.file(c.path), c.settings);
    ASSERT_FALSE(created.ok());
    EXPECT_EQ(created.error->domain, "zaf.media");
    EXPECT_EQ(created.error->code, c.code);
    const QString logged = log.messages(QStringLiteral("zaf.media")).join(u'\n');
    EXPECT_TRUE(c.code != zaf::media::kMediaErrorWriteFailed || logged.contains("/nonexistent-dir-zaf")) << qPrintable(logged);
    EXPECT_EQ(QFileInfo(taken).size(), 1234);
    EXPECT_EQ(zaf::test::entryNames(dir.path()), QStringList({"taken.mp4"}));
}

INSTANTIATE_TEST_SUITE_P(
    Cases, MovieWriterCreateFailure,
    ::testing::Values(CreateFailure{"ExistingFile", "taken.mp4", {}, zaf::media::kMediaErrorOutputExists},
                      CreateFailure{"UnwritableDirectory", "/nonexistent-dir-zaf/out.mp4", {}, zaf::media::kMediaErrorWriteFailed},
                      CreateFailure{"Rotation45", "bad.mp4", {.rotation = 45}, zaf::media::kMediaErrorInvalidArgument},
                      CreateFailure{"ThreeChannels", "bad.mp4", {.audioTracks = 1, .channels = 3}, zaf::media::kMediaErrorInvalidArgument},
                      CreateFailure{"EmptyPicture", "bad.mp4", {.videoSize = QSize(0, 100)}, zaf::media::kMediaErrorInvalidArgument},
                      CreateFailure{"NoFrameRate", "bad.mp4", {.frameRate = 0}, zaf::media::kMediaErrorInvalidArgument}),
    zaf::test::caseName);

// Audio for a track it does not have, and anything after the finish, is refused.
TEST(MovieWriterTest, AppendsToAnUnknownTrackOrAfterFinishAreRefused)
{
    zaf::test::ScratchDir dir;
    auto writer = createWriter(dir.file(QStringLiteral("closed.mp4")), {.videoSize = QSize(128, 96), .audioTracks = 1});
    ASSERT_TRUE(writer);
    const float samples[4] = {0, 0, 0, 0};
    EXPECT_EQ(writer->appendAudio(1, samples, 2).value_or(zaf::Error{}).code, zaf::media::kMediaErrorInvalidArgument);
    ASSERT_FALSE(writer->appendVideoFrame(fx::frameNumberImage(0, 128, 96)));
    ASSERT_FALSE(writer->appendAudio(0, samples, 2));
    ASSERT_FALSE(writer->finish());
    EXPECT_TRUE(writer->appendVideoFrame(fx::frameNumberImage(1, 128, 96)));
    EXPECT_TRUE(writer->appendAudio(0, samples, 2));
    EXPECT_TRUE(writer->finish());
    EXPECT_EQ(zaf::test::countVideoFrames(dir.file(QStringLiteral("closed.mp4"))), 1);
}

} // namespace
