#pragma once

// Fixture movies for media tests, and readers that check movies with the ffmpeg and ffprobe
// command-line tools, independently of our own engine.
//
// Every function runs on the calling thread and waits (bounded) for the tools it starts. Failures
// are reported with ADD_FAILURE naming the command and its error output; the functions then return
// an empty value ("" / empty list / empty object / -1).

#include "tools/fixture/fixture_movie.h"

#include <QImage>
#include <QSize>
#include <QJsonObject>
#include <QList>
#include <QString>
#include <QStringList>

#include <functional>

namespace zaf::test {

// Writes a fixture movie with a unique name into `dir` and returns its path ("" on failure).
QString makeFixtureMovie(const QString &dir, const zaf::fixture::FixtureSpec &shape = {});
// A fixture movie made once per process for `shape` and shared by every test that asks for it.
QString sharedFixtureMovie(const zaf::fixture::FixtureSpec &shape);
// The file `name` of the fixture cache, made once by `make` into the path it is given when missing,
// for generators of their own; `name` must change whenever what `make` writes does.
QString sharedGeneratedFile(const QString &name, const std::function<bool(const QString &path)> &make);
// What the ffmpeg tool writes from `arguments` (the output's path is added last), made once into
// the fixture cache under a digest of the arguments; `suffix` names the container.
QString sharedFfmpegOutput(const QStringList &arguments, const QString &suffix = QStringLiteral("mp4"));

// The colour of every pixel of a flat-colour movie.
inline constexpr QRgb kFlatColour = 0xff3366cc;
// A 1 s, 30 fps movie of one flat colour and any size, odd and tiny ones included (our writer and
// the fixture tool need even sides), with one audio tone, made by the ffmpeg tool once per process
// per shape. "libx264" stores 4:2:0 when both sides are even and 4:4:4 otherwise; "libx264rgb"
// stores planar RGB, a format that has to be converted for our H.264 encoder.
QString sharedFlatColourMovie(QSize size, const QString &codec = QStringLiteral("libx264"));
// The largest difference of any colour channel between any pixel of `image` and `colour`
// (256 for a null image).
int largestColourDistance(const QImage &image, QRgb colour);

// The number shown by every frame of the first video stream, in presentation order, as displayed
// (the display rotation applied). -1 for a frame without a readable number.
QList<int> readFrameNumbers(const QString &moviePath);

// The number a decoded picture shows, or -1 (see tools/fixture/frame_pattern.h).
int readFrameNumber(const QImage &image);

// The amplitude of the `frequency` component of audio stream `audioStreamIndex` (0-based among
// the audio streams), mixed to mono: ~0.5 for a fixture tone, ~0 for an absent one. -1 on failure.
double toneLevel(const QString &moviePath, int audioStreamIndex, double frequency);

// The samples of audio stream `audioStreamIndex` (0-based among the audio streams) as 32-bit floats,
// interleaved, after the ffmpeg output `options` ("-ac 1" mixes to mono).
QList<float> audioSamples(const QString &moviePath, int audioStreamIndex, const QStringList &options = {});

// The moment (seconds on the movie's timeline) of the loudest sample of audio stream
// `audioStreamIndex`, mixed to mono: where a click sits. -1 on failure.
double loudestMoment(const QString &moviePath, int audioStreamIndex);

// ffprobe -show_streams -show_format, parsed.
QJsonObject ffprobe(const QString &path);
// The streams of one kind ("video", "audio") from an ffprobe answer or of a file, in file order.
QList<QJsonObject> probeStreams(const QJsonObject &probe, const QString &codecType);
QList<QJsonObject> probeStreams(const QString &path, const QString &codecType);
// The clockwise display rotation of a probed video stream (0, 90, 180, 270).
int probeRotation(const QJsonObject &stream);
// The number of video frames of the first video stream, counted by decoding with ffprobe.
int countVideoFrames(const QString &path);

// The presentation times (seconds, from the first frame's) of the frames of the first video stream,
// in presentation order.
QList<double> presentationTimes(const QString &path);
// The presentation-order indexes of the key frames of the first video stream.
QList<int> keyFrameIndexes(const QString &path);

// MD5 of the packets of the streams selected by `map` ("0:v:0", "0:a:1", ...), copied unchanged.
QString streamMD5(const QString &path, const QString &map);

// A finished run of a command-line program.
struct ToolRun {
    int exitCode = -1;
    QByteArray out;
    QByteArray err;
    bool ok() const { return exitCode == 0; }
};
// Runs a program to its end. Not starting or not finishing in time is a test failure; a non-zero
// exit is only reported in the result. `sink`, when given, takes standard output as it arrives.
ToolRun runTool(const QString &program, const QStringList &args, const std::function<void(QByteArray &)> &sink = {});
// ffmpeg -nostdin -v error -y ARGS; false, with a test failure carrying ffmpeg's message, on failure.
bool ffmpeg(const QStringList &args);
// The space-separated words of `line` (no quoting), to write tool arguments compactly.
QStringList words(const char *line);

} // namespace zaf::test
