// media_bench: times our media engine and the ffmpeg command-line tool doing the same jobs in the
// same run, and prints the ratios (ours / ffmpeg).
//
//   media_bench [--movie PATH] [--runs N] [--work DIR]
//
// The recording is 60 s of 1080p30 with two audio tracks, H.264 with B-frames and 2 s groups of
// pictures, as screen recorders write it. Without --movie it is generated (once, kept in the work
// directory): the fixture generator's numbered frames with fine moving grain over them (flat
// pictures would cost every encoder and decoder far less than real ones; the grain brings the bit
// rate to about 9 Mb/s, a busy 1080p recording's), re-encoded by the ffmpeg tool with B-frames.
//
// Jobs:
// - trim 12.5 s to 47.3 s, against ffmpeg's frame-accurate re-encode (x264 preset medium, crf 18) and
//   against its stream copy of the same range (which is not frame-accurate: it starts at a keyframe);
// - trim of a 5-minute recording: 250 s kept against 10 s kept (a trim should cost about a copy, not
//   grow with the kept length);
// - mix the two audio tracks into one with the video copied, against ffmpeg doing the same;
// - the save's mix of a one-track movie, against ffmpeg's stream copy (nothing to mix);
// - 16 thumbnails 90 px high, against 16 ffmpeg seeks.
#include "bench/bench_recordings.h"
#include "media/audio_mix_utility.h"
#include "platform/log.h"
#include "platform/media/export_session.h"
#include "platform/media/image_generator.h"
#include "platform/media/media_asset.h"
#include "tools/fixture/fixture_movie.h"

#include <QDir>
#include <QElapsedTimer>
#include <QFile>
#include <QCoreApplication>
#include <QUrl>

#include <algorithm>
#include <condition_variable>
#include <cstdio>
#include <functional>
#include <mutex>

using namespace zaf::media;
using zaf::bench::runFfmpeg;

