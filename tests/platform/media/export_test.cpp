// ExportSession, checked from the outside: stream copies are bit-exact, trims keep exactly the
// frames of their range with every audio track in sync, mixes sum the listed tracks; refused
// sessions, bad settings or inputs, unwritable outputs and cancellation end with one completion,
// an error and no output file.
#include "platform/media/export_session.h"
#include "tests/support/log_capture.h"
#include "tests/support/media/decoded_pictures.h"
#include "tests/support/media/fixture_movies.h"
#include "tests/support/media/second_decoder.h"
#include "tests/support/private_mounts.h"
#include "tests/support/temp_dir.h"

#include <QCoreApplication>
#include <QDir>
#include <QFile>
#include <QFileInfo>
#include <QHash>
#include <QJsonArray>
#include <QJsonDocument>
#include <QSet>
#include <QThread>

#include <gtest/gtest.h>

#include <atomic>
#include <cmath>
#include <condition_variable>
#include <cstring>
#include <mutex>
#include <thread>

namespace zaf::media {
namespace {

using zaf::fixture::FixtureSpec;
using zaf::fixture::toneFrequency;
using namespace zaf::test;

constexpr double kAacFrameSeconds = 1024.0 / 48000.0;
// 10 s with two audio tracks (keyframes every 30 frames), and 2 s turned 90 degrees with two tracks.
const FixtureSpec kLong{.seconds = 10, .audioTracks = 2};
const FixtureSpec kRotated{.seconds = 2, .audioTracks = 2, .rotation = 90};

double seconds(const QJsonObject &stream, const char *key)
{
    return stream.value(QLatin1String(key)).toString().toDouble();
}

std::shared_ptr<ExportSession> makeSession(const QString &source, const QString &output)
{
    auto session = ExportSession::exportSessionWithAsset(MediaAsset::assetWithURL(QUrl::fromLocalFile(source)),
                                                         QString::fromLatin1(kExportPresetHighestQuality));
    EXPECT_NE(session, nullptr);
    session->setOutputURL(QUrl::fromLocalFile(output));
    session->setOutputFileType(QString::fromLatin1(kFileTypeMPEG4));
    return session;
}

// What the completion of one export saw.
struct ExportOutcome {
    int completions = 0;
    bool ranOnMainThread = false;
    ExportStatus statusInCompletion = ExportStatus::Unknown;
};

// Records the completion of one export and waits for it (bounded).
class ExportWaiter {
public:
    std::function<void()> completion(const std::shared_ptr<ExportSession> &session)
    {
        return [this, weak = std::weak_ptr<ExportSession>(session)] {
            std::lock_guard lock(m_mutex);
            ++m_outcome.completions;
            m_outcome.ranOnMainThread = QThread::currentThread() == QCoreApplication::instance()->thread();
            if (auto s = weak.lock())
                m_outcome.statusInCompletion = s->status();
            m_done.notify_all();
        };
    }
    // Waits for the first completion, then a moment for any unexpected second one.
    ExportOutcome wait()
    {
        std::unique_lock lock(m_mutex);
        EXPECT_TRUE(m_done.wait_for(lock, std::chrono::seconds(180), [this] { return m_outcome.completions > 0; }));
        m_done.wait_for(lock, std::chrono::milliseconds(50), [this] { return m_outcome.completions > 1; });
        return m_outcome;
    }

private:
    std::mutex m_mutex;
    std::condition_variable_any m_done;
    ExportOutcome m_outcome;
};

// Runs the export to its end, expecting one completion off the main thread that already sees the
// final status, and returns that status.
ExportStatus runToEnd(const std::shared_ptr<ExportSession> &session)
{
    ExportWaiter waiter;
    session->exportAsynchronously(waiter.completion(session));
    const ExportOutcome outcome = waiter.wait();
    EXPECT_EQ(outcome.completions, 1);
    EXPECT_FALSE(outcome.ranOnMainThread);
    EXPECT_EQ(outcome.statusInCompletion, session->status());
    return session->status();
}

// The audio mix that names every audio track of a movie, in order.
AudioMix mixOfAllAudioTracks(const QString &path)
{
    AudioMix mix;
    for (const AssetTrack &track : MediaAsset::assetWithURL(QUrl::fromLocalFile(path))->tracksWithMediaType(MediaType::Audio))
        mix.inputParameters.append(AudioMixInputParameters{track.trackID});
    return mix;
}

class ExportTest : public ::testing::Test {
protected:
    // Exports `source` into the scratch directory with `configure` applied, expecting completion.
    QString exported(const QString &source, const QString &name, const std::function<void(ExportSession &)> &configure = {})
    {
        auto session = makeSession(source, scratch.file(name));
        if (configure)
            configure(*session);
        EXPECT_EQ(runToEnd(session), ExportStatus::Completed) << (session->error() ? session->error()->description().toStdString() : "");
        EXPECT_FLOAT_EQ(session->progress(), 1.0f);
        return scratch.file(name);
    }
    ScratchDir scratch;
};

// Without range or mix every stream is copied packet for packet, rotation included, and only the
// output is left behind, with the permissions of any new file of the user.
TEST_F(ExportTest, ExportWithoutRangeOrMixCopiesEveryStreamBitExact)
{
    const QString source = sharedFixtureMovie(kRotated);
    const QString output = scratch.file(QStringLiteral("copy.mp4"));
    auto session = makeSession(source, output);
    EXPECT_EQ(session->status(), ExportStatus::Unknown);
    EXPECT_EQ(session->progress(), 0.0f);
    ASSERT_EQ(runToEnd(session), ExportStatus::Completed);
    EXPECT_FALSE(session->error().has_value());
    EXPECT_FLOAT_EQ(session->progress(), 1.0f);
    EXPECT_EQ(session->outputURL(), QUrl::fromLocalFile(output));

    ASSERT_EQ(probeStreams(output, "audio").size(), 2);
    const QList<QJsonObject> video = probeStreams(output, "video");
    ASSERT_EQ(video.size(), 1);
    EXPECT_EQ(probeRotation(video[0]), 90);
    for (const char *map : {"0:v:0", "0:a:0", "0:a:1"}) {
        SCOPED_TRACE(map);
        const QString hash = streamMD5(output, map);
        EXPECT_FALSE(hash.isEmpty());
        EXPECT_EQ(hash, streamMD5(source, map));
    }
    EXPECT_EQ(readFrameNumbers(output), readFrameNumbers(source));
    EXPECT_EQ(QDir(scratch.path()).entryList(QDir::Files | QDir::Hidden), QStringList{QStringLiteral("copy.mp4")});
    QFile plain(scratch.file(QStringLiteral("plain")));
    ASSERT_TRUE(plain.open(QIODevice::WriteOnly));
    EXPECT_EQ(QFileInfo(output).permissions(), plain.permissions());
}

// Progress read while exporting stays within 0..1, never goes back, and ends at 1.
TEST_F(ExportTest, ProgressRisesToOneWhileExporting)
{
    auto session = makeSession(sharedFixtureMovie(kLong), scratch.file(QStringLiteral("progress.mp4")));
    session->setTimeRange(MediaTimeRange{MediaTime::make(1, 1), MediaTime::make(4, 1)});
    std::atomic<bool> done{false};
    std::vector<float> seen;
    ExportWaiter waiter;
    session->exportAsynchronously([&, completion = waiter.completion(session)] {
        done = true;
        completion();
    });
    while (!done) {
        seen.push_back(session->progress());
        std::this_thread::sleep_for(std::chrono::milliseconds(5));
    }
    waiter.wait();
    ASSERT_EQ(session->status(), ExportStatus::Completed);
    for (std::size_t i = 0; i < seen.size(); ++i) {
        EXPECT_TRUE(seen[i] >= 0.0f && seen[i] <= 1.0f) << seen[i];
        EXPECT_GE(seen[i], i ? seen[i - 1] : 0.0f);
    }
    EXPECT_FLOAT_EQ(session->progress(), 1.0f);
}

// A trim keeps exactly the frames shown during its range, whatever the keyframes, B-frames,
// rotation or end past the movie, and cuts every audio track to the same range with its own tone.
TEST_F(ExportTest, TrimKeepsExactlyTheFramesOfItsRangeAndEveryAudioTrackInSync)
{
    // Re-encoded with B-frames and an edit list, as camera and recorder files have.
    const QString bframes = scratch.file(QStringLiteral("bframes.mp4"));
    ASSERT_TRUE(ffmpeg(QStringList{QStringLiteral("-i"), sharedFixtureMovie({.seconds = 4, .audioTracks = 1, .gop = 60})}
                       << words("-map 0 -c:v libx264 -bf 3 -g 60 -crf 12 -c:a copy") << bframes));
    struct Case {
        const char *name;
        QString source;
        MediaTime start, end;
        int firstFrame, frames, audioTracks;
        double seconds;
    };
    const QList<Case> cases{
        {"2 s to 7 s in the player's nanoseconds", sharedFixtureMovie(kLong), MediaTime::make(2'000'000'000, 1'000'000'000),
         MediaTime::make(7'000'000'000, 1'000'000'000), 60, 150, 2, 5.0},
        // 1.12 s falls inside frame 33 (1.100 s .. 1.133 s), between the keyframes 30 and 60.
        {"start between keyframes", sharedFixtureMovie(kLong), MediaTime::make(112, 100), MediaTime::make(2, 1), 33, 27, 2, 0.88},
        {"end past the movie", sharedFixtureMovie(kLong), MediaTime::make(9, 1), MediaTime::make(30, 1), 270, 30, 2, 1.0},
        // Frames 75 (2.500 s .. 2.533 s) to 107 (3.567 s .. 3.600 s).
        {"B-frames", bframes, MediaTime::make(2525, 1000), MediaTime::make(3600, 1000), 75, 33, 1, 1.075},
        {"rotated", sharedFixtureMovie(kRotated), MediaTime::make(1, 2), MediaTime::make(3, 2), 15, 30, 2, 1.0},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        const QString output = exported(c.source, QString::fromLatin1(c.name) + QStringLiteral(".mp4"),
                                        [&](ExportSession &s) { s.setTimeRange(MediaTimeRange::fromStartEnd(c.start, c.end)); });
        const QList<int> frames = readFrameNumbers(output);
        ASSERT_EQ(frames.size(), c.frames);
        for (int i = 0; i < frames.size(); ++i)
            ASSERT_EQ(frames[i], c.firstFrame + i) << "at output frame " << i;
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
        EXPECT_EQ(probeRotation(video[0]), probeRotation(probeStreams(c.source, "video").value(0)));
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
            EXPECT_GT(toneLevel(output, k, toneFrequency(k)), 0.35);
            EXPECT_LT(toneLevel(output, k, toneFrequency(1 - k)), 0.05);
        }
    }
    // Our own reader sees the rotated trim's transform.
    const auto track = MediaAsset::assetWithURL(QUrl::fromLocalFile(scratch.file(QStringLiteral("rotated.mp4"))))
                           ->tracksWithMediaType(MediaType::Video);
    ASSERT_EQ(track.size(), 1);
    EXPECT_EQ(track[0].preferredTransform, AffineTransform::rotation(90, 320, 240));
}

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
    const char *encode; // ffmpeg options re-encoding the fixture; empty: the fixture itself
    bool copiesGroups = false; // the export copies whole groups (H.264 with closed groups)
};

