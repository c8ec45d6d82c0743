// player_audio_bench: the Player with sound, through a private sound server's null sink: how soon
// playback runs after play(), and how far each click of the sound is from its picture.
//
//   player_audio_bench [--work DIR] [--runs N]
//
// Recording (made once and kept in the work directory): 8 s of 1080p30 numbered frames with grain,
// re-encoded like the other benchmarks' recordings, with an AAC track silent but for a 1 ms click
// at every half second from 0.5 s, where the picture shows frame 15k.
//
// Each run plays the recording from the start on the Player's default (audio) clock and prints:
// - play() to frame 30: when videoFrameChanged first carries frame 30 (media time 1.0 s);
// - sound minus picture: the host time each click is heard (the null sink's monitor, recorded and
//   stamped as tests/support/media/pulse_server.h describes) minus the host time its frame was
//   shown, median and p90 over the clicks of all runs (negative: the sound comes first).
// - first sound late: the first click heard, less its 0.5 s, from play().
// There is no comparison with the ffmpeg tool: it shows no pictures here, so it has neither a
// thirtieth picture nor a picture to set its sound against.
#include "bench/bench_recordings.h"
#include "bench/bench_statistics.h"
#include "tests/support/wait_until.h"
#include "platform/log.h"
#include "platform/media/media_asset.h"
#include "platform/media/player.h"
#include "platform/media/player_item.h"
#include "tests/support/media/pulse_server.h"
#include "tools/fixture/frame_pattern.h"

#include <QApplication>
#include <QAudioDevice>
#include <QDir>
#include <QEventLoop>
#include <QFile>
#include <QMediaDevices>
#include <QTimer>
#include <QUrl>

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <functional>
#include <map>
#include <memory>
#include <vector>

using namespace zaf::media;
using zaf::test::hostSeconds;
using zaf::bench::percentile;

namespace {

constexpr int kSeconds = 8;
constexpr int kFps = 30;
constexpr double kClickInterval = 0.5;

QString clickRecording(const QString &work)
{
    const QString path = QDir(work).filePath(QStringLiteral("player-audio-%1s-1080p30-clicks.mp4").arg(kSeconds));
    if (QFile::exists(path))
        return path;
    const QString plain = QDir(work).filePath(QStringLiteral("player-audio-%1s-1080p30-plain.mp4").arg(kSeconds));
    const QString grain = QDir(work).filePath(QStringLiteral("player-audio-%1s-1080p30-grain.mp4").arg(kSeconds));
    zaf::fixture::FixtureSpec spec;
    spec.seconds = kSeconds;
    spec.width = 1920;
    spec.height = 1080;
    spec.fps = kFps;
    spec.audioTracks = 0;
    spec.gop = 2 * kFps;
    zaf::bench::makeFixtureMovie(plain, spec);
    zaf::bench::encodeRecording(plain, grain, 2 * kFps, true);
    const QString partial = path + QStringLiteral(".partial.mp4");
    const bool ok = zaf::bench::runFfmpeg({QStringLiteral("-i"), grain, QStringLiteral("-f"), QStringLiteral("lavfi"), QStringLiteral("-i"),
        QStringLiteral("aevalsrc=0.9*gte(t\\,0.25)*lt(mod(t\\,0.5)\\,0.001):s=48000:d=%1").arg(kSeconds), QStringLiteral("-map"),
        QStringLiteral("0:v"), QStringLiteral("-map"), QStringLiteral("1"), QStringLiteral("-c:v"), QStringLiteral("copy"),
        QStringLiteral("-c:a"), QStringLiteral("aac"), QStringLiteral("-b:a"), QStringLiteral("256k"), partial});
    QFile::remove(plain);
    QFile::remove(grain);
    if (!ok || !QFile::rename(partial, path)) {
        std::fprintf(stderr, "player_audio_bench: cannot make %s\n", qPrintable(path));
        std::exit(1);
    }
    return path;
}

struct Run {
    double frame30 = NAN;   // seconds from play()
    double firstSound = NAN; // seconds from play() to the first click heard, less its 0.5 s
    std::vector<double> offsets;
};

Run playOnce(const zaf::test::PulseServer &server, const QString &path)
{
    Run run;
    auto item = std::make_shared<PlayerItem>(MediaAsset::assetWithURL(QUrl::fromLocalFile(path)));
    Player player(item);
    std::map<int, double> shown;
    QObject::connect(&player, &Player::videoFrameChanged, [&] {
        shown.try_emplace(zaf::fixture::readFrameNumber(player.currentVideoFrame()), hostSeconds());
    });
    if (!zaf::test::waitUntil([&] { return item->status() == PlayerItem::Status::ReadyToPlay; }, 10000))
        return run;
    zaf::test::SinkRecording recording(server);
    if (!recording.ok()) {
        std::fprintf(stderr, "player_audio_bench: %s\n", qPrintable(recording.error()));
        return run;
    }
    const double playHost = hostSeconds();
    player.play();
    const int clicks = int(kSeconds / kClickInterval) - 1;
    zaf::test::waitUntil([&] { return player.rate() == 0; }, (kSeconds + 10) * 1000);
    zaf::test::waitUntil([&] { return recording.clickHostTimes().size() >= clicks; }, 3000);
    recording.stop();
    if (shown.count(30))
        run.frame30 = shown.at(30) - playHost;
    const QList<double> heard = recording.clickHostTimes();
    if (!heard.isEmpty())
        run.firstSound = heard.first() - playHost - kClickInterval;
    for (qsizetype k = 0; k < heard.size() && k < clicks; ++k) {
        const int frame = int(std::lround((k + 1) * kClickInterval * kFps));
        if (shown.count(frame))
            run.offsets.push_back(heard[k] - shown.at(frame));
    }
    return run;
}

QString ms(double seconds)
{
    return std::isnan(seconds) ? QStringLiteral("-") : QString::number(seconds * 1000, 'f', 1);
}

} // namespace

