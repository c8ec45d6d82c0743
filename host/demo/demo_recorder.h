#pragma once

// DemoRecorder: turns a stream of frames into an MPEG-4 movie with two synthesized audio tracks.
//
// The caller hands over one picture per video frame; the recorder numbers the frames, and for
// frame n writes the audio of exactly [n, n + 1) frame durations on both tracks, so picture and
// sound stay in step however irregularly the frames arrive. Track 1 is the application's own
// sound, track 2 the microphone (see demo_sound.h).
//
// Threads: the recorder is created, fed and finished on one thread (the main thread in the demo
// window, any thread in a test). Encoding runs on a worker thread of the recorder, which owns the
// MovieWriter from creation to finish. Between the two sits a bounded queue of frames:
// tryAppendFrame() never blocks (false when the queue is full, so a UI can try again at its next
// tick), appendFrame() waits for room. finished() is emitted once, from the worker thread, after
// the movie has been moved to its final name or has failed; queued connections deliver it to
// receivers on other threads. Destroying a recorder that has not finished abandons the movie: the
// worker stops and the temporary file is removed.

#include "platform/error.h"

#include <QImage>
#include <QObject>
#include <QSize>
#include <QString>

#include <condition_variable>
#include <deque>
#include <future>
#include <memory>
#include <mutex>
#include <optional>
#include <thread>

namespace zaf::demo {

class DemoRecorder : public QObject {
    Q_OBJECT
public:
    struct Settings {
        QSize videoSize{960, 540};
        int frameRate = 30;        // frames per second; whole numbers only
        int sampleRate = 48000;
        int queueCapacity = 6;     // frames waiting for the encoder, at most
        int crf = 20;
        QString preset = QStringLiteral("veryfast");
    };
    static constexpr int kAudioTracks = 2;

    explicit DemoRecorder(const Settings &settings, QObject *parent = nullptr);
    explicit DemoRecorder(QObject *parent = nullptr);
    ~DemoRecorder() override;

    // Starts the worker and opens the movie at `path` (written under a temporary name until
    // finished). Fails when already started or when the writer cannot be created.
    OptionalError start(const QString &path);

    // Queues the next frame (any size; it is scaled to the movie's). False when the queue is full,
    // the recorder is not recording, or encoding has failed (see error()).
    bool tryAppendFrame(const QImage &frame);
    // Queues the next frame, waiting for room. Fails when not recording or when encoding failed.
    OptionalError appendFrame(const QImage &frame);

    // Ends the recording: the worker encodes what is queued, completes the movie and emits
    // finished(). Nothing can be appended afterwards.
    void finish();
    // Blocks until the worker is done (after finish()); returns the outcome. Without finish() the
    // recording is ended first.
    OptionalError waitForFinished();

    // Sample frames of one audio track that cover the first `videoFrames` video frames.
    static qint64 samplesThrough(qint64 videoFrames, int sampleRate, int frameRate);

    const Settings &settings() const { return m_settings; }
    QString path() const { return m_path; }
    bool isRecording() const;
    qint64 framesAppended() const;
    double secondsAppended() const;
    // The first encoding error, if any.
    OptionalError error() const;

Q_SIGNALS:
    // From the worker thread. `errorMessage` is empty on success, and `path` is the finished movie.
    void finished(const QString &path, const QString &errorMessage);

private:
    struct Job {
        QImage frame;
        qint64 number = 0;
    };

    void run(std::shared_ptr<std::promise<OptionalError>> created);
    OptionalError enqueue(const QImage &frame, bool wait);
    void stopWorker();

    Settings m_settings;
    QString m_path;
    std::thread m_worker;

    mutable std::mutex m_mutex;
    std::condition_variable m_jobsChanged;
    std::deque<Job> m_jobs;
    qint64 m_framesAppended = 0;
    bool m_started = false;
    bool m_finishRequested = false;
    bool m_abandon = false;
    bool m_done = false;
    OptionalError m_error;
};

} // namespace zaf::demo