namespace {

constexpr double kTrimStart = 12.5;
constexpr double kTrimEnd = 47.3;
constexpr int kThumbnails = 16;
constexpr int kThumbnailHeight = 90;

// ffmpeg's frame-accurate re-encode, the reference a trim is measured against.
const QString kX264Preset = QStringLiteral("medium");
const QString kX264Crf = QStringLiteral("18");
// The export's audio: AAC at 256 kb/s, 48 kHz; the mix sums at unity gain and limits.
const QString kAudioBitRate = QStringLiteral("256k");
const QString kMixFilter =
    QStringLiteral("[0:a:0][0:a:1]amix=inputs=2:normalize=0,alimiter=limit=0.977:attack=5:release=50:level=0:latency=1[a]");

double median(std::vector<double> v)
{
    std::sort(v.begin(), v.end());
    return v.empty() ? 0 : v[v.size() / 2];
}

// Runs job `runs` times and returns the median wall time in seconds; a failed run aborts.
double timeIt(int runs, const std::function<bool()> &job)
{
    std::vector<double> times;
    for (int i = 0; i < runs; ++i) {
        QElapsedTimer t;
        t.start();
        if (!job()) {
            std::fprintf(stderr, "media_bench: a run failed\n");
            std::exit(1);
        }
        times.push_back(t.nsecsElapsed() / 1e9);
    }
    return median(times);
}

bool runExport(const std::shared_ptr<ExportSession> &session)
{
    std::mutex m;
    std::condition_variable cv;
    bool done = false;
    session->exportAsynchronously([&] {
        std::lock_guard lock(m);
        done = true;
        cv.notify_one();
    });
    std::unique_lock lock(m);
    cv.wait(lock, [&] { return done; });
    if (session->status() != ExportStatus::Completed && session->error())
        std::fprintf(stderr, "export failed: %s\n", qPrintable(session->error()->message));
    return session->status() == ExportStatus::Completed;
}

bool ourTrim(const QString &in, const QString &out, double start = kTrimStart, double end = kTrimEnd)
{
    QFile::remove(out);
    auto session = ExportSession::exportSessionWithAsset(MediaAsset::assetWithURL(QUrl::fromLocalFile(in)),
                                                         QLatin1String(kExportPresetHighestQuality));
    session->setOutputURL(QUrl::fromLocalFile(out));
    session->setOutputFileType(QLatin1String(kFileTypeMPEG4));
    session->setTimeRange(MediaTimeRange::fromStartEnd(MediaTime::fromSeconds(start, 1000000000),
                                                       MediaTime::fromSeconds(end, 1000000000)));
    return runExport(session);
}

bool ourMix(const QString &in, const QString &out)
{
    QFile::remove(out);
    return runExport(ZafAudioMixUtility::exportSessionForMixingAudio(QUrl::fromLocalFile(in), QUrl::fromLocalFile(out)));
}

bool ourThumbnails(const QString &in)
{
    auto asset = MediaAsset::assetWithURL(QUrl::fromLocalFile(in));
    auto generator = ImageGenerator::imageGeneratorWithAsset(asset);
    generator->setMaximumSize(QSize(0, kThumbnailHeight));
    const double duration = asset->duration().seconds();
    QList<MediaTime> times;
    for (int i = 0; i < kThumbnails; ++i)
        times << MediaTime::fromSeconds(duration * i / kThumbnails, 600);
    std::mutex m;
    std::condition_variable cv;
    int remaining = kThumbnails, ok = 0;
    generator->generateImagesAsynchronouslyForTimes(times, [&](const MediaTime &, const QImage &image, const MediaTime &,
                                                               ImageGenerator::Result result, const zaf::OptionalError &) {
        std::lock_guard lock(m);
        ok += result == ImageGenerator::Result::Succeeded && !image.isNull();
        if (--remaining == 0)
            cv.notify_one();
    });
    std::unique_lock lock(m);
    cv.wait(lock, [&] { return remaining == 0; });
    return ok == kThumbnails;
}

bool ffmpegThumbnails(const QString &in, const QString &dir, double duration)
{
    for (int i = 0; i < kThumbnails; ++i) {
        if (!runFfmpeg({QStringLiteral("-ss"), QString::number(duration * i / kThumbnails), QStringLiteral("-i"), in,
                     QStringLiteral("-frames:v"), QStringLiteral("1"), QStringLiteral("-vf"),
                     QStringLiteral("scale=-2:%1").arg(kThumbnailHeight),
                     QDir(dir).filePath(QStringLiteral("ff-%1.png").arg(i))}))
            return false;
    }
    return true;
}

// A recording as screen recorders write it: the fixture's numbered frames with `audioTracks` tones
// and grain, re-encoded by the ffmpeg tool with B-frames and 2 s groups of pictures, audio copied.
// Made once.
QString recording(const QString &work, int seconds, int audioTracks)
{
    const QString path = QDir(work).filePath(QStringLiteral("recording-%1s-1080p30-%2audio-bframes-grain.mp4").arg(seconds).arg(audioTracks));
    if (QFile::exists(path))
        return path;
    const QString plain = path + QStringLiteral(".plain.mp4");
    QFile::remove(plain);
    zaf::fixture::FixtureSpec spec;
    spec.seconds = seconds;
    spec.width = 1920;
    spec.height = 1080;
    spec.fps = 30;
    spec.audioTracks = audioTracks;
    zaf::bench::makeFixtureMovie(plain, spec);
    zaf::bench::encodeRecording(plain, path, 60, false);
    QFile::remove(plain);
    return path;
}

void report(const char *job, double ours, double theirs, const char *goal)
{
    std::printf("%-12s ours %8.3f s   ffmpeg %8.3f s   ratio %5.2fx   (%s)\n", job, ours, theirs, ours / theirs, goal);
    std::fflush(stdout);
}

} // namespace

