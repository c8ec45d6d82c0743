// ExportSession with a time range: exactly the frames shown during it, and every audio track cut alike.
#include "tests/platform/media/export_test_support.h"
#include "tests/support/media/decoded_pictures.h"
#include "tests/support/media/second_decoder.h"

#include <QHash>
#include <QSet>

#include <cmath>

namespace zaf::media {
namespace {

using namespace zaf::test;

ZAF_PRINT_CASES_AS_NAMES

// Re-encoded with B-frames and an edit list, as camera and recorder files have.
QString bFrameSource()
{
    return sharedReencodedFixture({.seconds = 4, .audioTracks = 1, .gop = 60}, "-map 0 -c:v libx264 -bf 3 -g 60 -crf 12 -c:a copy");
}

struct TrimCase {
    const char *name;
    std::function<QString()> source;
    MediaTime start, end;
    int firstFrame, frames, audioTracks;
    double seconds;
};

class ExportTrimTest : public ExportTest, public ::testing::WithParamInterface<TrimCase> {};

// The output is the range alone: its frames in order, the source's picture size and rotation, and
// every audio track cut to the same length with its own tone.
TEST_P(ExportTrimTest, EveryStreamHoldsExactlyTheRange)
{
    const TrimCase &c = GetParam();
    const QString source = c.source();
    const QString output = trimmed(source, MediaTimeRange::fromStartEnd(c.start, c.end));
    QList<int> expected;
    for (int i = 0; i < c.frames; ++i)
        expected << c.firstFrame + i;
    EXPECT_EQ(readFrameNumbers(output), expected);
    if (secondDecoderAvailable()) {
        EXPECT_EQ(decodeVideoFramesWithSecondDecoder(output), c.frames) << "GStreamer decodes every frame too";
    }

    const QList<QJsonObject> video = probeStreams(output, "video");
    const QList<QJsonObject> audio = probeStreams(output, "audio");
    ASSERT_EQ(video.size(), 1);
    ASSERT_EQ(audio.size(), c.audioTracks);
    EXPECT_EQ(video[0]["codec_name"].toString(), "h264");
    EXPECT_EQ(video[0]["width"].toInt(), 320);
    EXPECT_EQ(video[0]["height"].toInt(), 240);
    EXPECT_EQ(probeRotation(video[0]), probeRotation(probeStreams(source, "video").value(0)));
    const auto transform = [](const QString &path) {
        return MediaAsset::assetWithURL(QUrl::fromLocalFile(path))->tracksWithMediaType(MediaType::Video).value(0).preferredTransform;
    };
    EXPECT_EQ(transform(output), transform(source)) << "our own reader sees the source's transform";
    // Every frame keeps its 1/30 s when the range starts on a frame boundary; else the first is shortened.
    if (std::fmod(c.start.seconds() * 30, 1.0) == 0) {
        EXPECT_EQ(video[0]["avg_frame_rate"].toString(), "30/1");
    }
    EXPECT_NEAR(seconds(video[0], "start_time"), 0.0, 1e-3);
    EXPECT_NEAR(seconds(video[0], "duration"), c.seconds, 1.0 / 30 + 1e-3);
    for (int k = 0; k < c.audioTracks; ++k) {
        SCOPED_TRACE(k);
        EXPECT_EQ(audio[k]["codec_name"].toString(), "aac");
        EXPECT_EQ(audio[k]["sample_rate"].toString(), "48000");
        EXPECT_NEAR(seconds(audio[k], "start_time"), 0.0, kAacFrameSeconds);
        EXPECT_NEAR(seconds(audio[k], "duration"), c.seconds, kAacFrameSeconds);
        EXPECT_GT(toneLevel(output, k, fixture::toneFrequency(k)), 0.35);
        EXPECT_LT(toneLevel(output, k, fixture::toneFrequency(1 - k)), 0.05);
    }
}

const auto kLongSource = [] { return sharedFixtureMovie(kLong); };

INSTANTIATE_TEST_SUITE_P(
    Cases, ExportTrimTest,
    ::testing::Values(TrimCase{"TwoToSevenSecondsInNanoseconds", kLongSource, MediaTime::make(2'000'000'000, 1'000'000'000),
                               MediaTime::make(7'000'000'000, 1'000'000'000), 60, 150, 2, 5.0},
                      // 1.12 s falls inside frame 33 (1.100 s .. 1.133 s), between the keyframes 30 and 60.
                      TrimCase{"StartBetweenKeyframes", kLongSource, MediaTime::make(112, 100), MediaTime::make(2, 1), 33, 27, 2, 0.88},
                      TrimCase{"EndPastTheMovie", kLongSource, MediaTime::make(9, 1), MediaTime::make(30, 1), 270, 30, 2, 1.0},
                      // Frames 75 (2.500 s .. 2.533 s) to 107 (3.567 s .. 3.600 s).
                      TrimCase{"BFrames", bFrameSource, MediaTime::make(2525, 1000), MediaTime::make(3600, 1000), 75, 33, 1, 1.075},
                      TrimCase{"Rotated", [] { return sharedFixtureMovie(kRotated); }, MediaTime::make(1, 2), MediaTime::make(3, 2), 15, 30, 2,
                               1.0}),
    caseName);

// Sources as recorders and cameras write them, each trimmed frame-exactly: cut 0.1 ms into a
// keyframe, into the frame before and the frame after one, twice inside one group, across whole
// groups, and the whole movie. The output holds exactly the frames shown during the range, and a
// second decoder agrees. Every picture is within 40 dB PSNR (luma and chroma) of the source's,
// which catches corruption, shifts and rescaling (not a mildly lower quality: the flat cells of the
// fixture pictures keep 45 dB even at crf 45). Where the export copies groups, every picture of a
// group kept whole is the source's bit for bit, chroma included (a re-encode of these pictures
// often keeps the luma bit-exact, never the chroma).
struct TrimSource {
    const char *name;
    fixture::FixtureSpec spec;
    const char *encode;        // ffmpeg options re-encoding the fixture; empty: the fixture itself
    bool copiesGroups = false; // the export copies whole groups (H.264 with closed groups)
};

// Where a cut starts and ends, from the presentation times of the source's frames and the
// presentation-order indexes of its keyframes.
struct Cut {
    const char *name;
    std::function<std::pair<double, double>(const QList<double> &pts, const QList<int> &keys)> range;
};

constexpr double kInto = 1e-4;

// The end of the last frame.
double movieEnd(const QList<double> &pts)
{
    return pts.last() + (pts.last() - pts[pts.size() - 2]);
}

class ExportTrimSourceTest : public ExportTest, public ::testing::WithParamInterface<std::tuple<TrimSource, Cut>> {};

TEST_P(ExportTrimSourceTest, CutHoldsExactlyTheFramesShownDuringItsRange)
{
    const auto &[trimSource, cut] = GetParam();
    const QString source = *trimSource.encode ? sharedReencodedFixture(trimSource.spec, trimSource.encode) : sharedFixtureMovie(trimSource.spec);
    const QList<double> pts = presentationTimes(source);
    const DecodedPictures sourcePictures = decodePictures(source);
    const QList<int> &numbers = sourcePictures.numbers;
    const QList<int> keys = keyFrameIndexes(source);
    ASSERT_EQ(pts.size(), numbers.size());
    ASSERT_GE(keys.size(), 2);
    ASSERT_TRUE(keys[1] >= 2 && keys[1] + 10 < pts.size()) << keys[1];
    const auto [start, end] = cut.range(pts, keys);

    // From the frame on screen at the start to the last that begins before the end.
    const auto shown = [&](int i) { return (i + 1 < pts.size() ? pts[i + 1] : movieEnd(pts)) > start && pts[i] < end; };
    QList<int> expected;
    for (int i = 0; i < pts.size(); ++i) {
        if (shown(i))
            expected << numbers[i];
    }
    QSet<int> inWholeGroups; // frames of the groups (keyframe to keyframe) kept whole
    for (int g = 0; g < keys.size(); ++g) {
        const int groupEnd = g + 1 < keys.size() ? keys[g + 1] : int(pts.size());
        if (shown(keys[g]) && shown(groupEnd - 1)) {
            for (int i = keys[g]; i < groupEnd; ++i)
                inWholeGroups << numbers[i];
        }
    }
    const QString output = trimmed(source, secondsRange(start, end));
    const DecodedPictures pictures = decodePictures(output);
    EXPECT_EQ(pictures.numbers, expected);
    QHash<int, qsizetype> sourceIndex; // by frame number
    for (qsizetype i = 0; i < numbers.size(); ++i)
        sourceIndex.insert(numbers[i], i);
    QList<int> notCopied, damaged; // frame numbers
    for (qsizetype i = 0; i < pictures.numbers.size(); ++i) {
        const qsizetype from = sourceIndex.value(pictures.numbers[i], -1);
        if (from < 0)
            continue; // a frame the source lacks: the numbers differ already
        if (trimSource.copiesGroups && inWholeGroups.contains(pictures.numbers[i]) && pictures.planes[i] != sourcePictures.planes[from])
            notCopied << pictures.numbers[i];
        if (psnr(pictures.planes[i], sourcePictures.planes[from]) < 40)
            damaged << pictures.numbers[i];
    }
    EXPECT_TRUE(notCopied.isEmpty()) << "frames of whole groups decode differently from the source's: " << ::testing::PrintToString(notCopied);
    EXPECT_TRUE(damaged.isEmpty()) << "frames below 40 dB PSNR: " << ::testing::PrintToString(damaged);
    if (secondDecoderAvailable()) {
        EXPECT_EQ(decodeVideoFramesWithSecondDecoder(output), expected.size());
    }
}

INSTANTIATE_TEST_SUITE_P(
    Sources, ExportTrimSourceTest,
    ::testing::Combine(
        ::testing::Values(
            TrimSource{"NoBFramesOneSecondGroups", {.seconds = 4, .gop = 30}, "", true},
            TrimSource{"BFramesOneSecondGroups", {.seconds = 4}, "-map 0 -c:v libx264 -preset veryfast -bf 3 -g 30 -sc_threshold 0 -c:a copy", true},
            TrimSource{"BFramesEightSecondGroups", {.seconds = 12}, "-map 0 -c:v libx264 -preset veryfast -bf 3 -g 240 -keyint_min 240 -sc_threshold 0 -c:a copy", true},
            TrimSource{"SixtyFps", {.seconds = 3, .fps = 60}, "-map 0 -c:v libx264 -preset veryfast -bf 3 -g 60 -sc_threshold 0 -c:a copy", true},
            TrimSource{"VariableFrameRate", {.seconds = 4}, "-map 0 -vf setpts=(N+floor(N/3)*0.5)/30/TB -fps_mode passthrough -c:v libx264 -preset veryfast -bf 3 -g 30 -sc_threshold 0 -c:a copy", true},
            TrimSource{"OpenGroups", {.seconds = 4}, "-map 0 -c:v libx264 -preset veryfast -bf 3 -g 30 -sc_threshold 0 -x264-params open_gop=1 -c:a copy"},
            TrimSource{"Rotated", {.seconds = 4, .rotation = 90, .gop = 30}, "", true},
            TrimSource{"NotH264", {.seconds = 4}, "-map 0 -c:v mpeg4 -q:v 1 -g 30 -c:a copy"}),
        ::testing::Values(
            Cut{"Keyframe", [](const QList<double> &pts, const QList<int> &keys) { return std::pair(pts[keys[1]] + kInto, pts[keys[1] + 9] + kInto); }},
            Cut{"FrameBeforeKeyframe", [](const QList<double> &pts, const QList<int> &keys) { return std::pair(pts[keys[1] - 1] + kInto, pts[keys[1] + 9] + kInto); }},
            Cut{"FrameAfterKeyframe", [](const QList<double> &pts, const QList<int> &keys) { return std::pair(pts[keys[1] + 1] + kInto, pts[keys[1] + 9] + kInto); }},
            Cut{"InsideOneGroup", [](const QList<double> &pts, const QList<int> &keys) { return std::pair(pts[keys[1] + 2] + kInto, pts[keys[1] + 7] + kInto); }},
            // From the frame before a keyframe over a whole group into the next one (or to the last frame).
            Cut{"AcrossGroups", [](const QList<double> &pts, const QList<int> &keys) {
                    return std::pair(pts[keys[1] - 1] + kInto, pts[keys.size() > 2 ? keys[2] + 1 : pts.size() - 1] + kInto); }},
            Cut{"WholeMovie", [](const QList<double> &pts, const QList<int> &) { return std::pair(0.0, movieEnd(pts)); }})),
    [](const auto &info) { return std::string(std::get<0>(info.param).name) + "_" + std::get<1>(info.param).name; });

} // namespace
} // namespace zaf::media
