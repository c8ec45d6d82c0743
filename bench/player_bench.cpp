// player_bench: times the Player (first picture, seeks, playback cost) and the ffmpeg command-line
// tool doing the nearest jobs in the same run, and prints the ratios (ours / ffmpeg).
//
//   player_bench [--work DIR] [--runs N] [--seeks N]
//   player_bench --play-one MOVIE --label TEXT --fps N   (one playback row; the bench runs itself so)
//
// Recordings (generated once and kept in the work directory, like media_bench's): the fixture
// generator's numbered frames with one audio tone and fine moving grain, re-encoded by the ffmpeg
// tool with B-frames and fixed groups of pictures (no scene-cut keyframes):
// - 60 s of 1080p30 with 2 s groups and the same with 8 s groups, for the first picture and seeks;
// - 12 s of 1080p60 and 12 s of 2160p30 (2 s groups), for the cost of playback.
// Every frame shows its own number, so the bench reads the number of each picture the Player shows
// (videoFrameChanged / currentVideoFrame) and knows which frame is on screen.
//
// Jobs (a QApplication on the offscreen platform; the Player delivers on the main thread, so every
// wait runs the event loop, bounded, and prints "timeout" when the picture never comes):
// - first picture: from creating the asset, PlayerItem and Player to the first picture, p50;
// - random seeks, one at a time: from seekToTime() to the first picture shown within one frame of
//   the target, against `ffmpeg -ss T -i MOVIE -frames:v 1 -f null -` for the same times;
// - drags: a seek every 16 ms across 2 s of movie time during 3 s, forward and backward at six
//   places: the pictures shown during them, the time from each seek to the next picture shown, and
//   from each drag's last seek to its exact frame;
// - single backward steps from a shown frame to the one before it;
// - playback for 10 s of 1080p30, 1080p60 and 2160p30: CPU time (user + sys) per media second and the peak
//   resident memory, against ffmpeg decoding the same 10 s as fast as it can.
#include "bench/bench_recordings.h"
#include "bench/bench_statistics.h"
#include "platform/log.h"
#include "platform/media/media_asset.h"
#include "platform/media/player.h"
#include "platform/media/player_item.h"
#include "tools/fixture/fixture_movie.h"
#include "tools/fixture/frame_pattern.h"

#include <QApplication>
#include <QDir>
#include <QElapsedTimer>
#include <QEventLoop>
#include <QFile>
#include <QProcess>
#include <QMediaDevices>
#include <QAudioDevice>
#include <QTimer>
#include <QUrl>

#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <functional>
#include <memory>
#include <optional>
#include <random>
#include <vector>

using namespace zaf::media;
using zaf::bench::runFfmpeg;
using zaf::bench::percentile;

