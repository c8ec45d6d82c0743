#pragma once

// MovieWriter: writes an MPEG-4 movie (H.264 video, AAC audio) from RGB frames and float PCM.
//
// Frames go in as QImages of any size and format; they are converted and scaled to the movie's
// picture size. Audio goes in as interleaved float samples per track, at the movie's sample rate.
// The movie is written under a temporary name in the destination's directory and moved to its
// final name only by a successful finish(), so no half-written movie ever carries the final name;
// a writer destroyed without finish() removes its temporary file. An existing file at the
// destination is never overwritten.
//
// Threads: not thread-safe. Create, append to and finish a writer from one thread (any thread,
// the main thread included, though encoding is real work: a recorder keeps it off the UI thread).
// The encoders run their own threads internally; at 1280x720, 30 fps with the default preset the
// writer keeps up in real time on a two-core machine.

#include "platform/error.h"

#include <QImage>
#include <QSize>
#include <QString>

#include <memory>

namespace zaf::media {

class MovieWriter {
public:
    struct Settings {
        QSize videoSize{1280, 720};      // stored picture size; even numbers (odd ones are rounded up)
        double frameRate = 30;           // frames per second, constant
        int audioTracks = 0;             // number of AAC tracks, 0..16
        int sampleRate = 48000;          // of every audio track
        int channels = 2;                // per audio track: 1 or 2
        int rotation = 0;                // clockwise display rotation: 0, 90, 180 or 270
        int crf = 20;                    // x264 constant rate factor, 0 (lossless) .. 51
        QString preset = QStringLiteral("veryfast"); // x264 preset
        int gopLength = 30;              // frames between keyframes (1: every frame is a keyframe)
        int audioBitRate = 128000;       // per audio track
    };

    // Opens an encoder per track and starts the movie under a temporary name next to `path`.
    // Fails (invalid settings, `path` exists, directory not writable, encoder missing) with an
    // error in the "zaf.media" domain, logged to "zaf.media".
    static Result<std::unique_ptr<MovieWriter>> create(const QString &path, const Settings &settings);
    ~MovieWriter();
    MovieWriter(const MovieWriter &) = delete;
    MovieWriter &operator=(const MovieWriter &) = delete;

    // Appends the next frame; it is shown for 1 / frameRate seconds. A null image appends black.
    OptionalError appendVideoFrame(const QImage &image);
    // Appends `frames` sample frames (frames * channels floats, interleaved) to audio track
    // `trackIndex` (0-based). Samples are clamped to [-1, 1].
    OptionalError appendAudio(int trackIndex, const float *interleaved, qint64 frames);

    // Drains the encoders, completes the file, flushes it to disk and moves it to its final name.
    // After finish() (successful or not) the writer accepts nothing more.
    OptionalError finish();

    const Settings &settings() const;
    qint64 videoFramesWritten() const;
    QString path() const;

private:
    MovieWriter();
    struct Private;
    std::unique_ptr<Private> d;
};

} // namespace zaf::media
