#include "tests/support/media/fixture_movies.h"

#include "tools/fixture/frame_pattern.h"

#include <QCoreApplication>
#include <QDeadlineTimer>
#include <QDir>
#include <QFileInfo>
#include <QJsonArray>
#include <QJsonDocument>
#include <QProcess>

#include <gtest/gtest.h>

#include <atomic>
#include <cctype>
#include <functional>
#include <cmath>
#include <cstring>
#include <vector>

namespace zaf::test {

namespace {

constexpr int kToolTimeoutMs = 120000;
// Decoded frames are scaled to this width before they are read: the pattern survives it, and a
// long 1080p movie stays a few megabytes of pipe traffic.
constexpr int kReadWidth = 128;

QString describe(const QString &program, const QStringList &args)
{
    return program + QLatin1Char(' ') + args.join(QLatin1Char(' '));
}

// Runs a tool to completion, feeding its standard output to `sink` as it arrives. False (with a
// test failure) when it cannot start, runs too long or exits non-zero.
bool runTool(const QString &program, const QStringList &args, const std::function<void(QByteArray &)> &sink)
{
    QProcess process;
    process.setProgram(program);
    process.setArguments(args);
    process.start(QIODevice::ReadOnly);
    if (!process.waitForStarted(10000)) {
        ADD_FAILURE() << "cannot start " << qPrintable(describe(program, args)) << ": " << qPrintable(process.errorString());
        return false;
    }
    QByteArray pending;
    QDeadlineTimer deadline(kToolTimeoutMs);
    while (process.state() != QProcess::NotRunning) {
        if (deadline.hasExpired()) {
            process.kill();
            process.waitForFinished(5000);
            ADD_FAILURE() << qPrintable(describe(program, args)) << " did not finish within " << kToolTimeoutMs / 1000 << " s";
            return false;
        }
        process.waitForReadyRead(200);
        pending += process.readAllStandardOutput();
        sink(pending);
    }
    pending += process.readAllStandardOutput();
    sink(pending);
    if (process.exitStatus() != QProcess::NormalExit || process.exitCode() != 0) {
        ADD_FAILURE() << qPrintable(describe(program, args)) << " failed (exit code " << process.exitCode()
                      << "): " << process.readAllStandardError().trimmed().constData();
        return false;
    }
    return true;
}

bool runToolCollect(const QString &program, const QStringList &args, QByteArray *out)
{
    return runTool(program, args, [out](QByteArray &pending) {
        *out += pending;
        pending.clear();
    });
}

// Takes complete binary PPM pictures ("P6\n<w> <h>\n255\n" + w*h*3 bytes) off the front of `data`.
// Returns false when the data is not a PPM stream.
bool takePictures(QByteArray &data, QList<QImage> *pictures)
{
    for (;;) {
        if (data.size() < 16)
            return true;
        if (!data.startsWith("P6"))
            return false;
        // Header: magic, width, height, maxval, each followed by one whitespace character.
        int pos = 2;
        int fields[3] = {0, 0, 0};
        for (int &field : fields) {
            while (pos < data.size() && std::isspace(static_cast<unsigned char>(data[pos])))
                ++pos;
            int digits = 0;
            while (pos < data.size() && std::isdigit(static_cast<unsigned char>(data[pos]))) {
                field = field * 10 + (data[pos] - '0');
                ++pos;
                if (++digits > 6)
                    return false;
            }
            if (pos >= data.size())
                return true; // header incomplete: wait for more
            if (digits == 0)
                return false;
        }
        ++pos; // the single whitespace after maxval
        if (fields[2] != 255 || fields[0] <= 0 || fields[1] <= 0)
            return false;
        const qsizetype bytes = qsizetype(fields[0]) * fields[1] * 3;
        if (data.size() < pos + bytes)
            return true;
        QImage rgb(reinterpret_cast<const uchar *>(data.constData() + pos), fields[0], fields[1], fields[0] * 3,
                   QImage::Format_RGB888);
        pictures->append(rgb.convertToFormat(QImage::Format_RGB32));
        data.remove(0, pos + bytes);
    }
}

} // namespace

QString makeFixtureMovie(const QString &dir, const zaf::fixture::FixtureSpec &spec)
{
    static std::atomic<int> counter{0};
    QString path;
    do {
        path = QDir(dir).filePath(QStringLiteral("fixture-%1-%2x%3-r%4-%5.mp4")
                                      .arg(QCoreApplication::applicationPid())
                                      .arg(spec.width)
                                      .arg(spec.height)
                                      .arg(spec.rotation)
                                      .arg(counter.fetch_add(1)));
    } while (QFileInfo::exists(path));
    if (OptionalError error = zaf::fixture::writeFixtureMovie(path, spec)) {
        ADD_FAILURE() << "cannot write fixture movie " << qPrintable(path) << ": " << qPrintable(error->description());
        return {};
    }
    return path;
}

QList<int> readFrameNumbers(const QString &moviePath)
{
    // ffmpeg applies the display rotation by default, so the pictures come out as displayed.
    // Passthrough keeps every decoded frame exactly once (no frame-rate conversion).
    const QStringList args = {QStringLiteral("-nostdin"), QStringLiteral("-v"), QStringLiteral("error"),
                              QStringLiteral("-i"), moviePath, QStringLiteral("-map"), QStringLiteral("0:v:0"),
                              QStringLiteral("-fps_mode"), QStringLiteral("passthrough"),
                              QStringLiteral("-vf"), QStringLiteral("scale=%1:-2:flags=area").arg(kReadWidth),
                              QStringLiteral("-f"), QStringLiteral("image2pipe"), QStringLiteral("-c:v"), QStringLiteral("ppm"),
                              QStringLiteral("-")};
    QList<int> numbers;
    bool malformed = false;
    const bool ok = runTool(QStringLiteral("ffmpeg"), args, [&](QByteArray &pending) {
        QList<QImage> pictures;
        if (!takePictures(pending, &pictures)) {
            malformed = true;
            pending.clear();
        }
        for (const QImage &picture : pictures)
            numbers.append(zaf::fixture::readFrameNumber(picture));
    });
    if (malformed)
        ADD_FAILURE() << "ffmpeg wrote no PPM stream for " << qPrintable(moviePath);
    if (!ok || malformed)
        return {};
    return numbers;
}

int readFrameNumber(const QImage &image)
{
    return zaf::fixture::readFrameNumber(image);
}

double toneLevel(const QString &moviePath, int audioStreamIndex, double frequency)
{
    const QList<QJsonObject> audio = probeStreams(ffprobe(moviePath), QStringLiteral("audio"));
    if (audioStreamIndex < 0 || audioStreamIndex >= audio.size()) {
        ADD_FAILURE() << qPrintable(moviePath) << " has no audio stream " << audioStreamIndex << " (it has " << audio.size() << ")";
        return -1;
    }
    const int channels = audio[audioStreamIndex].value(QStringLiteral("channels")).toInt();
    if (channels <= 0) {
        ADD_FAILURE() << "audio stream " << audioStreamIndex << " of " << qPrintable(moviePath) << " has no channels";
        return -1;
    }
    constexpr int kRate = 48000;
    QByteArray pcm;
    const QStringList args = {QStringLiteral("-nostdin"), QStringLiteral("-v"), QStringLiteral("error"),
                              QStringLiteral("-i"), moviePath,
                              QStringLiteral("-map"), QStringLiteral("0:a:%1").arg(audioStreamIndex),
                              QStringLiteral("-ar"), QString::number(kRate),
                              QStringLiteral("-c:a"), QStringLiteral("pcm_f32le"), QStringLiteral("-f"), QStringLiteral("f32le"),
                              QStringLiteral("-")};
    if (!runToolCollect(QStringLiteral("ffmpeg"), args, &pcm))
        return -1;
    const qsizetype frames = pcm.size() / qsizetype(sizeof(float) * channels);
    if (frames == 0) {
        ADD_FAILURE() << "audio stream " << audioStreamIndex << " of " << qPrintable(moviePath) << " decodes to no samples";
        return -1;
    }
    // Goertzel filter at `frequency` over the channel mean; |X| = A * N / 2 for a tone of amplitude A.
    const double w = 2 * M_PI * frequency / kRate;
    const double coeff = 2 * std::cos(w);
    double s1 = 0, s2 = 0;
    const char *bytes = pcm.constData();
    for (qsizetype i = 0; i < frames; ++i) {
        double sum = 0;
        for (int c = 0; c < channels; ++c) {
            float v;
            std::memcpy(&v, bytes + (i * channels + c) * sizeof(float), sizeof v);
            sum += v;
        }
        const double s0 = sum / channels + coeff * s1 - s2;
        s2 = s1;
        s1 = s0;
    }
    const double power = std::max(0.0, s1 * s1 + s2 * s2 - coeff * s1 * s2);
    return 2 * std::sqrt(power) / double(frames);
}

QJsonObject ffprobe(const QString &path)
{
    QByteArray out;
    const QStringList args = {QStringLiteral("-v"), QStringLiteral("error"), QStringLiteral("-show_streams"),
                              QStringLiteral("-show_format"), QStringLiteral("-of"), QStringLiteral("json"), path};
    if (!runToolCollect(QStringLiteral("ffprobe"), args, &out))
        return {};
    QJsonParseError error;
    const QJsonDocument doc = QJsonDocument::fromJson(out, &error);
    if (!doc.isObject()) {
        ADD_FAILURE() << "ffprobe answered no JSON object for " << qPrintable(path) << ": " << qPrintable(error.errorString());
        return {};
    }
    return doc.object();
}

QList<QJsonObject> probeStreams(const QJsonObject &probe, const QString &codecType)
{
    QList<QJsonObject> streams;
    for (const QJsonValue &value : probe.value(QStringLiteral("streams")).toArray()) {
        const QJsonObject stream = value.toObject();
        if (stream.value(QStringLiteral("codec_type")).toString() == codecType)
            streams.append(stream);
    }
    return streams;
}

int probeRotation(const QJsonObject &stream)
{
    // ffprobe reports the display matrix's angle counter-clockwise.
    for (const QJsonValue &value : stream.value(QStringLiteral("side_data_list")).toArray()) {
        const QJsonObject sideData = value.toObject();
        if (sideData.contains(QStringLiteral("rotation"))) {
            const int counterClockwise = int(std::lround(sideData.value(QStringLiteral("rotation")).toDouble()));
            return ((-counterClockwise) % 360 + 360) % 360;
        }
    }
    return 0;
}

int countVideoFrames(const QString &path)
{
    QByteArray out;
    const QStringList args = {QStringLiteral("-v"), QStringLiteral("error"), QStringLiteral("-count_frames"),
                              QStringLiteral("-select_streams"), QStringLiteral("v:0"),
                              QStringLiteral("-show_entries"), QStringLiteral("stream=nb_read_frames"),
                              QStringLiteral("-of"), QStringLiteral("default=noprint_wrappers=1:nokey=1"), path};
    if (!runToolCollect(QStringLiteral("ffprobe"), args, &out))
        return -1;
    bool ok = false;
    const int frames = out.trimmed().toInt(&ok);
    if (!ok) {
        ADD_FAILURE() << "ffprobe counted no frames in " << qPrintable(path) << ": " << out.constData();
        return -1;
    }
    return frames;
}

QList<int> keyFrameIndexes(const QString &path)
{
    QByteArray out;
    const QStringList args = {QStringLiteral("-v"), QStringLiteral("error"), QStringLiteral("-select_streams"), QStringLiteral("v:0"),
                              QStringLiteral("-show_entries"), QStringLiteral("frame=key_frame"),
                              QStringLiteral("-of"), QStringLiteral("csv=p=0"), path};
    if (!runToolCollect(QStringLiteral("ffprobe"), args, &out))
        return {};
    QList<int> indexes;
    int index = 0;
    for (const QByteArray &line : out.split('\n')) {
        const QByteArray flag = line.trimmed();
        if (flag.isEmpty())
            continue;
        if (flag.startsWith('1'))
            indexes.append(index);
        ++index;
    }
    return indexes;
}

QString streamMD5(const QString &path, const QString &map)
{
    QByteArray out;
    const QStringList args = {QStringLiteral("-nostdin"), QStringLiteral("-v"), QStringLiteral("error"),
                              QStringLiteral("-i"), path, QStringLiteral("-map"), map,
                              QStringLiteral("-c"), QStringLiteral("copy"), QStringLiteral("-f"), QStringLiteral("md5"),
                              QStringLiteral("-")};
    if (!runToolCollect(QStringLiteral("ffmpeg"), args, &out))
        return {};
    const QByteArray line = out.trimmed();
    if (!line.startsWith("MD5=")) {
        ADD_FAILURE() << "ffmpeg gave no MD5 for " << qPrintable(map) << " of " << qPrintable(path) << ": " << line.constData();
        return {};
    }
    return QString::fromLatin1(line.mid(4));
}

} // namespace zaf::test