namespace {

constexpr int kPictureTimeoutMs = 8000;
// Drags start at these movie seconds, forward and backward in turn.
constexpr double kDragStarts[] = {21.0, 9.0, 33.5, 47.0, 14.2, 52.5};
constexpr double kDragSpan = 2.0;     // movie seconds covered by each drag
constexpr int kDragWallMs = 3000;
constexpr int kDragIntervalMs = 16;
constexpr int kPlaySeconds = 10;

struct Movie {
    QString label, path;
    int fps = 30;
};

QElapsedTimer g_clock; // every timestamp of the run, in ns since the start

double ms(qint64 ns) { return ns / 1e6; }

// "12.3" or "timeout" / "-" for a figure the run did not produce.
QString fmt(double v, const char *missing = "-")
{
    return std::isnan(v) ? QString::fromLatin1(missing) : QString::number(v, 'f', 1);
}

double cpuSeconds(int who)
{
    rusage u{};
    getrusage(who, &u);
    return u.ru_utime.tv_sec + u.ru_utime.tv_usec / 1e6 + u.ru_stime.tv_sec + u.ru_stime.tv_usec / 1e6;
}

// A size field of /proc/self/status ("VmHWM:" the peak resident set, "VmRSS:" the current one) in MB.
double statusMB(const QByteArray &field)
{
    QFile status(QStringLiteral("/proc/self/status"));
    if (!status.open(QIODevice::ReadOnly))
        return NAN;
    for (const QByteArray &line : status.readAll().split('\n'))
        if (line.startsWith(field))
            return line.mid(field.size()).trimmed().split(' ').first().toDouble() / 1024;
    return NAN;
}

// Resets VmHWM to the current resident set, so each playback reports its own peak.
bool resetPeakResident()
{
    QFile f(QStringLiteral("/proc/self/clear_refs"));
    return f.open(QIODevice::WriteOnly) && f.write("5") == 1;
}

// A recording as media_bench makes them: the fixture's numbered frames with a tone, grain added
// and re-encoded with B-frames and `gopSeconds` groups of pictures. Made once; the plain fixture is
// kept until the run ends, since the 2 s and 8 s recordings share it.
QString recording(const QString &work, int seconds, int width, int height, int fps, int gopSeconds, QStringList *plains)
{
    const QString stem = QStringLiteral("player-%1s-%2x%3p%4").arg(seconds).arg(width).arg(height).arg(fps);
    const QString path = QDir(work).filePath(stem + QStringLiteral("-gop%1s-bframes-grain.mp4").arg(gopSeconds));
    if (QFile::exists(path))
        return path;
    const QString plain = QDir(work).filePath(stem + QStringLiteral("-plain.mp4"));
    if (!QFile::exists(plain)) {
        zaf::fixture::FixtureSpec spec;
        spec.seconds = seconds;
        spec.width = width;
        spec.height = height;
        spec.fps = fps;
        spec.audioTracks = 1;
        spec.gop = fps * gopSeconds;
        zaf::bench::makeFixtureMovie(plain, spec);
        plains->append(plain);
    }
    zaf::bench::encodeRecording(plain, path, fps * gopSeconds, true);
    return path;
}

// Every picture a Player shows, with the frame number it carries and when it came.
class ShownPictures {
public:
    struct Picture { qint64 atNs = 0; int number = -1; }; // when it came; -1: no number read

    explicit ShownPictures(Player *player)
    {
        m_connection = QObject::connect(player, &Player::videoFrameChanged, player, [this, player] {
            pictures.push_back({g_clock.nsecsElapsed(), zaf::fixture::readFrameNumber(player->currentVideoFrame())});
            if (m_check)
                m_check();
        });
    }
    ~ShownPictures() { QObject::disconnect(m_connection); }

    // Runs the event loop until `done` holds (checked after each picture) or `timeoutMs` passes.
    bool waitUntil(const std::function<bool()> &done, int timeoutMs)
    {
        if (done())
            return true;
        QEventLoop loop;
        QTimer::singleShot(timeoutMs, Qt::PreciseTimer, &loop, &QEventLoop::quit);
        m_check = [&] {
            if (done())
                loop.quit();
        };
        loop.exec();
        m_check = nullptr;
        return done();
    }

    // The first picture from index `from` on within `tolerance` frames of `frame`.
    std::optional<Picture> near(size_t from, int frame, int tolerance) const
    {
        for (size_t i = from; i < pictures.size(); ++i) {
            if (pictures[i].number >= 0 && std::abs(pictures[i].number - frame) <= tolerance)
                return pictures[i];
        }
        return std::nullopt;
    }

