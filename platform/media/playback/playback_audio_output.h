#pragma once

// The audio device stage of the playback pipeline, and the audio clock.
//
// AudioOutput owns a QAudioSink that it feeds itself (push mode) from an AudioRing every 10 ms, and
// is a TimeSource whose now() follows the sound being heard. Switched on, it waits until the ring
// holds enough audio of the awaited request (or its end), opens the device with a buffer of a fixed
// size and fills that buffer at once, so the device starts playing without waiting for more; until
// the device reports that it plays, the clock stands still (the picture waits for the sound). After
// the last sample it plays silence, so the clock keeps running to the end of a movie whose video is
// longer than its sound.
//
// When the device cannot be opened, or fails or stops while playing (the sound server refused or
// went away), the clock carries on from where it stood on a steady clock, and the failure handler
// is told, once, on a later pass of the main thread's event loop.
// Created, used and destroyed on the main thread.

#include "platform/media/playback/playback_audio_decoder.h"
#include "platform/media/playback/playback_clock.h"

#include <QAudio>
#include <QAudioDevice>
#include <QElapsedTimer>
#include <QTimer>

#include <functional>
#include <memory>

class QAudioSink;
class QIODevice;

namespace zaf::media::playback {

class AudioOutput : public TimeSource {
    Q_OBJECT
public:
    // The default output device, or a null device when the machine has none.
    static QAudioDevice defaultDevice();

    explicit AudioOutput(const QAudioDevice &device, QObject *parent = nullptr);
    ~AudioOutput() override;

    AudioOutputFormat format() const { return m_format; }
    AudioRing *ring() const { return m_ring.get(); }

    // Called, on the main thread, before the device starts: true when the ring holds the audio
    // the device is to play (the Player checks the decoder's request number).
    void setReadyCheck(std::function<bool()> check) { m_readyCheck = std::move(check); }
    // Called on the main thread, from the event loop (never from inside a call into this object),
    // at most once: the device failed, with why. The handler may destroy this object.
    void setFailureHandler(std::function<void(const QString &)> handler) { m_failureHandler = std::move(handler); }
    bool failed() const { return m_failed; }

    double now() const override;
    void setActive(bool active) override;

private:
    void tick();
    void startDevice();
    void stopDevice();
    void feed();
    double devicePlayedSeconds() const;
    void deviceStateChanged(QAudio::State state);
    void fail(const QString &why);

    QAudioDevice m_device;
    AudioOutputFormat m_format;
    std::unique_ptr<AudioRing> m_ring;
    std::unique_ptr<QAudioSink> m_sink;
    QIODevice *m_sinkInput = nullptr; // owned by m_sink
    std::function<bool()> m_readyCheck;
    std::function<void(const QString &)> m_failureHandler;
    QTimer m_ticker;
    QElapsedTimer m_steady;
    double m_playedBefore = 0;   // seconds of the clock before the current run of the device
    mutable double m_deviceSeconds = 0; // the latest reading of the current run
    bool m_stopping = false;     // a stop of ours is under way: its state change is no failure
    bool m_failed = false;
    double m_failedAtClock = 0;  // now() when the device failed; a steady clock runs on from it
    qint64 m_failedAtSteadyNs = 0;
};

} // namespace zaf::media::playback
