// media_bench: times our media engine and the ffmpeg command-line tool doing the same jobs on the
// same 60 s 1080p30 recording with two audio tracks, and prints the ratios (ours / ffmpeg).
//
//   media_bench [--movie PATH] [--runs N] [--work DIR]
//
// Jobs: trim 12.5 s to 47.3 s (frame-accurate re-encode at the same x264 preset and quality), mix
// the two audio tracks into one with the video copied, and 16 thumbnails 90 px high. Without
// --movie, the recording is generated with the fixture generator (once, kept in the work directory).
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
#include <QProcess>
#include <QUrl>

#include <algorithm>
#include <condition_variable>
#include <cstdio>
#include <functional>
#include <mutex>

using namespace zaf::media;

namespace {

constexpr double kTrimStart = 12.5;
constexpr double kTrimEnd = 47.3;
constexpr int kThumbnails = 16;
constexpr int kThumbnailHeight = 90;

// Keep in step with the export engine's re-encode settings so both sides do the same work.
const QString kX264Preset = QStringLiteral("veryfast");
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

bool ffmpeg(const QStringList &args)
{
    QProcess p;
    p.start(QStringLiteral("ffmpeg"), QStringList{QStringLiteral("-v"), QStringLiteral("error"), QStringLiteral("-y")} + args);
    if (!p.waitForFinished(-1) || p.exitCode() != 0) {
        std::fprintf(stderr, "ffmpeg failed: %s\n", p.readAllStandardError().constData());
        return false;
    }
    return true;
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

bool ourTrim(const QString &in, const QString &out)
{
    QFile::remove(out);
    auto session = ExportSession::exportSessionWithAsset(MediaAsset::assetWithURL(QUrl::fromLocalFile(in)),
                                                         QLatin1String(kExportPresetHighestQuality));
    session->setOutputURL(QUrl::fromLocalFile(out));
    session->setOutputFileType(QLatin1String(kFileTypeMPEG4));
    session->setTimeRange(MediaTimeRange::fromStartEnd(MediaTime::fromSeconds(kTrimStart, 1000000000),
                                                       MediaTime::fromSeconds(kTrimEnd, 1000000000)));
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
        if (!ffmpeg({QStringLiteral("-ss"), QString::number(duration * i / kThumbnails), QStringLiteral("-i"), in,
                     QStringLiteral("-frames:v"), QStringLiteral("1"), QStringLiteral("-vf"),
                     QStringLiteral("scale=-2:%1").arg(kThumbnailHeight),
                     QDir(dir).filePath(QStringLiteral("ff-%1.png").arg(i))}))
            return false;
    }
    return true;
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
    if (movie.isEmpty()) {
        movie = QDir(work).filePath(QStringLiteral("recording-60s-1080p30-2audio.mp4"));
        if (!QFile::exists(movie)) {
            std::printf("generating %s ...\n", qPrintable(movie));
            zaf::fixture::FixtureSpec spec;
            spec.seconds = 60;
            spec.width = 1920;
            spec.height = 1080;
            spec.fps = 30;
            spec.audioTracks = 2;
            if (const zaf::OptionalError e = zaf::fixture::writeFixtureMovie(movie, spec)) {
                std::fprintf(stderr, "media_bench: %s\n", qPrintable(e->message));
                return 1;
            }
        }
    }
    const double duration = MediaAsset::assetWithURL(QUrl::fromLocalFile(movie))->duration().seconds();
    std::printf("movie %s (%.2f s), %d run(s) each, median times\n", qPrintable(movie), duration, runs);

    const QString out = QDir(work).filePath(QStringLiteral("out.mp4"));
    const QString ffOut = QDir(work).filePath(QStringLiteral("ff-out.mp4"));

    const double trimOurs = timeIt(runs, [&] { return ourTrim(movie, out); });
    const double trimFF = timeIt(runs, [&] {
        return ffmpeg({QStringLiteral("-ss"), QString::number(kTrimStart), QStringLiteral("-to"), QString::number(kTrimEnd),
                       QStringLiteral("-i"), movie, QStringLiteral("-map"), QStringLiteral("0"), QStringLiteral("-c:v"),
                       QStringLiteral("libx264"), QStringLiteral("-preset"), kX264Preset, QStringLiteral("-crf"), kX264Crf,
                       QStringLiteral("-c:a"), QStringLiteral("aac"), QStringLiteral("-b:a"), kAudioBitRate,
                       QStringLiteral("-ar"), QStringLiteral("48000"), ffOut});
    });
    report("trim", trimOurs, trimFF, "goal: no slower than ffmpeg");

    const double mixOurs = timeIt(runs, [&] { return ourMix(movie, out); });
    const double mixFF = timeIt(runs, [&] {
        return ffmpeg({QStringLiteral("-i"), movie, QStringLiteral("-filter_complex"), kMixFilter,
                       QStringLiteral("-map"), QStringLiteral("0:v"), QStringLiteral("-map"), QStringLiteral("[a]"),
                       QStringLiteral("-c:v"), QStringLiteral("copy"), QStringLiteral("-c:a"), QStringLiteral("aac"),
                       QStringLiteral("-b:a"), kAudioBitRate, QStringLiteral("-ar"), QStringLiteral("48000"), ffOut});
    });
    report("mix", mixOurs, mixFF, "goal: within 1.2x");

    const double thumbsOurs = timeIt(runs, [&] { return ourThumbnails(movie); });
    const double thumbsFF = timeIt(runs, [&] { return ffmpegThumbnails(movie, work, duration); });
    report("thumbnails", thumbsOurs, thumbsFF, "goal: 16 in under 1 s");
    QFile::remove(out);
    QFile::remove(ffOut);
    return 0;
}
