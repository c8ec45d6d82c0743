#pragma once

// The audio stage of the playback pipeline: demuxes every audio stream of a movie on a thread of its
// own, decodes them, resamples each to interleaved stereo at the output rate, sums them sample by
// sample (limited to full scale) and writes the mix into an AudioRing.
//
// Input: start(time) and stop() requests. Output: PCM in the ring, starting at exactly the requested
// time, then the end mark at the end of the longest stream.

#include "platform/media/playback/playback_audio_ring.h"
#include "platform/media/playback/playback_decoder_thread.h"

#include <QList>
#include <QString>

#include <atomic>
#include <cstdint>
#include <functional>
#include <optional>

namespace zaf::media::playback {

struct AudioOutputFormat {
    int sampleRate = 48000;
    int channels = 2;
    bool float32 = true; // else signed 16-bit
    int bytesPerFrame() const { return channels * (float32 ? 4 : 2); }
};

class AudioDecoder {
public:
    // `failed` runs on the decoder thread when the movie cannot be opened for audio.
    AudioDecoder(QString path, QList<int> streamIndexes, AudioOutputFormat format, AudioRing *ring,
        std::function<void(const QString &)> failed);
    ~AudioDecoder(); // stops the thread and waits for it
    AudioDecoder(const AudioDecoder &) = delete;
    AudioDecoder &operator=(const AudioDecoder &) = delete;

    // Any thread. Empties the ring and fills it from `targetNs` on; returns the request's number.
    std::uint64_t start(std::int64_t targetNs);
    // Any thread. Stops filling the ring.
    void stop();
    // The number of the request whose audio the ring now holds (0 before the first).
    std::uint64_t servingRequest() const { return m_serving.load(); }

private:
    struct Request {
        std::optional<std::int64_t> targetNs; // none for a stop
    };
    struct DecodeRun; // what one run of the thread holds, and its steps
    void run();

    const QString m_path;
    const QList<int> m_streams;
    const AudioOutputFormat m_format;
    AudioRing *const m_ring;
    const std::function<void(const QString &)> m_failed; // decoder thread

    std::atomic<std::uint64_t> m_serving{0};
    DecoderThread<Request> m_thread;
};

} // namespace zaf::media::playback
