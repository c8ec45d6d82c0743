// ExportSession's audio: where a trim lands each track's samples, AAC copies, and mixes.
#include "tests/platform/media/export_test_support.h"
#include "tests/support/media/second_decoder.h"

#include <QJsonArray>
#include <QJsonDocument>

#include <algorithm>
#include <cmath>

namespace zaf::media {
namespace {

using namespace zaf::test;
using fixture::toneFrequency;

ZAF_PRINT_CASES_AS_NAMES

// A 4 s movie with two AAC tracks, each silent but for a click: at 2 s on the first, 2.5 s on the
// second.
QString clicksMovie()
{
    return sharedFfmpegOutput(QStringList{QStringLiteral("-i"), sharedFixtureMovie({.seconds = 4, .audioTracks = 0})}
                           << words("-f lavfi -i aevalsrc=if(between(t\\,2\\,2.0005)\\,0.9\\,0):s=48000:d=4"
                                    " -f lavfi -i aevalsrc=if(between(t\\,2.5\\,2.5005)\\,0.9\\,0):s=48000:d=4"
                                    " -map 0:v -map 1 -map 2 -c:v copy -c:a aac -b:a 256k"));
}

// The same in Matroska, which counts milliseconds, not samples: its AAC tracks are re-encoded, and
// cut in samples.
QString clicksMatroska()
{
    return sharedFfmpegOutput(QStringList{QStringLiteral("-i"), clicksMovie()} << words("-map 0 -c copy"), QStringLiteral("mkv"));
}

struct ClickCase {
    const char *name;
    std::function<QString()> source;
    double start;
};

class ExportClickTest : public ExportTest, public ::testing::WithParamInterface<ClickCase> {};

// A click at a known moment of each audio track lands where it should after a trim, within a
// millisecond, and the tracks end with the range.
TEST_P(ExportClickTest, EachTracksClickLandsWithinAMillisecond)
{
    const QString movie = GetParam().source();
    const double start = GetParam().start;
    const double clicks[2] = {loudestMoment(movie, 0), loudestMoment(movie, 1)};
    // The Matroska copy plays its priming (about 21 ms): each source's own clicks are the reference.
    ASSERT_NEAR(clicks[0], 2.0, 0.03);
    ASSERT_NEAR(clicks[1], 2.5, 0.03);
    const QString output = trimmed(movie, secondsRange(start, 3.6));
    for (int k = 0; k < 2; ++k)
        EXPECT_NEAR(loudestMoment(output, k), clicks[k] - start, 0.001) << "track " << k;
    EXPECT_NEAR(seconds(probeStreams(output, "audio").value(0), "duration"), 3.6 - start, 0.025);
}

INSTANTIATE_TEST_SUITE_P(Cases, ExportClickTest,
                         ::testing::Values(ClickCase{"Mp4FromAKeyframe", clicksMovie, 1.0},
                                           ClickCase{"Mp4FromInsideAFrame", clicksMovie, 1.31},
                                           ClickCase{"Mp4FromTheSecondFrame", clicksMovie, 1.0 / 30},
                                           ClickCase{"MatroskaFromAKeyframe", clicksMatroska, 1.0},
                                           ClickCase{"MatroskaFromInsideAFrame", clicksMatroska, 1.31},
                                           ClickCase{"MatroskaFromTheSecondFrame", clicksMatroska, 1.0 / 30}),
                         caseName);

// One packet of a stream as ffprobe shows it.
struct ProbedPacket {
    qint64 pts = 0, duration = 0; // in the stream's time base (samples for MPEG-4 audio)
    QString hash;                 // MD5 of its data
};

QList<ProbedPacket> audioPackets(const QString &path, int audioIndex)
{
    const ToolRun r = runTool(QStringLiteral("ffprobe"), words("-v error -show_data_hash MD5 -show_entries packet=pts,duration,data_hash -of json -select_streams")
                                                               << QStringLiteral("a:%1").arg(audioIndex) << path);
    EXPECT_TRUE(r.ok()) << r.err.toStdString();
    QList<ProbedPacket> packets;
    for (const QJsonValue &v : QJsonDocument::fromJson(r.out).object().value(QLatin1String("packets")).toArray()) {
        const QJsonObject p = v.toObject();
        packets.append({p.value(QLatin1String("pts")).toInteger(), p.value(QLatin1String("duration")).toInteger(),
                        p.value(QLatin1String("data_hash")).toString()});
    }
    return packets;
}

// Noise tells every sample offset apart; a click at 2 s on an MP3 track beside it. The noise is
// seeded, so two test processes that make the cached file at once make the same file. Noise
// substitution stays off: its noise is drawn anew by each decoder, so a copy would not decode to the
// source's samples even when exact.
QString noiseMovie()
{
    return sharedFfmpegOutput(QStringList{QStringLiteral("-i"), sharedFixtureMovie({.seconds = 4, .audioTracks = 0})}
                           << words("-f lavfi -i anoisesrc=d=4:c=pink:r=48000:a=0.3:seed=14 -f lavfi -i aevalsrc=if(between(t\\,2\\,2.0005)\\,0.9\\,0):s=48000:d=4"
                                    " -map 0:v -map 1 -map 2 -c:v copy -c:a:0 aac -b:a:0 192k -aac_pns 0 -c:a:1 libmp3lame"));
}

struct AacRange {
    const char *name;
    double start, end;
};

class ExportAacCopyTest : public ExportTest, public ::testing::WithParamInterface<AacRange> {};

// A trim copies the AAC packets from the one before the start (the decoder's pre-roll) to the one
// holding the last sample before the end, bit for bit; the edit list starts playback on the sample at
// the start and ends the track at the end. The MP3 track beside it is re-encoded and stays in sync.
TEST_P(ExportAacCopyTest, CopiesThePacketsAndStartsOnTheSampleAtTheCut)
{
    constexpr int kRate = 48000;
    const auto [name, start, end] = GetParam();
    const QString source = noiseMovie();
    const QList<ProbedPacket> sourcePackets = audioPackets(source, 0);
    const QList<float> sourceSamples = audioSamples(source, 0, words("-ac 1"));
    const double click = loudestMoment(source, 1);
    ASSERT_NEAR(click, 2.0, 0.005);
    const QString output = trimmed(source, secondsRange(start, end, kRate));
    const qint64 first = std::llround(start * kRate), last = std::llround(std::min(end, 4.0) * kRate);
    QStringList expected, copied;
    for (qsizetype i = 0; i < sourcePackets.size(); ++i) {
        const ProbedPacket &p = sourcePackets[i], &next = sourcePackets.value(i + 1);
        const bool preRoll = i + 1 < sourcePackets.size() && next.pts <= first && next.pts + next.duration > first;
        if (preRoll || (p.pts + p.duration > first && p.pts < last))
            expected << p.hash;
    }
    for (const ProbedPacket &p : audioPackets(output, 0))
        copied << p.hash;
    EXPECT_EQ(copied, expected);

    const QList<QJsonObject> audio = probeStreams(output, "audio");
    ASSERT_EQ(audio.size(), 2);
    EXPECT_NEAR(seconds(audio[0], "duration"), double(last - first) / kRate, 1e-3);
    EXPECT_EQ(audio[1]["codec_name"].toString(), "aac") << "the MP3 track is re-encoded";
    // The first sample played is the one at the start; FFmpeg plays the last packet whole.
    const QList<float> samples = audioSamples(output, 0, words("-ac 1"));
    ASSERT_GE(samples.size(), last - first);
    EXPECT_LT(samples.size(), last - first + 1024);
    float worst = 0;
    for (qsizetype i = 0; i < std::min<qsizetype>(4800, last - first); ++i)
        worst = std::max(worst, std::abs(samples[i] - sourceSamples.value(first + i)));
    EXPECT_LT(worst, 1e-4f);
    if (start < click && click < end) {
        EXPECT_NEAR(loudestMoment(output, 1), click - start, 0.001);
    }
    if (secondDecoderAvailable()) {
        EXPECT_EQ(decodeVideoFramesWithSecondDecoder(output), countVideoFrames(output)) << "GStreamer reads the file too";
    }
}

// From the start (its priming packet is the pre-roll), inside frames, an end inside a frame, and an
// end past the movie's.
INSTANTIATE_TEST_SUITE_P(Ranges, ExportAacCopyTest,
                         ::testing::Values(AacRange{"FromTheStart", 0.0, 2.5}, AacRange{"InsideFrames", 1.31, 2.5},
                                           AacRange{"EndInsideAFrame", 1.31, 2.0105}, AacRange{"EndPastTheMovie", 3.9, 30.0}),
                         caseName);

// A mix sums the tracks it lists at unity gain (averaging would halve the tones) into one AAC track cut
// to the range, copying the video; a mix of one AAC track copies its packets, and an empty mix of a
// movie without audio gives no audio track.
struct MixCase {
    const char *name;
    QList<AudioMixInputParameters> tracks; // of kLong, whose audio tracks are 2 and 3; empty: a silent movie
    bool trimmed;                          // to 1 s .. 3 s
};

class ExportMixTest : public ExportTest, public ::testing::WithParamInterface<MixCase> {};

TEST_P(ExportMixTest, SumsTheListedTracksIntoOne)
{
    const MixCase &c = GetParam();
    const QString source = sharedFixtureMovie(c.tracks.isEmpty() ? fixture::FixtureSpec{.seconds = 1, .audioTracks = 0} : kLong);
    const QString output = exported(source, QStringLiteral("mixed.mp4"), [&](ExportSession &s) {
        s.setAudioMix(AudioMix{c.tracks});
        if (c.trimmed)
            s.setTimeRange(secondsRange(1, 3));
    });
    const QList<QJsonObject> audio = probeStreams(output, "audio");
    ASSERT_EQ(audio.size(), c.tracks.isEmpty() ? 0 : 1);
    if (!c.trimmed) {
        EXPECT_EQ(streamMD5(output, "0:v:0"), streamMD5(source, "0:v:0"));
    }
    if (c.tracks.isEmpty())
        return;
    EXPECT_EQ(readFrameNumbers(output).size(), c.trimmed ? 60 : 300);
    EXPECT_EQ(audio[0]["codec_name"].toString(), "aac");
    EXPECT_EQ(audio[0]["sample_rate"].toString(), "48000");
    EXPECT_EQ(audio[0]["channels"].toInt(), 2);
    EXPECT_NEAR(seconds(audio[0], "duration"), c.trimmed ? 2.0 : seconds(probeStreams(source, "audio")[0], "duration"), kAacFrameSeconds);
    for (int k : {0, 1}) {
        const bool listed = std::ranges::any_of(c.tracks, [&](const AudioMixInputParameters &p) { return p.trackID == k + 2; });
        const double level = toneLevel(output, 0, toneFrequency(k));
        EXPECT_TRUE(listed ? level > (c.trimmed ? 0.35 : 0.4) : level < 0.05) << k << ": " << level;
    }
    if (c.tracks.size() == 1) {
        EXPECT_EQ(streamMD5(output, "0:a:0"), streamMD5(source, QStringLiteral("0:a:%1").arg(c.tracks[0].trackID - 2)));
    }
}

INSTANTIATE_TEST_SUITE_P(Mixes, ExportMixTest,
                         ::testing::Values(MixCase{"BothTracks", {{2}, {3}}, false}, MixCase{"BothTracksTrimmed", {{2}, {3}}, true},
                                           MixCase{"TheSecondTrackAlone", {{3}}, false}, MixCase{"EmptyOfASilentMovie", {}, false}),
                         caseName);

// Two in-phase tracks at 0.9 would sum to twice full scale: the mix is summed yet limited below it.
TEST_F(ExportTest, MixOfLoudTracksIsLimitedBelowFullScale)
{
    const QString source = sharedFfmpegOutput(words("-f lavfi -i testsrc2=size=160x120:rate=30:duration=2 -f lavfi -i aevalsrc=0.9*sin(2*PI*200*t):s=48000:d=2"
                                                 " -f lavfi -i aevalsrc=0.9*sin(2*PI*200*t):s=48000:d=2 -map 0 -map 1 -map 2"
                                                 " -c:v libx264 -preset ultrafast -c:a pcm_s16le"),
                                           QStringLiteral("mov"));
    const QString output = exported(source, QStringLiteral("limited.mp4"), [&](ExportSession &s) { s.setAudioMix(mixOfAllAudioTracks(source)); });
    const ToolRun stats = runTool(QStringLiteral("ffmpeg"), words("-nostdin -i") << output << words("-map 0:a -af astats=measure_overall=Peak_level:measure_perchannel=none -f null -"));
    const QString text = QString::fromUtf8(stats.err);
    const qsizetype at = text.indexOf(QStringLiteral("Peak level dB:"));
    ASSERT_TRUE(stats.ok() && at >= 0) << stats.err.toStdString();
    const double peakDb = text.mid(at + 14).section(u'\n', 0, 0).trimmed().toDouble();
    // Far above a single 0.9 track (-0.9 dB), yet no clipping (0 dB); AAC overshoots a little.
    EXPECT_LT(peakDb, 0.5);
    EXPECT_GT(peakDb, -3.0);
}

} // namespace
} // namespace zaf::media
