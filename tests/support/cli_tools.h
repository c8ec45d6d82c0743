#pragma once

// Helpers for tests that check files with the ffmpeg/ffprobe command-line tools (our
// independent oracle) with bounded waits, and read their answers.

#include <QByteArray>
#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>
#include <QProcess>
#include <QString>
#include <QStringList>

#include <gtest/gtest.h>

namespace zaf::test::cli {

struct Run {
    int exitCode = -1;
    QByteArray out;
    QByteArray err;
    bool ok() const { return exitCode == 0; }
};

inline Run run(const QString &program, const QStringList &args, int timeoutMs = 120000)
{
    QProcess process;
    process.start(program, args);
    Run result;
    if (!process.waitForStarted(10000)) {
        ADD_FAILURE() << "cannot start " << program.toStdString();
        return result;
    }
    if (!process.waitForFinished(timeoutMs)) {
        process.kill();
        process.waitForFinished(5000);
        ADD_FAILURE() << program.toStdString() << " did not finish: " << args.join(u' ').toStdString();
        return result;
    }
    result.exitCode = process.exitStatus() == QProcess::NormalExit ? process.exitCode() : -1;
    result.out = process.readAllStandardOutput();
    result.err = process.readAllStandardError();
    return result;
}

// ffmpeg -v error -y ARGS; true on success (a failure is reported with ffmpeg's message).
inline bool ffmpeg(const QStringList &args)
{
    const Run r = run(QStringLiteral("ffmpeg"), QStringList{QStringLiteral("-nostdin"), QStringLiteral("-v"),
                                                           QStringLiteral("error"), QStringLiteral("-y")} + args);
    if (!r.ok())
        ADD_FAILURE() << "ffmpeg " << args.join(u' ').toStdString() << " failed: " << r.err.toStdString();
    return r.ok();
}

// ffprobe's JSON for the streams and the format of a file.
inline QJsonObject probe(const QString &path, const QStringList &extra = {})
{
    const Run r = run(QStringLiteral("ffprobe"),
                      QStringList{QStringLiteral("-v"), QStringLiteral("error"), QStringLiteral("-print_format"),
                                  QStringLiteral("json"), QStringLiteral("-show_streams"), QStringLiteral("-show_format")}
                          + extra + QStringList{path});
    return QJsonDocument::fromJson(r.out).object();
}

inline QJsonArray streams(const QString &path)
{
    return probe(path).value(QStringLiteral("streams")).toArray();
}

inline QList<QJsonObject> streamsOfType(const QString &path, const QString &codecType)
{
    QList<QJsonObject> result;
    for (const auto &value : streams(path)) {
        if (value.toObject().value(QStringLiteral("codec_type")).toString() == codecType)
            result.append(value.toObject());
    }
    return result;
}

// The rotation ffprobe reports from a stream's display matrix (degrees counter-clockwise), 0 without one.
inline int probedRotation(const QJsonObject &stream)
{
    for (const auto &value : stream.value(QStringLiteral("side_data_list")).toArray()) {
        const QJsonObject side = value.toObject();
        if (side.contains(QStringLiteral("rotation")))
            return side.value(QStringLiteral("rotation")).toInt();
    }
    return 0;
}

// The MD5 of the packets of the mapped streams, copied as they are.
inline QByteArray packetMD5(const QString &path, const QString &map)
{
    const Run r = run(QStringLiteral("ffmpeg"),
                      {QStringLiteral("-nostdin"), QStringLiteral("-v"), QStringLiteral("error"), QStringLiteral("-i"), path,
                       QStringLiteral("-map"), map, QStringLiteral("-c"), QStringLiteral("copy"), QStringLiteral("-f"),
                       QStringLiteral("md5"), QStringLiteral("-")});
    EXPECT_TRUE(r.ok()) << r.err.toStdString();
    return r.out.trimmed();
}

// A movie of `seconds` of the test pattern (libx264, 30 fps, GOP 30) with one sine tone per entry of
// `tones` as its own AAC track (stereo at 48 kHz). No extra options: an .mp4 with moov at the end.
inline bool makeMovie(const QString &path, double seconds, const QList<int> &tones, const QString &size = QStringLiteral("320x240"),
                      const QStringList &extra = {})
{
    QStringList args{QStringLiteral("-f"), QStringLiteral("lavfi"), QStringLiteral("-i"),
                     QStringLiteral("testsrc2=size=%1:rate=30").arg(size)};
    for (int tone : tones)
        args += {QStringLiteral("-f"), QStringLiteral("lavfi"), QStringLiteral("-i"),
                 QStringLiteral("sine=frequency=%1:sample_rate=48000").arg(tone)};
    args += {QStringLiteral("-map"), QStringLiteral("0:v")};
    for (int i = 0; i < tones.size(); ++i)
        args += {QStringLiteral("-map"), QStringLiteral("%1:a").arg(i + 1)};
    args += {QStringLiteral("-t"), QString::number(seconds), QStringLiteral("-c:v"), QStringLiteral("libx264"),
             QStringLiteral("-preset"), QStringLiteral("ultrafast"), QStringLiteral("-g"), QStringLiteral("30"),
             QStringLiteral("-pix_fmt"), QStringLiteral("yuv420p"), QStringLiteral("-c:a"), QStringLiteral("aac"),
             QStringLiteral("-ac"), QStringLiteral("2")};
    args += extra;
    args += path;
    return ffmpeg(args);
}

// Copies a movie with a display matrix that shows it rotated. FFmpeg 5.1's command line turns the
// stream-copy tag "rotate=R" into a matrix of R degrees counter-clockwise, so a picture shown
// turned clockwise by D degrees needs R = 360 - D.
inline bool rotateCopy(const QString &from, const QString &to, int degreesClockwise)
{
    return ffmpeg({QStringLiteral("-i"), from, QStringLiteral("-map"), QStringLiteral("0"), QStringLiteral("-c"),
                   QStringLiteral("copy"), QStringLiteral("-metadata:s:v:0"),
                   QStringLiteral("rotate=%1").arg((360 - degreesClockwise) % 360), to});
}

} // namespace zaf::test::cli