    std::vector<Picture> pictures;

private:
    QMetaObject::Connection m_connection;
    std::function<void()> m_check;
};

// Runs the event loop for `msecs` whatever happens (the decoder settles, playback runs).
void runFor(int msecs)
{
    QEventLoop loop;
    QTimer::singleShot(msecs, Qt::PreciseTimer, &loop, &QEventLoop::quit);
    loop.exec();
}

// The middle of frame k: a seek there asks for exactly that frame, with no rounding at its edges.
MediaTime frameTime(int frame, int fps) { return MediaTime::make(2 * std::int64_t(frame) + 1, 2 * fps); }

struct OpenPlayer {
    std::shared_ptr<PlayerItem> item;
    std::unique_ptr<Player> player;
    std::unique_ptr<ShownPictures> shown;
    bool ready = false; // the first picture came
};

OpenPlayer openPlayer(const QString &path)
{
    OpenPlayer p;
    p.item = std::make_shared<PlayerItem>(MediaAsset::assetWithURL(QUrl::fromLocalFile(path)));
    p.player = std::make_unique<Player>(p.item);
    p.shown = std::make_unique<ShownPictures>(p.player.get());
    p.ready = p.shown->waitUntil([&] { return !p.player->currentVideoFrame().isNull(); }, kPictureTimeoutMs);
    return p;
}

// First picture: creating the asset, item and player to the first picture, `runs` times.
std::vector<double> firstPicture(const Movie &movie, int runs, int *timeouts)
{
    std::vector<double> times;
    for (int i = 0; i < runs; ++i) {
        const qint64 start = g_clock.nsecsElapsed();
        OpenPlayer p = openPlayer(movie.path);
        if (p.ready)
            times.push_back(ms(g_clock.nsecsElapsed() - start));
        else
            ++*timeouts;
    }
    return times;
}

struct SeekSet {
    std::vector<double> latencies; // ms, of the answered seeks
    int asked = 0, exact = 0, timeouts = 0;
};

// One seek to frame `frame` on a paused player, waiting for its picture.
void seekOnce(OpenPlayer &p, const Movie &movie, int frame, SeekSet *set)
{
    const size_t from = p.shown->pictures.size();
    const qint64 start = g_clock.nsecsElapsed();
    p.player->seekToTime(frameTime(frame, movie.fps));
    ++set->asked;
    if (!p.shown->waitUntil([&] { return p.shown->near(from, frame, 1).has_value(); }, kPictureTimeoutMs)) {
        ++set->timeouts;
        return;
    }
    const ShownPictures::Picture picture = *p.shown->near(from, frame, 1);
    set->latencies.push_back(ms(picture.atNs - start));
    set->exact += picture.number == frame;
}

struct Drag {
    int seeks = 0, pictures = 0, answered = 0;
    std::vector<double> nextPicture; // ms from a seek to the next picture shown during the drag
    double wallMs = 0;
    double lastToExact = NAN;        // ms; NaN on timeout
};

Drag drag(OpenPlayer &p, const Movie &movie, double startSeconds, int direction)
{
    Drag d;
    std::vector<qint64> seekTimes;
    int lastFrame = 0;
    const size_t from = p.shown->pictures.size();
    const qint64 start = g_clock.nsecsElapsed();
    QEventLoop loop;
    QTimer timer;
    timer.setTimerType(Qt::PreciseTimer);
    auto tick = [&] {
        const qint64 now = g_clock.nsecsElapsed();
        const double progress = std::min(1.0, double(now - start) / (kDragWallMs * 1e6));
        lastFrame = int((startSeconds + direction * kDragSpan * progress) * movie.fps);
        seekTimes.push_back(now);
        p.player->seekToTime(frameTime(lastFrame, movie.fps));
        if (progress >= 1.0)
            loop.quit();
    };
    QObject::connect(&timer, &QTimer::timeout, &loop, tick);
    timer.start(kDragIntervalMs);
    tick(); // the first seek at once
    loop.exec();
    timer.stop();
    const qint64 lastSeek = seekTimes.back();
    d.seeks = int(seekTimes.size());
    d.wallMs = ms(lastSeek - start);
    std::vector<qint64> shownAt;
    for (size_t i = from; i < p.shown->pictures.size(); ++i)
        shownAt.push_back(p.shown->pictures[i].atNs);
    d.pictures = int(std::count_if(shownAt.begin(), shownAt.end(), [&](qint64 t) { return t < lastSeek; }));
    for (size_t i = 0; i + 1 < seekTimes.size(); ++i) {
        auto next = std::lower_bound(shownAt.begin(), shownAt.end(), seekTimes[i]);
        if (next != shownAt.end() && *next < lastSeek) {
            d.nextPicture.push_back(ms(*next - seekTimes[i]));
            ++d.answered;
        }
    }
    const size_t afterLast = size_t(std::lower_bound(shownAt.begin(), shownAt.end(), lastSeek) - shownAt.begin()) + from;
    if (p.shown->waitUntil([&] { return p.shown->near(afterLast, lastFrame, 0).has_value(); }, kPictureTimeoutMs))
        d.lastToExact = ms(p.shown->near(afterLast, lastFrame, 0)->atNs - lastSeek);
    return d;
}

std::vector<int> randomFrames(int count, int frames, unsigned seed)
{
    std::mt19937 random(seed);
    std::uniform_int_distribution<int> pick(1, std::max(1, frames - 2));
    std::vector<int> out(size_t(std::max(0, count)));
    std::generate(out.begin(), out.end(), [&] { return pick(random); });
    return out;
}

void printSeekRow(const char *kind, const SeekSet &s, const std::vector<double> *ff = nullptr)
{
    std::printf("  %-14s %3d asked %3d shown %3d exact   p50 %7s  p90 %7s  max %7s ms", kind, s.asked,
                int(s.latencies.size()), s.exact, qPrintable(fmt(percentile(s.latencies, 0.5), "timeout")),
                qPrintable(fmt(percentile(s.latencies, 0.9), "timeout")),
                qPrintable(fmt(percentile(s.latencies, 1.0), "timeout")));
    if (s.timeouts)
        std::printf("  (%d timeout)", s.timeouts);
    if (ff) {
        const double f50 = percentile(*ff, 0.5), f90 = percentile(*ff, 0.9);
        std::printf("\n  %-14s ffmpeg -ss T -frames:v 1: p50 %7s  p90 %7s ms   ratio p50 %5.2fx  p90 %5.2fx", "", qPrintable(fmt(f50)),
                    qPrintable(fmt(f90)), percentile(s.latencies, 0.5) / f50, percentile(s.latencies, 0.9) / f90);
    }
    std::printf("\n");
    std::fflush(stdout);
}

void seekBench(const Movie &movie, int seekCount)
{
    std::printf("%s\n", qPrintable(movie.label));
    OpenPlayer p = openPlayer(movie.path);
    if (!p.ready) {
        std::printf("  first picture: timeout; no seeks measured\n");
        return;
    }
    const int frames = int(p.item->duration().seconds() * movie.fps);

    SeekSet random;
    const std::vector<int> targets = randomFrames(seekCount, frames, 1);
    for (int frame : targets)
        seekOnce(p, movie, frame, &random);
    std::vector<double> ff;
    for (int frame : targets) {
        const qint64 start = g_clock.nsecsElapsed();
        if (runFfmpeg(QStringList{QStringLiteral("-ss"), QString::number((frame + 0.5) / movie.fps, 'f', 6), QStringLiteral("-i"), movie.path}
                   + QStringLiteral("-frames:v 1 -f null -").split(QLatin1Char(' '))))
            ff.push_back(ms(g_clock.nsecsElapsed() - start));
    }
    printSeekRow("random seek", random, &ff);

    SeekSet back;
    for (int frame : randomFrames(seekCount, frames, 2)) {
        SeekSet settle;
        seekOnce(p, movie, frame, &settle);
        if (settle.latencies.empty())
            continue;
        runFor(200); // the frame has been on screen a moment, as when a user steps
        seekOnce(p, movie, frame - 1, &back);
    }
    printSeekRow("back step", back);

    Drag all;
    std::vector<double> toExact;
    int timeouts = 0, direction = 1;
    for (double start : kDragStarts) {
        const Drag d = drag(p, movie, start, direction);
        direction = -direction;
        all.seeks += d.seeks;
        all.pictures += d.pictures;
        all.answered += d.answered;
        all.wallMs += d.wallMs;
        all.nextPicture.insert(all.nextPicture.end(), d.nextPicture.begin(), d.nextPicture.end());
        if (std::isnan(d.lastToExact))
            ++timeouts;
        else
            toExact.push_back(d.lastToExact);
    }
    const int drags = int(std::size(kDragStarts));
    const std::vector<double> &next = all.nextPicture;
    std::printf("  %-14s %d drags (forward and backward in turn), each a seek every %d ms over %.0f s of movie for %d ms: "
                "%d seeks, %d pictures shown during them\n"
                "  %-14s seek -> next picture shown during the drag (%d of %d seeks had one): p50 %s  p90 %s  max %s ms\n"
                "  %-14s last seek -> its exact frame: p50 %s  p90 %s  max %s ms%s\n",
                "drag", drags, kDragIntervalMs, kDragSpan, kDragWallMs, all.seeks, all.pictures, "", all.answered, all.seeks - drags,
                qPrintable(fmt(percentile(next, 0.5), "none")), qPrintable(fmt(percentile(next, 0.9), "none")),
                qPrintable(fmt(percentile(next, 1.0), "none")), "", qPrintable(fmt(percentile(toExact, 0.5), "timeout")),
                qPrintable(fmt(percentile(toExact, 0.9), "timeout")), qPrintable(fmt(percentile(toExact, 1.0), "timeout")),
                timeouts ? qPrintable(QStringLiteral("  (%1 timeout)").arg(timeouts)) : "");
    const playback::VideoDecoderStatistics stats = p.player->decodingStatistics();
    std::printf("  %-14s decoded pictures kept: %.0f MB now, at most %.0f MB (budget %.0f MB); %llu pictures decoded in all\n", "",
                stats.windowBytes / 1048576.0, stats.windowPeakBytes / 1048576.0, stats.windowBudgetBytes / 1048576.0,
                static_cast<unsigned long long>(stats.picturesDecoded));
    std::fflush(stdout);
}

void playbackBench(const Movie &movie, bool audioDevice)
{
    OpenPlayer p = openPlayer(movie.path);
    if (!p.ready) {
        std::printf("%-28s first picture: timeout\n", qPrintable(movie.label));
        return;
    }
    runFor(300); // the decoder fills its queue
    const bool peakReset = resetPeakResident();
    const double before = statusMB("VmRSS:");
    const size_t from = p.shown->pictures.size();
    const double mediaStart = p.player->currentTime().seconds();
    const double cpuStart = cpuSeconds(RUSAGE_SELF);
    const qint64 wallStart = g_clock.nsecsElapsed();
    p.player->play();
    runFor(kPlaySeconds * 1000);
    p.player->pause();
    const double cpu = cpuSeconds(RUSAGE_SELF) - cpuStart;
    const double wall = (g_clock.nsecsElapsed() - wallStart) / 1e9;
    const double media = p.player->currentTime().seconds() - mediaStart;
    const double peak = statusMB("VmHWM:");
    const int shown = int(p.shown->pictures.size() - from);
    const double windowPeak = p.player->decodingStatistics().windowPeakBytes / 1048576.0;

    const QStringList args = QStringList{QStringLiteral("-i"), movie.path, QStringLiteral("-t"), QString::number(kPlaySeconds)}
                             + QStringLiteral("%1-f null -").arg(QLatin1String(audioDevice ? "" : "-an ")).split(QLatin1Char(' '));
    const double ffStart = cpuSeconds(RUSAGE_CHILDREN);
    const bool ffOk = runFfmpeg(args);
    const double ffPerSecond = ffOk ? (cpuSeconds(RUSAGE_CHILDREN) - ffStart) / kPlaySeconds : NAN;
    const double ours = media > 0 ? cpu / media : NAN;
    std::printf("%-28s %5.2f s media in %5.2f s  %4d of %4d pictures shown  CPU %5.2f s/s  RSS %4.0f MB, peak %4.0f MB%s"
                " (decoded pictures kept: at most %.0f MB)   ffmpeg CPU %5.2f s/s   ratio %5.2fx\n",
                qPrintable(movie.label), media, wall, shown, int(std::lround(media * movie.fps)), ours, before, peak,
                peakReset ? "" : " (process peak)", windowPeak, ffPerSecond, ours / ffPerSecond);
    std::fflush(stdout);
}

} // namespace

