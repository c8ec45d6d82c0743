#pragma once

// The audio device stage of the playback pipeline, and the audio clock.
//
// AudioOutput owns a QAudioSink (pull mode) that reads mixed PCM from an AudioRing. It is also a
// TimeSource: now() is how much audio the device has played, summed over every run, so the media
// time that the Player derives from it is the time of the sound being heard. Switched on, it waits
// until the ring holds enough audio of the awaited request (or its end) before it starts the
// device; until then its clock stands still. After the last sample it plays silence, so the clock
// keeps running to the end of a movie whose video is longer than its sound.
// Created, used and destroyed on the main thread.

#include "platform/media/playback/playback_audio_decoder.h"
#include "platform/media/playback/playback_clock.h"

#include <QAudioDevice>
#include <QTimer>

#include <functional>
#include <memory>

class QAudioSink;

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

    double now() const override;
    void setActive(bool active) override;

private:
    void tick();
    void startDevice();
    void stopDevice();

    QAudioDevice m_device;
    AudioOutputFormat m_format;
    std::unique_ptr<AudioRing> m_ring;
    std::unique_ptr<QIODevice> m_source;
    std::unique_ptr<QAudioSink> m_sink;
    std::function<bool()> m_readyCheck;
    QTimer m_ticker;
    double m_playedBefore = 0; // seconds played by earlier runs of the device
};

} // namespace zaf::media::playback