int main(int argc, char **argv)
{
    if (qEnvironmentVariableIsEmpty("QT_QPA_PLATFORM"))
        qputenv("QT_QPA_PLATFORM", "offscreen");
    // Before the application and its audio devices: they bind to the server they first see.
    zaf::test::PulseServer server;
    QApplication app(argc, argv);
    zaf::log::hideInformationalEntriesByDefault();
    QStringList args = app.arguments().mid(1);
    QString work = QDir::temp().filePath(QStringLiteral("zaf-bench"));
    int runs = 3;
    for (int i = 0; i + 1 < args.size(); ++i) {
        if (args[i] == QLatin1String("--work"))
            work = args[i + 1];
        else if (args[i] == QLatin1String("--runs"))
            runs = std::max(1, args[i + 1].toInt());
    }
    std::printf("\nplayer_audio_bench: the Player with sound on a private null sink\n");
    if (!server.ok() || QMediaDevices::defaultAudioOutput().isNull()) {
        std::printf("  skipped: no sound server (%s)\n", qPrintable(server.error()));
        return 0;
    }
    QDir().mkpath(work);
    const QString path = clickRecording(work);
    std::vector<double> frame30, firstSound, offsets;
    for (int i = 0; i < runs; ++i) {
        const Run run = playOnce(server, path);
        frame30.push_back(run.frame30);
        firstSound.push_back(run.firstSound);
        offsets.insert(offsets.end(), run.offsets.begin(), run.offsets.end());
        std::printf("  run %d: play() to frame 30 %s ms, first sound %s ms late, %zu clicks matched\n", i + 1,
            qPrintable(ms(run.frame30)), qPrintable(ms(run.firstSound)), run.offsets.size());
    }
    std::printf("  1080p30: play() to frame 30 p50 %s ms (at rate: 1000 ms)\n", qPrintable(ms(percentile(frame30, 0.5))));
    std::printf("  1080p30: sound minus picture p50 %s ms, p90 %s ms over %zu clicks\n", qPrintable(ms(percentile(offsets, 0.5))),
        qPrintable(ms(percentile(offsets, 0.9))), offsets.size());
    std::printf("  1080p30: first sound late p50 %s ms\n", qPrintable(ms(percentile(firstSound, 0.5))));
    return 0;
}