int main(int argc, char **argv)
{
    if (qEnvironmentVariableIsEmpty("QT_QPA_PLATFORM"))
        qputenv("QT_QPA_PLATFORM", "offscreen");
    if (qEnvironmentVariableIsEmpty("XDG_RUNTIME_DIR")) {
        const QByteArray dir = "/tmp/zaf-bench-runtime-" + QByteArray::number(::getuid());
        ::mkdir(dir.constData(), 0700);
        qputenv("XDG_RUNTIME_DIR", dir);
    }
    QApplication app(argc, argv);
    zaf::log::hideInformationalEntriesByDefault();
    g_clock.start();
    QStringList args = app.arguments().mid(1);
    QString work = QDir::temp().filePath(QStringLiteral("zaf-bench"));
    int runs = 5, seeks = 20;
    Movie playOne;
    for (int i = 0; i + 1 < args.size(); i += 2) {
        if (args[i] == QLatin1String("--work"))
            work = args[i + 1];
        else if (args[i] == QLatin1String("--runs"))
            runs = std::max(1, args[i + 1].toInt());
        else if (args[i] == QLatin1String("--seeks"))
            seeks = std::max(1, args[i + 1].toInt());
        else if (args[i] == QLatin1String("--play-one")) // the parent's child run of one playback
            playOne.path = args[i + 1];
        else if (args[i] == QLatin1String("--label"))
            playOne.label = args[i + 1];
        else if (args[i] == QLatin1String("--fps"))
            playOne.fps = std::max(1, args[i + 1].toInt());
    }
    if (!playOne.path.isEmpty()) {
        playbackBench(playOne, !QMediaDevices::defaultAudioOutput().isNull());
        return 0;
    }
    QDir().mkpath(work);
    QStringList plains;
    const std::vector<Movie> seekMovies{
        {QStringLiteral("1080p30 60 s, 2 s groups"), recording(work, 60, 1920, 1080, 30, 2, &plains), 30},
        {QStringLiteral("1080p30 60 s, 8 s groups"), recording(work, 60, 1920, 1080, 30, 8, &plains), 30}};
    const std::vector<Movie> playMovies{
        {QStringLiteral("1080p30 60 s, 2 s groups"), seekMovies[0].path, 30},
        {QStringLiteral("1080p60 12 s, 2 s groups"), recording(work, 12, 1920, 1080, 60, 2, &plains), 60},
        {QStringLiteral("2160p30 12 s, 2 s groups"), recording(work, 12, 3840, 2160, 30, 2, &plains), 30}};
    for (const QString &plain : plains)
        QFile::remove(plain);

    std::printf("\n== first picture: creating the item and player -> first picture shown, %d run(s)\n", runs);
    for (const std::vector<Movie> *set : {&seekMovies, &playMovies}) {
        for (const Movie &movie : *set) {
            if (set == &playMovies && &movie == &playMovies.front())
                continue; // the first seek movie again
            int timeouts = 0;
            const std::vector<double> t = firstPicture(movie, runs, &timeouts);
            std::printf("%-28s p50 %7s ms  max %7s ms%s\n", qPrintable(movie.label), qPrintable(fmt(percentile(t, 0.5), "timeout")),
                        qPrintable(fmt(percentile(t, 1.0), "timeout")),
                        timeouts ? qPrintable(QStringLiteral("  (%1 timeout)").arg(timeouts)) : "");
            std::fflush(stdout);
        }
    }

    std::printf("\n== seeks on a paused player: seekToTime() -> its picture shown (within one frame; \"exact\" = that frame), "
                "%d each\n", seeks);
    for (const Movie &movie : seekMovies)
        seekBench(movie, seeks);

    const QAudioDevice device = QMediaDevices::defaultAudioOutput();
    const QString audio = device.isNull() ? QStringLiteral("none found (the Player runs on the steady clock; ffmpeg runs with -an)")
                                          : QStringLiteral("\"%1\" (the Player plays on its clock)").arg(device.description());
    std::printf("\n== playback for %d s (CPU: user + sys of the process per media second; RSS before play, peak while playing)\n"
                "audio device: %s\n", kPlaySeconds, qPrintable(audio));
    std::fflush(stdout); // before the child runs write to the same output
    // Each in a process of its own, so the memory figures are the playback's and not what earlier
    // players left in the heap.
    for (const Movie &movie : playMovies) {
        QProcess one;
        one.setProcessChannelMode(QProcess::ForwardedChannels);
        one.start(QCoreApplication::applicationFilePath(),
                  {QStringLiteral("--play-one"), movie.path, QStringLiteral("--label"), movie.label, QStringLiteral("--fps"),
                   QString::number(movie.fps)});
        if (!one.waitForFinished(kPlaySeconds * 1000 + 120000) || one.exitCode() != 0)
            std::printf("%-28s playback run failed\n", qPrintable(movie.label));
    }
    return 0;
}
