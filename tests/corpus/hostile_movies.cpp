#include "tests/corpus/hostile_movies.h"

#include "tests/support/log_capture.h"
#include "tests/support/media/fixture_movies.h"
#include "tests/support/temp_dir.h"

#include <QFile>
#include <QtEndian>

#include <gtest/gtest.h>

#include <algorithm>
#include <random>

namespace zaf::test::corpus {

namespace {

using zaf::fixture::FixtureSpec;

QString cacheName(const QString &name)
{
    return QStringLiteral("corpus-%1-%2.mp4").arg(QStringLiteral(ZAF_CORPUS_GENERATOR_DIGEST), name);
}

QByteArray readAll(const QString &path)
{
    const QByteArray bytes = fileContents(path);
    if (bytes.isEmpty())
        ADD_FAILURE() << "cannot read " << qPrintable(path);
    return bytes;
}

bool writeAll(const QString &path, const QByteArray &bytes)
{
    QFile file(path);
    const bool ok = file.open(QIODevice::WriteOnly) && file.write(bytes) == bytes.size() && file.flush();
    if (!ok)
        ADD_FAILURE() << "cannot write " << qPrintable(path) << ": " << qPrintable(file.errorString());
    return ok;
}

// Bytes that look like noise, the same on every run.
QByteArray noise(qsizetype size, unsigned seed)
{
    std::mt19937 random(seed);
    QByteArray bytes(size, Qt::Uninitialized);
    for (char &c : bytes)
        c = char(random() & 0xff);
    return bytes;
}

// The offset and size of the first top-level box `type` of an MPEG-4 file; {-1, 0} when absent.
std::pair<qsizetype, qsizetype> topLevelBox(const QByteArray &data, const char *type)
{
    for (qsizetype at = 0; at + 8 <= data.size();) {
        const qsizetype size = qFromBigEndian<quint32>(data.constData() + at);
        if (data.mid(at + 4, 4) == type)
            return {at, size};
        if (size < 8)
            break;
        at += size;
    }
    ADD_FAILURE() << "no " << type << " box";
    return {-1, 0};
}

// The plain two-second movie every damaged kind starts from: numbered frames, one tone, and the
// header (moov) after the media data, as a recorder writes it.
QString baseMovie()
{
    return sharedFixtureMovie(FixtureSpec{.seconds = 2});
}

// The same movie with its header first, as a streaming-friendly file has it.
QString headerFirstMovie()
{
    return sharedGeneratedFile(cacheName(QStringLiteral("header-first")), [](const QString &path) {
        return ffmpeg(QStringList{QStringLiteral("-i"), baseMovie()} + words("-c copy -movflags +faststart") << path);
    });
}

// Makers.

std::function<bool(const QString &)> bytes(QByteArray data)
{
    return [data](const QString &path) { return writeAll(path, data); };
}

// The first `percent` % of a movie's bytes.
std::function<bool(const QString &)> truncated(QString (*source)(), int percent)
{
    return [source, percent](const QString &path) {
        const QByteArray data = readAll(source());
        return !data.isEmpty() && writeAll(path, data.left(data.size() * percent / 100));
    };
}

// ffmpeg ARGS OUT; "%SRT" in the arguments stands for a small subtitle file.
std::function<bool(const QString &)> ffmpegMovie(const char *args)
{
    return [args](const QString &path) {
        QStringList list = words(args);
        const QString srt = path + QStringLiteral(".srt");
        if (list.contains(QStringLiteral("%SRT"))) {
            if (!writeAll(srt, "1\n00:00:00,000 --> 00:00:00,800\nHello\n\n2\n00:00:00,800 --> 00:00:01,000\nAgain\n\n"))
                return false;
            list.replaceInStrings(QStringLiteral("%SRT"), srt);
        }
        const bool ok = ffmpeg(list << path);
        QFile::remove(srt);
        return ok;
    };
}

std::function<bool(const QString &)> fixture(FixtureSpec spec)
{
    return [spec](const QString &path) { return QFile::copy(sharedFixtureMovie(spec), path); };
}

std::function<bool(const QString &)> flatColour(QSize size)
{
    return [size](const QString &path) { return QFile::copy(sharedFlatColourMovie(size), path); };
}

// A one-frame flat movie of `width` x `height`, the cheapest H.264 that reaches a size.
std::function<bool(const QString &)> onePicture(int width, int height)
{
    return [=](const QString &path) {
        return ffmpeg(QStringList{QStringLiteral("-f"), QStringLiteral("lavfi"), QStringLiteral("-i"),
                                  QStringLiteral("color=c=blue:size=%1x%2:rate=30").arg(width).arg(height)}
                      + words("-frames:v 1 -c:v libx264 -preset ultrafast -pix_fmt yuv420p") << path);
    };
}

#define CORPUS_VIDEO "-f lavfi -i testsrc2=size=160x120:rate=30 "
#define CORPUS_TONE "-f lavfi -i sine=frequency=440:sample_rate=48000 "

std::vector<HostileMovie> makeTable()
{
    const QSize small(160, 120), base(320, 240);
    return {
        // Garbage: nothing a movie reader may accept.
        {"Empty", Nature::Garbage, bytes({})},
        {"Text", Nature::Garbage, bytes(QByteArray("This is not a movie, only a few lines of text.\n").repeated(80))},
        {"RandomBytes", Nature::Garbage, bytes(noise(64 * 1024, 14))},
        {"Truncated10", Nature::Garbage, truncated(baseMovie, 10)},
        {"Truncated50", Nature::Garbage, truncated(baseMovie, 50)},
        {"Truncated90", Nature::Garbage, truncated(baseMovie, 90)},
        {"HeaderCutOff", Nature::Garbage, [](const QString &path) {
             // The file ends half-way through its header (moov first, so nothing of the media data follows).
             const QByteArray data = readAll(headerFirstMovie());
             const auto [at, size] = topLevelBox(data, "moov");
             return at >= 0 && writeAll(path, data.left(at + size / 2));
         }},
        // Damaged: the header is whole, the media data is not.
        {"MediaDataCorrupted", Nature::Damaged, [](const QString &path) {
             QByteArray data = readAll(baseMovie());
             const auto [at, size] = topLevelBox(data, "mdat");
             if (at < 0)
                 return false;
             data.replace(at + size / 4, size / 2, noise(size / 2, 7));
             return writeAll(path, data);
         }, base, 0, 1},
        {"MediaDataCutOff", Nature::Damaged, truncated(headerFirstMovie, 60), base, 0, 1},
        // Shapes.
        {"NoVideo", Nature::Valid, ffmpegMovie(CORPUS_TONE "-t 2 -c:a aac"), {}, 0, 1},
        {"NoAudio", Nature::Valid, fixture({.seconds = 2, .audioTracks = 0}), base, 0, 0},
        {"OneFrame", Nature::Valid, ffmpegMovie(CORPUS_VIDEO "-frames:v 1 -c:v libx264"), small, 0, 0},
        {"TenthOfASecond", Nature::Valid, ffmpegMovie(CORPUS_VIDEO CORPUS_TONE "-t 0.1 -c:v libx264 -c:a aac"), small, 0, 1},
        {"Size2x2", Nature::Valid, flatColour({2, 2}), {2, 2}, 0, 1},
        {"Size641x361", Nature::Valid, flatColour({641, 361}), {641, 361}, 0, 1},
        // The decoders' limit is a pixel count; FFmpeg's own size check refuses a picture one pixel
        // high long before it reaches that count, so the square is the cheapest shape at the limit.
        {"PixelLimit", Nature::Valid, onePicture(8192, 8192), {8192, 8192}, 0, 0},
        {"PastPixelLimit", Nature::TooLarge, onePicture(8208, 8192), {8208, 8192}, 0, 0},
        // Codecs and formats.
        {"H264TenBit", Nature::Valid, ffmpegMovie(CORPUS_VIDEO "-t 1 -c:v libx264 -pix_fmt yuv420p10le"), small, 0, 0, "libx264"},
        {"H264FourFourFour", Nature::Valid, ffmpegMovie(CORPUS_VIDEO "-t 1 -c:v libx264 -pix_fmt yuv444p"), small, 0, 0, "libx264"},
        {"HEVC", Nature::Valid, ffmpegMovie(CORPUS_VIDEO "-t 1 -c:v libx265 -x265-params log-level=error -tag:v hvc1"), small, 0, 0, "libx265"},
        {"VP9", Nature::Valid, ffmpegMovie(CORPUS_VIDEO "-t 1 -c:v libvpx-vp9 -deadline realtime -cpu-used 8"), small, 0, 0, "libvpx-vp9"},
        {"AV1", Nature::Valid, ffmpegMovie(CORPUS_VIDEO "-t 1 -c:v libaom-av1 -usage realtime -cpu-used 8"), small, 0, 0, "libaom-av1"},
        // Timing and tracks.
        {"VariableFrameRate", Nature::Valid,
         ffmpegMovie(CORPUS_VIDEO "-t 2 -vf select=lt(n\\,10)+not(mod(n\\,4)) -fps_mode vfr -c:v libx264"), small, 0, 0},
        {"NonZeroStart", Nature::Valid, ffmpegMovie(CORPUS_VIDEO CORPUS_TONE "-t 2 -c:v libx264 -c:a aac -output_ts_offset 3"), small, 0, 1},
        {"EditList", Nature::Valid, [](const QString &path) {
             // Cut by copying from a time between keyframes: the edit list hides the pictures before it.
             return ffmpeg(QStringList{QStringLiteral("-ss"), QStringLiteral("0.5"), QStringLiteral("-i"), baseMovie()}
                           + words("-c copy") << path);
         }, base, 0, 1},
        {"Rotation90", Nature::Valid, fixture({.seconds = 1, .width = 160, .height = 120, .rotation = 90}), small, 90, 1},
        {"Rotation180", Nature::Valid, fixture({.seconds = 1, .width = 160, .height = 120, .rotation = 180}), small, 180, 1},
        {"Rotation270", Nature::Valid, fixture({.seconds = 1, .width = 160, .height = 120, .rotation = 270}), small, 270, 1},
        {"SixAudioTracks", Nature::Valid, fixture({.seconds = 1, .width = 160, .height = 120, .audioTracks = 6}), small, 0, 6},
        {"Surround51", Nature::Valid,
         ffmpegMovie(CORPUS_VIDEO CORPUS_TONE "-t 1 -c:v libx264 -c:a aac -ac 6 -channel_layout 5.1"), small, 0, 1},
        {"Mono8kHz", Nature::Valid,
         ffmpegMovie(CORPUS_VIDEO "-f lavfi -i sine=frequency=440:sample_rate=8000 -t 1 -c:v libx264 -c:a aac -ac 1"), small, 0, 1},
        {"AudioLongerThanVideo", Nature::Valid,
         ffmpegMovie("-t 1 " CORPUS_VIDEO "-t 3 " CORPUS_TONE "-c:v libx264 -c:a aac"), small, 0, 1},
        {"SubtitleTrack", Nature::Valid,
         ffmpegMovie(CORPUS_VIDEO CORPUS_TONE "-i %SRT -t 1 -map 0:v -map 1:a -map 2:s -c:v libx264 -c:a aac -c:s mov_text"), small, 0, 1},
    };
}

} // namespace

const std::vector<HostileMovie> &hostileMovies()
{
    static const std::vector<HostileMovie> table = makeTable();
    return table;
}

QString hostileMoviePath(const HostileMovie &movie)
{
    return sharedGeneratedFile(cacheName(QString::fromLatin1(movie.name)), movie.make);
}

QString unavailableReason(const HostileMovie &movie)
{
    if (!movie.encoder)
        return {};
    static const QByteArray encoders = runTool(QStringLiteral("ffmpeg"), words("-hide_banner -encoders")).out;
    const QByteArray wanted = ' ' + QByteArray(movie.encoder) + ' ';
    return encoders.contains(wanted) ? QString() : QStringLiteral("this ffmpeg has no %1 encoder to make the movie with").arg(QLatin1String(movie.encoder));
}

bool loggedWarning(const LogCapture &log)
{
    return std::ranges::any_of(log.entries(), [](const LogEntry &e) { return e.type >= QtWarningMsg && e.category.startsWith(QLatin1String("zaf.")); });
}

} // namespace zaf::test::corpus
