#include "tests/support/media/fixture_movies.h"

#include "tests/support/child_process.h"
#include "tools/fixture/frame_pattern.h"

#include <QCoreApplication>
#include <QCryptographicHash>
#include <QDir>
#include <QFileInfo>
#include <QJsonArray>
#include <QJsonDocument>

#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <cmath>
#include <cstring>
#include <functional>
#include <numeric>

#include <unistd.h>

namespace zaf::test {

namespace {

constexpr int kToolTimeoutMs = 120000;

std::string describe(const QString &program, const QStringList &args)
{
    return (program + u' ' + args.join(u' ')).toStdString();
}

// Runs a program that has to succeed; a non-zero exit is a test failure.
ToolRun runChecked(const QString &program, const QStringList &args, const std::function<void(QByteArray &)> &sink = {})
{
    ToolRun r = runTool(program, args, sink);
    if (!r.ok())
        ADD_FAILURE() << describe(program, args) << " failed (exit code " << r.exitCode << "): " << r.err.trimmed().toStdString();
    return r;
}

ToolRun ffmpegRun(const QStringList &args, const std::function<void(QByteArray &)> &sink = {})
{
    return runChecked(QStringLiteral("ffmpeg"), words("-nostdin -v error -y") + args, sink);
}

QByteArray ffprobeOutput(const QStringList &args)
{
    return runChecked(QStringLiteral("ffprobe"), words("-v error") + args).out;
}

} // namespace

QStringList words(const char *line)
{
    return QString::fromLatin1(line).split(u' ', Qt::SkipEmptyParts);
}

ToolRun runTool(const QString &program, const QStringList &args, const std::function<void(QByteArray &)> &sink)
{
    ChildOptions options;
    options.timeoutMs = kToolTimeoutMs;
    options.sink = sink;
    const ChildRun run = runChild(program, args, options);
    if (!run.started || run.timedOut)
        ADD_FAILURE() << describe(program, args) << ": " << run.error.toStdString();
    return ToolRun{run.started && !run.timedOut ? run.exitCode : -1, run.out, run.err};
}

bool ffmpeg(const QStringList &args)
{
    return ffmpegRun(args).ok();
}

QString makeFixtureMovie(const QString &dir, const zaf::fixture::FixtureSpec &shape)
{
    static std::atomic<int> counter{0};
    QString path;
    do {
        path = QDir(dir).filePath(QStringLiteral("fixture-%1-%2x%3-r%4-%5.mp4")
                                      .arg(QCoreApplication::applicationPid())
                                      .arg(shape.width)
                                      .arg(shape.height)
                                      .arg(shape.rotation)
                                      .arg(counter.fetch_add(1)));
    } while (QFileInfo::exists(path));
    if (OptionalError error = zaf::fixture::writeFixtureMovie(path, shape)) {
        ADD_FAILURE() << "cannot write fixture movie " << qPrintable(path) << ": " << qPrintable(error->description());
        return {};
    }
    return path;
}

// Generated fixtures are kept between test processes (ctest runs every case in a process of its
// own) and between the builds of one source tree (the sanitizer builds reuse the normal build's),
// in a directory named after the digest of the generator's sources, so a changed generator never
// serves a stale movie. Files are made under a temporary name and renamed into place: a test
// process never sees half a movie, and of two made at once either serves. Cached files are
// read-only: a test that would change a shared movie fails instead of spoiling it.
QString sharedGeneratedFile(const QString &name, const std::function<bool(const QString &path)> &make)
{
    static const QString dir = [] {
        const QString path = QDir::temp().filePath(QStringLiteral("zaf-fixtures-%1-%2").arg(getuid()).arg(QStringLiteral(ZAF_FIXTURE_GENERATOR_DIGEST)));
        if (!QDir().mkpath(path))
            ADD_FAILURE() << "cannot make the fixture cache " << qPrintable(path);
        return path;
    }();
    const QString path = QDir(dir).filePath(name);
    if (QFileInfo::exists(path))
        return path;
    const QFileInfo info(path);
    const QString partial = info.dir().filePath(QStringLiteral("%1.partial-%2.%3").arg(info.completeBaseName())
                                                    .arg(QCoreApplication::applicationPid()).arg(info.suffix()));
    QFile::remove(partial);
    if (!make(partial)) {
        QFile::remove(partial);
        return {};
    }
    QFile::setPermissions(partial, QFileDevice::ReadOwner | QFileDevice::ReadGroup | QFileDevice::ReadOther);
    if (::rename(QFile::encodeName(partial).constData(), QFile::encodeName(path).constData()) != 0) {
        ADD_FAILURE() << "cannot move " << qPrintable(partial) << " into the fixture cache: " << std::strerror(errno);
        QFile::remove(partial);
        return {};
    }
    return path;
}

QString sharedFfmpegOutput(const QStringList &arguments, const QString &suffix)
{
    const QByteArray digest = QCryptographicHash::hash(arguments.join(u' ').toUtf8(), QCryptographicHash::Md5).toHex().left(12);
    return sharedGeneratedFile(QStringLiteral("ffmpeg-%1.%2").arg(QString::fromLatin1(digest), suffix),
                         [&](const QString &path) { return ffmpeg(QStringList(arguments) << path); });
}

QString sharedFixtureMovie(const zaf::fixture::FixtureSpec &shape)
{
    const QString name = QStringLiteral("fixture-%1s-%2x%3-%4fps-a%5x%6-r%7-g%8.mp4")
                             .arg(shape.seconds).arg(shape.width).arg(shape.height).arg(shape.fps)
                             .arg(shape.audioTracks).arg(shape.channels).arg(shape.rotation).arg(shape.gop);
    return sharedGeneratedFile(name, [&](const QString &path) {
        if (OptionalError error = zaf::fixture::writeFixtureMovie(path, shape)) {
            ADD_FAILURE() << "cannot write fixture movie " << qPrintable(path) << ": " << qPrintable(error->description());
            return false;
        }
        return true;
    });
}

QString sharedFlatColourMovie(QSize size, const QString &codec)
{
    const QString name = QStringLiteral("flat-%1x%2-%3.mp4").arg(size.width()).arg(size.height()).arg(codec);
    return sharedGeneratedFile(name, [&](const QString &path) {
        const bool even = size.width() % 2 == 0 && size.height() % 2 == 0;
        const QString format = codec == QLatin1String("libx264rgb") ? QStringLiteral("gbrp") : even ? QStringLiteral("yuv420p") : QStringLiteral("yuv444p");
        // The colour source only makes even sizes: crop a larger picture down to the size asked for.
        const QString video = QStringLiteral("color=c=0x%1:size=%2x%3:rate=30,crop=%4:%5:0:0,format=%6")
                                  .arg(kFlatColour & 0xffffff, 6, 16, QLatin1Char('0'))
                                  .arg(size.width() + 2 - size.width() % 2)
                                  .arg(size.height() + 2 - size.height() % 2)
                                  .arg(size.width())
                                  .arg(size.height())
                                  .arg(format);
        return ffmpeg(QStringList{QStringLiteral("-f"), QStringLiteral("lavfi"), QStringLiteral("-i"), video}
                      + words("-f lavfi -i sine=frequency=440:sample_rate=48000 -t 1 -map 0:v -map 1:a -c:a aac -c:v")
                      << codec << path);
    });
}

int largestColourDistance(const QImage &image, QRgb colour)
{
    if (image.isNull())
        return 256;
    int largest = 0;
    for (int y = 0; y < image.height(); ++y) {
        for (int x = 0; x < image.width(); ++x) {
            const QRgb p = image.pixel(x, y);
            largest = std::max({largest, std::abs(qRed(p) - qRed(colour)), std::abs(qGreen(p) - qGreen(colour)),
                                std::abs(qBlue(p) - qBlue(colour))});
        }
    }
    return largest;
}

QList<int> readFrameNumbers(const QString &moviePath)
{
    // ffmpeg applies the display rotation by default, so the pictures come out as displayed;
    // passthrough keeps every decoded frame exactly once. Every picture is scaled to one small size
    // (the pattern survives it), which keeps a long movie a few megabytes of pipe traffic.
    constexpr int kWidth = 128, kHeight = 96, kBytes = kWidth * kHeight * 3;
    QList<int> numbers;
    const ToolRun r = ffmpegRun(QStringList{QStringLiteral("-i"), moviePath}
                                    + words("-map 0:v:0 -fps_mode passthrough -vf scale=128:96:flags=area -f rawvideo -pix_fmt rgb24 -"),
                                [&](QByteArray &data) {
                                    for (; data.size() >= kBytes; data.remove(0, kBytes)) {
                                        const QImage rgb(reinterpret_cast<const uchar *>(data.constData()), kWidth, kHeight, kWidth * 3,
                                                         QImage::Format_RGB888);
                                        numbers.append(zaf::fixture::readFrameNumber(rgb.convertToFormat(QImage::Format_RGB32)));
                                    }
                                });
    EXPECT_TRUE(r.out.isEmpty()) << "ffmpeg left an incomplete picture for " << qPrintable(moviePath);
    return r.ok() ? numbers : QList<int>{};
}

int readFrameNumber(const QImage &image)
{
    return zaf::fixture::readFrameNumber(image);
}

QList<float> audioSamples(const QString &moviePath, int audioStreamIndex, const QStringList &options)
{
    const ToolRun r = ffmpegRun(QStringList{QStringLiteral("-i"), moviePath, QStringLiteral("-map"), QStringLiteral("0:a:%1").arg(audioStreamIndex)}
                                + options + words("-c:a pcm_f32le -f f32le -"));
    QList<float> samples(r.ok() ? r.out.size() / qsizetype(sizeof(float)) : 0);
    std::memcpy(samples.data(), r.out.constData(), samples.size() * sizeof(float));
    if (samples.isEmpty())
        ADD_FAILURE() << "audio stream " << audioStreamIndex << " of " << qPrintable(moviePath) << " decodes to no samples";
    return samples;
}

double loudestMoment(const QString &moviePath, int audioStreamIndex)
{
    // aresample with first_pts=0 pads or drops samples so that sample i plays at i / rate on the
    // movie's timeline, whatever the track's start and edit list.
    const QList<float> samples = audioSamples(moviePath, audioStreamIndex, words("-af aresample=async=1:first_pts=0 -ac 1 -ar 48000"));
    const auto louder = [](float a, float b) { return std::abs(a) < std::abs(b); };
    return samples.isEmpty() ? -1 : double(std::max_element(samples.begin(), samples.end(), louder) - samples.begin()) / 48000;
}

double toneLevel(const QString &moviePath, int audioStreamIndex, double frequency)
{
    const int channels = probeStreams(moviePath, QStringLiteral("audio")).value(audioStreamIndex).value(QStringLiteral("channels")).toInt();
    if (channels <= 0) {
        ADD_FAILURE() << qPrintable(moviePath) << " has no audio stream " << audioStreamIndex << " with channels";
        return -1;
    }
    constexpr int kRate = 48000;
    const QList<float> samples = audioSamples(moviePath, audioStreamIndex, words("-ar 48000"));
    const qsizetype frames = samples.size() / channels;
    if (frames == 0)
        return -1;
    // Goertzel filter at `frequency` over the channel mean; |X| = A * N / 2 for a tone of amplitude A.
    const double coeff = 2 * std::cos(2 * M_PI * frequency / kRate);
    double s1 = 0, s2 = 0;
    for (qsizetype i = 0; i < frames; ++i) {
        const double mean = std::accumulate(samples.begin() + i * channels, samples.begin() + (i + 1) * channels, 0.0) / channels;
        const double s0 = mean + coeff * s1 - s2;
        s2 = s1;
        s1 = s0;
    }
    return 2 * std::sqrt(std::max(0.0, s1 * s1 + s2 * s2 - coeff * s1 * s2)) / double(frames);
}

QJsonObject ffprobe(const QString &path)
{
    const QJsonDocument doc = QJsonDocument::fromJson(ffprobeOutput(words("-show_streams -show_format -of json") << path));
    if (!doc.isObject())
        ADD_FAILURE() << "ffprobe answered no JSON object for " << qPrintable(path);
    return doc.object();
}

QList<QJsonObject> probeStreams(const QJsonObject &probe, const QString &codecType)
{
    QList<QJsonObject> streams;
    for (const QJsonValue &value : probe.value(QStringLiteral("streams")).toArray()) {
        if (value.toObject().value(QStringLiteral("codec_type")).toString() == codecType)
            streams.append(value.toObject());
    }
    return streams;
}

QList<QJsonObject> probeStreams(const QString &path, const QString &codecType)
{
    return probeStreams(ffprobe(path), codecType);
}

int probeRotation(const QJsonObject &stream)
{
    // ffprobe reports the display matrix's angle counter-clockwise.
    for (const QJsonValue &value : stream.value(QStringLiteral("side_data_list")).toArray()) {
        const QJsonObject sideData = value.toObject();
        if (sideData.contains(QStringLiteral("rotation")))
            return ((-int(std::lround(sideData.value(QStringLiteral("rotation")).toDouble()))) % 360 + 360) % 360;
    }
    return 0;
}

int countVideoFrames(const QString &path)
{
    const QByteArray out = ffprobeOutput(
        words("-count_frames -select_streams v:0 -show_entries stream=nb_read_frames -of default=noprint_wrappers=1:nokey=1") << path);
    bool ok = false;
    const int frames = out.trimmed().toInt(&ok);
    if (!ok)
        ADD_FAILURE() << "ffprobe counted no frames in " << qPrintable(path) << ": " << out.constData();
    return ok ? frames : -1;
}

QList<double> presentationTimes(const QString &path)
{
    QList<double> times;
    for (const QByteArray &line : ffprobeOutput(words("-select_streams v:0 -show_entries frame=pts_time -of csv=p=0") << path).split('\n')) {
        bool ok = false; // a frame with side data prints "0.000000," then an empty line
        const double t = line.trimmed().split(',').first().toDouble(&ok);
        if (ok)
            times.append(t);
    }
    const double first = times.isEmpty() ? 0 : times.first();
    for (double &t : times)
        t -= first;
    return times;
}

QList<int> keyFrameIndexes(const QString &path)
{
    QList<int> indexes;
    int index = 0;
    for (const QByteArray &line : ffprobeOutput(words("-select_streams v:0 -show_entries frame=key_frame -of csv=p=0") << path).split('\n')) {
        const QByteArray flag = line.trimmed();
        if (flag.isEmpty()) // side data prints empty lines
            continue;
        if (flag.startsWith('1'))
            indexes.append(index);
        ++index;
    }
    return indexes;
}

QString streamMD5(const QString &path, const QString &map)
{
    const QByteArray line = ffmpegRun(QStringList{QStringLiteral("-i"), path, QStringLiteral("-map"), map} + words("-c copy -f md5 -")).out.trimmed();
    if (!line.startsWith("MD5="))
        ADD_FAILURE() << "ffmpeg gave no MD5 for " << qPrintable(map) << " of " << qPrintable(path) << ": " << line.constData();
    return line.startsWith("MD5=") ? QString::fromLatin1(line.mid(4)) : QString();
}

} // namespace zaf::test