int main(int argc, char **argv)
{
    QCoreApplication app(argc, argv);
    zaf::log::hideInformationalEntriesByDefault();
    QStringList args = app.arguments().mid(1);
    QString movie, work = QDir::temp().filePath(QStringLiteral("zaf-bench"));
    int runs = 3;
    for (int i = 0; i + 1 < args.size(); i += 2) {
        if (args[i] == QLatin1String("--movie"))
            movie = args[i + 1];
        else if (args[i] == QLatin1String("--runs"))
            runs = std::max(1, args[i + 1].toInt());
        else if (args[i] == QLatin1String("--work"))
            work = args[i + 1];
    }
    QDir().mkpath(work);
    if (movie.isEmpty())
        movie = recording(work, 60, 2);
    const double duration = MediaAsset::assetWithURL(QUrl::fromLocalFile(movie))->duration().seconds();
    std::printf("movie %s (%.2f s), %d run(s) each, median times\n", qPrintable(movie), duration, runs);

    const QString out = QDir(work).filePath(QStringLiteral("out.mp4"));
    const QString ffOut = QDir(work).filePath(QStringLiteral("ff-out.mp4"));

    auto ffmpegTrim = [&](const QStringList &codecs) {
        return runFfmpeg(QStringList{QStringLiteral("-ss"), QString::number(kTrimStart), QStringLiteral("-to"), QString::number(kTrimEnd),
                                  QStringLiteral("-i"), movie, QStringLiteral("-map"), QStringLiteral("0")}
                      + codecs + QStringList{ffOut});
    };
    const double trimOurs = timeIt(runs, [&] { return ourTrim(movie, out); });
    const double trimFF = timeIt(runs, [&] {
        return ffmpegTrim({QStringLiteral("-c:v"), QStringLiteral("libx264"), QStringLiteral("-preset"), kX264Preset,
                           QStringLiteral("-crf"), kX264Crf, QStringLiteral("-c:a"), QStringLiteral("aac"),
                           QStringLiteral("-b:a"), kAudioBitRate, QStringLiteral("-ar"), QStringLiteral("48000")});
    });
    report("trim", trimOurs, trimFF, "vs frame-accurate re-encode; goal: <= 0.05x");
    const double copyFF = timeIt(runs, [&] { return ffmpegTrim({QStringLiteral("-c"), QStringLiteral("copy")}); });
    report("trim", trimOurs, copyFF, "vs keyframe-inexact stream copy; goal: <= 30x");

    const QString longMovie = recording(work, 300, 2);
    const double longKept = timeIt(runs, [&] { return ourTrim(longMovie, out, 20, 270); });
    const double shortKept = timeIt(runs, [&] { return ourTrim(longMovie, out, 20, 30); });
    std::printf("%-12s 250 s kept %8.3f s   10 s kept %8.3f s   ratio %5.2fx   (goal: < 3x)\n", "long trim", longKept, shortKept,
                longKept / shortKept);

    const double mixOurs = timeIt(runs, [&] { return ourMix(movie, out); });
    const double mixFF = timeIt(runs, [&] {
        return runFfmpeg({QStringLiteral("-i"), movie, QStringLiteral("-filter_complex"), kMixFilter,
                       QStringLiteral("-map"), QStringLiteral("0:v"), QStringLiteral("-map"), QStringLiteral("[a]"),
                       QStringLiteral("-c:v"), QStringLiteral("copy"), QStringLiteral("-c:a"), QStringLiteral("aac"),
                       QStringLiteral("-b:a"), kAudioBitRate, QStringLiteral("-ar"), QStringLiteral("48000"), ffOut});
    });
    report("mix", mixOurs, mixFF, "goal: within 1.2x");

    const QString oneTrack = recording(work, 60, 1);
    const double oneOurs = timeIt(runs, [&] { return ourMix(oneTrack, out); });
    const double oneFF = timeIt(runs, [&] {
        return runFfmpeg({QStringLiteral("-i"), oneTrack, QStringLiteral("-map"), QStringLiteral("0"), QStringLiteral("-c"),
                       QStringLiteral("copy"), ffOut});
    });
    report("mix 1 track", oneOurs, oneFF, "vs stream copy; goal: about a copy");

    const double thumbsOurs = timeIt(runs, [&] { return ourThumbnails(movie); });
    const double thumbsFF = timeIt(runs, [&] { return ffmpegThumbnails(movie, work, duration); });
    report("thumbnails", thumbsOurs, thumbsFF, "goal: 16 in under 1 s");
    QFile::remove(out);
    QFile::remove(ffOut);
    return 0;
}