class ExportTrimSourceTest : public ExportTest, public ::testing::WithParamInterface<TrimSource> {};

TEST_P(ExportTrimSourceTest, EveryCutHoldsExactlyTheFramesShownDuringItsRange)
{
    QString source = sharedFixtureMovie(GetParam().spec);
    if (*GetParam().encode) {
        source = scratch.file(QStringLiteral("source.mp4"));
        ASSERT_TRUE(ffmpeg(QStringList{QStringLiteral("-i"), sharedFixtureMovie(GetParam().spec)} << words(GetParam().encode) << source));
    }
    const QList<double> pts = presentationTimes(source);
    const DecodedPictures sourcePictures = decodePictures(source);
    const QList<int> &numbers = sourcePictures.numbers;
    const QList<int> keys = keyFrameIndexes(source);
    ASSERT_EQ(pts.size(), numbers.size());
    ASSERT_GE(keys.size(), 2);
    const int k = keys[1];
    ASSERT_TRUE(k >= 2 && k + 10 < pts.size()) << k;
    const double movieEnd = pts.last() + (pts.last() - pts[pts.size() - 2]);
    constexpr double kInto = 1e-4;
    struct Cut {
        const char *name;
        double start, end;
    };
    const QList<Cut> cuts{{"keyframe", pts[k] + kInto, pts[k + 9] + kInto},
                          {"frame-before-keyframe", pts[k - 1] + kInto, pts[k + 9] + kInto},
                          {"frame-after-keyframe", pts[k + 1] + kInto, pts[k + 9] + kInto},
                          {"inside-one-group", pts[k + 2] + kInto, pts[k + 7] + kInto},
                          // From the frame before a keyframe over a whole group into the next one (or to the last frame).
                          {"across-groups", pts[k - 1] + kInto, pts[keys.size() > 2 ? keys[2] + 1 : pts.size() - 1] + kInto},
                          {"whole-movie", 0.0, movieEnd}};
    QHash<int, qsizetype> sourceIndex; // by frame number
    for (qsizetype i = 0; i < numbers.size(); ++i)
        sourceIndex.insert(numbers[i], i);
    for (const Cut &c : cuts) {
        SCOPED_TRACE(c.name);
        // From the frame on screen at the start to the last that begins before the end.
        const auto shown = [&](int i) { return (i + 1 < pts.size() ? pts[i + 1] : movieEnd) > c.start && pts[i] < c.end; };
        QList<int> expected;
        for (int i = 0; i < pts.size(); ++i) {
            if (shown(i))
                expected << numbers[i];
        }
        QSet<int> inWholeGroups; // frames of the groups (keyframe to keyframe) kept whole
        for (int g = 0; g < keys.size(); ++g) {
            const int end = g + 1 < keys.size() ? keys[g + 1] : int(pts.size());
            if (shown(keys[g]) && shown(end - 1)) {
                for (int i = keys[g]; i < end; ++i)
                    inWholeGroups << numbers[i];
            }
        }
        const QString output = exported(source, QString::fromLatin1(c.name) + QStringLiteral(".mp4"), [&](ExportSession &s) {
            s.setTimeRange(MediaTimeRange::fromStartEnd(MediaTime::fromSeconds(c.start, 1000000), MediaTime::fromSeconds(c.end, 1000000)));
        });
        const DecodedPictures pictures = decodePictures(output);
        EXPECT_EQ(pictures.numbers, expected);
        QList<int> notCopied, damaged; // frame numbers
        for (qsizetype i = 0; i < pictures.numbers.size(); ++i) {
            const qsizetype from = sourceIndex.value(pictures.numbers[i], -1);
            if (from < 0)
                continue; // a frame the source lacks: the numbers differ already
            if (GetParam().copiesGroups && inWholeGroups.contains(pictures.numbers[i]) && pictures.planes[i] != sourcePictures.planes[from])
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
}

INSTANTIATE_TEST_SUITE_P(Sources, ExportTrimSourceTest, ::testing::Values(
    TrimSource{"NoBFramesOneSecondGroups", {.seconds = 4, .gop = 30}, "", true},
    TrimSource{"BFramesOneSecondGroups", {.seconds = 4}, "-map 0 -c:v libx264 -preset veryfast -bf 3 -g 30 -sc_threshold 0 -c:a copy", true},
    TrimSource{"BFramesEightSecondGroups", {.seconds = 12}, "-map 0 -c:v libx264 -preset veryfast -bf 3 -g 240 -keyint_min 240 -sc_threshold 0 -c:a copy", true},
    TrimSource{"SixtyFps", {.seconds = 3, .fps = 60}, "-map 0 -c:v libx264 -preset veryfast -bf 3 -g 60 -sc_threshold 0 -c:a copy", true},
    TrimSource{"VariableFrameRate", {.seconds = 4}, "-map 0 -vf setpts=(N+floor(N/3)*0.5)/30/TB -fps_mode passthrough -c:v libx264 -preset veryfast -bf 3 -g 30 -sc_threshold 0 -c:a copy", true},
    TrimSource{"OpenGroups", {.seconds = 4}, "-map 0 -c:v libx264 -preset veryfast -bf 3 -g 30 -sc_threshold 0 -x264-params open_gop=1 -c:a copy"},
    TrimSource{"Rotated", {.seconds = 4, .rotation = 90, .gop = 30}, "", true},
    TrimSource{"NotH264", {.seconds = 4}, "-map 0 -c:v mpeg4 -q:v 1 -g 30 -c:a copy"}),
    [](const ::testing::TestParamInfo<TrimSource> &info) { return std::string(info.param.name); });

// A click at a known moment of each audio track lands where it should after a trim, within a
// millisecond, on a keyframe, inside a frame or a frame after the start.
TEST_F(ExportTest, TrimKeepsEachAudioTracksClickWithinAMillisecond)
{
    const QString source = scratch.file(QStringLiteral("clicks.mp4"));
    ASSERT_TRUE(ffmpeg(QStringList{QStringLiteral("-i"), sharedFixtureMovie({.seconds = 4, .audioTracks = 0})}
                       << words("-f lavfi -i aevalsrc=if(between(t\\,2\\,2.0005)\\,0.9\\,0):s=48000:d=4"
                                " -f lavfi -i aevalsrc=if(between(t\\,2.5\\,2.5005)\\,0.9\\,0):s=48000:d=4"
                                " -map 0:v -map 1 -map 2 -c:v copy -c:a aac -b:a 256k")
                       << source));
    // Matroska counts milliseconds, not samples: its AAC tracks are re-encoded, and cut in samples.
    const QString matroska = scratch.file(QStringLiteral("clicks.mkv"));
    ASSERT_TRUE(ffmpeg(QStringList{QStringLiteral("-i"), source} << words("-map 0 -c copy") << matroska));
    for (const QString &movie : {source, matroska}) {
        const double clicks[2] = {loudestMoment(movie, 0), loudestMoment(movie, 1)};
        // The Matroska copy plays its priming (about 21 ms): each source's own clicks are the reference.
        ASSERT_NEAR(clicks[0], 2.0, 0.03) << qPrintable(movie);
        ASSERT_NEAR(clicks[1], 2.5, 0.03) << qPrintable(movie);
        for (const double start : {1.0, 1.31, 1.0 / 30}) {
            SCOPED_TRACE(QStringLiteral("%1 from %2").arg(movie).arg(start).toStdString());
            const QString output = exported(movie, QStringLiteral("clicks-%1-%2.mp4").arg(QFileInfo(movie).suffix()).arg(start), [&](ExportSession &s) {
                s.setTimeRange(MediaTimeRange::fromStartEnd(MediaTime::fromSeconds(start, 1000000), MediaTime::fromSeconds(3.6, 1000000)));
            });
            for (int k = 0; k < 2; ++k)
                EXPECT_NEAR(loudestMoment(output, k), clicks[k] - start, 0.001) << "track " << k;
            EXPECT_NEAR(seconds(probeStreams(output, "audio")[0], "duration"), 3.6 - start, 0.025);
        }
    }
}

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

// The samples of an audio stream mixed to mono, as FFmpeg plays them (from where the edit list starts).
QList<float> decodedSamples(const QString &path, int audioIndex)
{
    const ToolRun r = runTool(QStringLiteral("ffmpeg"), QStringList{QStringLiteral("-nostdin"), QStringLiteral("-v"), QStringLiteral("error"),
                                                                   QStringLiteral("-i"), path, QStringLiteral("-map"), QStringLiteral("0:a:%1").arg(audioIndex)}
                                                           << words("-ac 1 -c:a pcm_f32le -f f32le -"));
    EXPECT_TRUE(r.ok()) << r.err.toStdString();
    QList<float> samples(r.out.size() / qsizetype(sizeof(float)));
    std::memcpy(samples.data(), r.out.constData(), samples.size() * sizeof(float));
    return samples;
}

// A trim copies the AAC packets from the one before the start (the decoder's pre-roll) to the one
// holding the last sample before the end, bit for bit; the edit list starts playback on the sample at
// the start and ends the track at the end. An MP3 track beside it is re-encoded and stays in sync.
TEST_F(ExportTest, TrimCopiesAacPacketsAndStartsOnTheSampleAtTheCut)
{
    constexpr int kRate = 48000;
    // Noise tells every sample offset apart. Noise substitution stays off: its noise is drawn anew
    // by each decoder, so a copy would not decode to the source's samples even when exact.
    const QString source = scratch.file(QStringLiteral("noise.mp4"));
    ASSERT_TRUE(ffmpeg(QStringList{QStringLiteral("-i"), sharedFixtureMovie({.seconds = 4, .audioTracks = 0})}
                       << words("-f lavfi -i anoisesrc=d=4:c=pink:r=48000:a=0.3 -f lavfi -i aevalsrc=if(between(t\\,2\\,2.0005)\\,0.9\\,0):s=48000:d=4"
                                " -map 0:v -map 1 -map 2 -c:v copy -c:a:0 aac -b:a:0 192k -aac_pns 0 -c:a:1 libmp3lame")
                       << source));
    const QList<ProbedPacket> sourcePackets = audioPackets(source, 0);
    const QList<float> sourceSamples = decodedSamples(source, 0);
    const double click = loudestMoment(source, 1);
    ASSERT_NEAR(click, 2.0, 0.005);
    // From the start (its priming packet is the pre-roll), inside frames, an end inside a frame, and
    // an end past the movie's.
    for (const auto &[start, end] : {std::pair{0.0, 2.5}, {1.31, 2.5}, {1.31, 2.0105}, {3.9, 30.0}}) {
        SCOPED_TRACE(QStringLiteral("%1 to %2").arg(start).arg(end).toStdString());
        const QString output = exported(source, QStringLiteral("noise-%1-%2.mp4").arg(start).arg(end), [&](ExportSession &s) {
            s.setTimeRange(MediaTimeRange::fromStartEnd(MediaTime::fromSeconds(start, kRate), MediaTime::fromSeconds(end, kRate)));
        });
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
        const QList<float> samples = decodedSamples(output, 0);
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
}

// A trim with an audio mix gives one mixed track cut to the range.
TEST_F(ExportTest, TrimWithAudioMixGivesOneMixedTrackCutToTheRange)
{
    const QString output = exported(sharedFixtureMovie(kLong), QStringLiteral("trim-mix.mp4"), [](ExportSession &s) {
        s.setTimeRange(MediaTimeRange::fromStartEnd(MediaTime::make(1, 1), MediaTime::make(3, 1)));
        s.setAudioMix(AudioMix{{{2}, {3}}});
    });
    const QList<QJsonObject> audio = probeStreams(output, "audio");
    ASSERT_EQ(audio.size(), 1);
    EXPECT_NEAR(seconds(audio[0], "duration"), 2.0, kAacFrameSeconds);
    EXPECT_GT(toneLevel(output, 0, toneFrequency(0)), 0.35);
    EXPECT_GT(toneLevel(output, 0, toneFrequency(1)), 0.35);
    EXPECT_EQ(readFrameNumbers(output).size(), 60);
}

// A mix sums the tracks it lists at unity gain into one AAC track (averaging would halve the tones),
// drops the tracks it does not list, and copies the video.
TEST_F(ExportTest, MixSumsListedTracksAtUnityGainDropsOthersAndCopiesVideo)
{
    const QString source = sharedFixtureMovie(kLong);
    const AudioMix all = mixOfAllAudioTracks(source);
    ASSERT_EQ(all.inputParameters.size(), 2);
    const QString output = exported(source, QStringLiteral("mixed.mp4"), [&](ExportSession &s) { s.setAudioMix(all); });
    const QList<QJsonObject> audio = probeStreams(output, "audio");
    ASSERT_EQ(audio.size(), 1);
    EXPECT_EQ(audio[0]["codec_name"].toString(), "aac");
    EXPECT_EQ(audio[0]["sample_rate"].toString(), "48000");
    EXPECT_EQ(audio[0]["channels"].toInt(), 2);
    EXPECT_GT(toneLevel(output, 0, toneFrequency(0)), 0.4);
    EXPECT_GT(toneLevel(output, 0, toneFrequency(1)), 0.4);
    EXPECT_NEAR(seconds(audio[0], "duration"), seconds(probeStreams(source, "audio")[0], "duration"), kAacFrameSeconds);
    EXPECT_EQ(probeStreams(output, "video").size(), 1);
    EXPECT_EQ(streamMD5(output, "0:v:0"), streamMD5(source, "0:v:0"));

    const QString second = exported(source, QStringLiteral("second.mp4"), [&](ExportSession &s) { s.setAudioMix(AudioMix{{all.inputParameters[1]}}); });
    ASSERT_EQ(probeStreams(second, "audio").size(), 1);
    EXPECT_GT(toneLevel(second, 0, toneFrequency(1)), 0.4);
    EXPECT_LT(toneLevel(second, 0, toneFrequency(0)), 0.05);
    // One track has nothing to mix: its packets are copied, not re-encoded.
    EXPECT_EQ(streamMD5(second, "0:a:0"), streamMD5(source, "0:a:1"));
}

// An empty mix of a movie without audio gives a movie without an audio track, video copied.
TEST_F(ExportTest, EmptyMixOfMovieWithoutAudioGivesMovieWithoutAudioTrack)
{
    const QString source = sharedFixtureMovie({.seconds = 1, .audioTracks = 0});
    const QString output = exported(source, QStringLiteral("silent.mp4"), [&](ExportSession &s) { s.setAudioMix(AudioMix{}); });
    EXPECT_TRUE(probeStreams(output, "audio").isEmpty());
    EXPECT_EQ(streamMD5(output, "0:v:0"), streamMD5(source, "0:v:0"));
}

// Two in-phase tracks at 0.9 would sum to twice full scale: the mix is summed yet limited below it.
TEST_F(ExportTest, MixOfLoudTracksIsLimitedBelowFullScale)
{
    const QString source = scratch.file(QStringLiteral("loud.mov"));
    ASSERT_TRUE(ffmpeg(words("-f lavfi -i testsrc2=size=160x120:rate=30:duration=2 -f lavfi -i aevalsrc=0.9*sin(2*PI*200*t):s=48000:d=2"
                             " -f lavfi -i aevalsrc=0.9*sin(2*PI*200*t):s=48000:d=2 -map 0 -map 1 -map 2"
                             " -c:v libx264 -preset ultrafast -c:a pcm_s16le")
                       << source));
    const QString output = exported(source, QStringLiteral("limited.mp4"), [&](ExportSession &s) { s.setAudioMix(mixOfAllAudioTracks(source)); });
    const ToolRun stats = runTool(QStringLiteral("ffmpeg"), QStringList{QStringLiteral("-nostdin"), QStringLiteral("-i"), output}
                                      + words("-map 0:a -af astats=measure_overall=Peak_level:measure_perchannel=none -f null -"));
    const QString text = QString::fromUtf8(stats.err);
    const qsizetype at = text.indexOf(QStringLiteral("Peak level dB:"));
    ASSERT_TRUE(stats.ok() && at >= 0) << stats.err.toStdString();
    const double peakDb = text.mid(at + 14).section(u'\n', 0, 0).trimmed().toDouble();
    // Far above a single 0.9 track (-0.9 dB), yet no clipping (0 dB); AAC overshoots a little.
    EXPECT_LT(peakDb, 0.5);
    EXPECT_GT(peakDb, -3.0);
}

class ExportFailureTest : public ::testing::Test {
protected:
    // Runs the session, expects Failed with `code` and a logged error, and no output file at all.
    void expectFailure(const std::shared_ptr<ExportSession> &session, int code)
    {
        LogCapture log;
        ASSERT_EQ(runToEnd(session), ExportStatus::Failed);
        ASSERT_TRUE(session->error().has_value());
        EXPECT_EQ(session->error()->domain, QString::fromLatin1(kMediaErrorDomain));
        EXPECT_EQ(session->error()->code, code) << session->error()->description().toStdString();
        EXPECT_FALSE(log.messages(QStringLiteral("zaf.media.export")).isEmpty());
        EXPECT_FALSE(QFile::exists(output));
        expectNoPartialFiles();
    }
    void expectNoPartialFiles() { expectNoPartialFilesIn(scratch.path()); }
    static void expectNoPartialFilesIn(const QString &directory)
    {
        for (const QString &name : QDir(directory).entryList(QDir::Files | QDir::Hidden))
            EXPECT_FALSE(name.contains(QStringLiteral("partial"))) << name.toStdString();
    }
    ScratchDir scratch;
    const QString source = sharedFixtureMovie({.seconds = 2, .audioTracks = 1});
    QString output = scratch.file(QStringLiteral("out.mp4"));
};

TEST_F(ExportFailureTest, SessionCreationFailsForNullAssetOrUnknownPreset)
{
    // Sessions that do get made carry distinct, increasing ids.
    const auto first = makeSession(source, output), second = makeSession(source, output);
    EXPECT_NE(first->sessionID(), 0u);
    EXPECT_GT(second->sessionID(), first->sessionID());
    EXPECT_EQ(ExportSession::exportSessionWithAsset(nullptr, QString::fromLatin1(kExportPresetHighestQuality)), nullptr);
    EXPECT_EQ(ExportSession::exportSessionWithAsset(MediaAsset::assetWithURL(QUrl::fromLocalFile(source)), QStringLiteral("LowQuality")),
              nullptr);
}

// Every unusable setting fails the export with InvalidArgument.
TEST_F(ExportFailureTest, ExportFailsWithInvalidArgumentForBadSettings)
{
    const QList<std::pair<const char *, std::function<void(ExportSession &)>>> cases{
        {"other file type", [](ExportSession &s) { s.setOutputFileType(QStringLiteral("com.example.matroska")); }},
        {"no output URL", [](ExportSession &s) { s.setOutputURL(QUrl()); }},
        {"empty range", [](ExportSession &s) { s.setTimeRange({MediaTime::make(1, 1), MediaTime::zero()}); }},
        {"negative duration", [](ExportSession &s) { s.setTimeRange({MediaTime::make(1, 1), MediaTime::make(-1, 2)}); }},
        {"invalid start", [](ExportSession &s) { s.setTimeRange({MediaTime::invalid(), MediaTime::make(1, 1)}); }},
        {"negative start", [](ExportSession &s) { s.setTimeRange({MediaTime::make(-1, 1), MediaTime::make(2, 1)}); }},
        {"starts after the end", [](ExportSession &s) { s.setTimeRange({MediaTime::make(5, 1), MediaTime::make(1, 1)}); }},
        {"mix names a video track", [](ExportSession &s) { s.setAudioMix(AudioMix{{{1}}}); }},
    };
    for (const auto &[name, configure] : cases) {
        SCOPED_TRACE(name);
        auto session = makeSession(source, output);
        configure(*session);
        expectFailure(session, kMediaErrorInvalidArgument);
    }
}

// An existing output is left as it was; a missing output directory is a write error.
TEST_F(ExportFailureTest, ExportNeverOverwritesAnExistingOutputAndFailsIntoMissingDirectory)
{
    QFile existing(output);
    ASSERT_TRUE(existing.open(QIODevice::WriteOnly));
    existing.write("keep me");
    existing.close();
    auto session = makeSession(source, output);
    LogCapture log;
    ASSERT_EQ(runToEnd(session), ExportStatus::Failed);
    EXPECT_EQ(session->error()->code, kMediaErrorOutputExists);
    ASSERT_TRUE(existing.open(QIODevice::ReadOnly));
    EXPECT_EQ(existing.readAll(), QByteArray("keep me"));
    expectNoPartialFiles();

    output = scratch.file(QStringLiteral("no-such-dir/out.mp4"));
    expectFailure(makeSession(source, output), kMediaErrorWriteFailed);
}

// Inputs that are missing, empty, noise, or either half of a movie fail to open, for a plain copy
// and for a trim alike.
TEST_F(ExportFailureTest, ExportOfMissingEmptyTruncatedOrNonMovieInputFails)
{
    QFile good(source);
    ASSERT_TRUE(good.open(QIODevice::ReadOnly));
    const QByteArray bytes = good.readAll();
    auto writeFile = [&](const char *name, const QByteArray &data) {
        QFile f(scratch.file(QString::fromLatin1(name)));
        EXPECT_TRUE(f.open(QIODevice::WriteOnly));
        f.write(data);
        return f.fileName();
    };
    for (const QString &path : {scratch.file(QStringLiteral("missing.mp4")), writeFile("empty.mp4", {}),
                                writeFile("noise.mp4", QByteArray(100000, '\x5a')), writeFile("head.mp4", bytes.left(bytes.size() / 3)),
                                writeFile("tail.mp4", bytes.mid(bytes.size() / 3))}) {
        for (bool withRange : {false, true}) {
            SCOPED_TRACE(path.toStdString() + (withRange ? " with a range" : ""));
            auto session = makeSession(path, output);
            if (withRange)
                session->setTimeRange(MediaTimeRange{MediaTime::zero(), MediaTime::make(1, 1)});
            expectFailure(session, kMediaErrorCannotOpen);
        }
    }
}

// Cancelling a running export ends it Cancelled, with one completion off the main thread and no
// output. The wait after the cancel returns within its bound once nothing is written any more, even
// while the completion is held up (as the editor's is by its hop to the main thread).
TEST_F(ExportFailureTest, CancelledExportStopsWritingWithinTheWaitAndLeavesNoOutput)
{
    // One group of pictures cut inside: every picture is re-encoded, so the export runs a while.
    auto session = makeSession(sharedFixtureMovie({.seconds = 20, .width = 640, .height = 480, .audioTracks = 2, .gop = 600}), output);
    session->setTimeRange(MediaTimeRange{MediaTime::make(1, 2), MediaTime::make(20, 1)});
    EXPECT_TRUE(session->waitUntilFinished(std::chrono::milliseconds(0))) << "a session not started writes nothing";
    ExportWaiter waiter;
    std::mutex gate;
    std::unique_lock held(gate);
    session->exportAsynchronously([&, completion = waiter.completion(session)] {
        std::lock_guard wait(gate);
        completion();
    });
    // Cancel once the export has really started writing.
    for (int i = 0; i < 2000 && session->progress() <= 0.0f && session->status() != ExportStatus::Failed; ++i)
        std::this_thread::sleep_for(std::chrono::milliseconds(5));
    EXPECT_FALSE(session->waitUntilFinished(std::chrono::milliseconds(1))) << "the export is still writing";
    session->cancelExport();
    EXPECT_TRUE(session->waitUntilFinished(std::chrono::seconds(10)));
    EXPECT_EQ(session->status(), ExportStatus::Cancelled);
    EXPECT_FALSE(QFile::exists(output));
    expectNoPartialFiles();
    held.unlock();
    const ExportOutcome outcome = waiter.wait();
    EXPECT_EQ(outcome.completions, 1);
    EXPECT_FALSE(outcome.ranOnMainThread);
    EXPECT_EQ(outcome.statusInCompletion, ExportStatus::Cancelled);
    ASSERT_TRUE(session->error().has_value());
    EXPECT_EQ(session->error()->code, kMediaErrorCancelled);

    // The output's name is free again: the next export to it writes the whole movie.
    EXPECT_EQ(runToEnd(makeSession(source, output)), ExportStatus::Completed);
    EXPECT_EQ(QDir(scratch.path()).entryList(QDir::AllEntries | QDir::Hidden | QDir::NoDotAndDotDot), QStringList{"out.mp4"});
}

// A volume that fills up while the export writes: the export fails as disk full with a logged
// error, leaves no output and no partial file, and the source stays as it was.
TEST_F(ExportFailureTest, ExportOntoAVolumeThatFillsUpFailsAsDiskFullLeavingNothing)
{
    if (!insidePrivateMounts())
        return runThisTestInPrivateMounts();
    const QByteArray before = fileDigest(source);
    const QString small = scratch.file(QStringLiteral("small"));
    ASSERT_TRUE(QDir().mkpath(small));
    ASSERT_GT(QFileInfo(source).size(), 2 * 16384);
    const ScopedTmpfs volume(small, 16384);
    if (!volume.mounted())
        return;
    output = QDir(small).filePath(QStringLiteral("out.mp4"));
    expectFailure(makeSession(source, output), kMediaErrorDiskFull);
    expectNoPartialFilesIn(small);
    EXPECT_EQ(QDir(small).entryList(QDir::AllEntries | QDir::Hidden | QDir::NoDotAndDotDot), QStringList());
    EXPECT_EQ(fileDigest(source), before);
}

// Cancelling before the start ends the export Cancelled; a session exports once, so starting it
// again only runs the completion.
TEST_F(ExportFailureTest, CancelBeforeStartEndsCancelledWithOneCompletion)
{
    auto session = makeSession(source, output);
    session->cancelExport();
    EXPECT_EQ(session->status(), ExportStatus::Cancelled);
    EXPECT_TRUE(session->waitUntilFinished(std::chrono::milliseconds(0)));
    EXPECT_EQ(runToEnd(session), ExportStatus::Cancelled);
    EXPECT_EQ(runToEnd(session), ExportStatus::Cancelled);
    EXPECT_FALSE(QFile::exists(output));
}

} // namespace
} // namespace zaf::media
