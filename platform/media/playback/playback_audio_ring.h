#pragma once

// A bounded byte ring that carries mixed PCM from the audio decoder's thread to the audio device.
// Thread-safe: one producer (the decoder thread), one consumer (the device's pull on the main thread).

#include <QByteArray>

#include <condition_variable>
#include <cstdint>
#include <functional>
#include <mutex>

namespace zaf::media::playback {

class AudioRing {
public:
    explicit AudioRing(qsizetype capacityBytes);

    // Producer: writes all of `data`, waiting for room. Returns false when `giveUp` turns true while
    // waiting (re-checked on wake() and at least every 50 ms); part of the data may then be written.
    bool write(const char *data, qsizetype size, const std::function<bool()> &giveUp);
    // Producer: no more data follows until the next clear().
    void setEnded();

    // Consumer: copies up to `maxSize` bytes out; never waits.
    qsizetype read(char *out, qsizetype maxSize);
    qsizetype available() const;
    bool ended() const;

    // Empties the ring and clears the end mark.
    void clear();
    void wake();

private:
    QByteArray m_buffer;
    mutable std::mutex m_mutex;
    std::condition_variable_any m_room; // _any: its timed wait is visible to ThreadSanitizer
    qsizetype m_head = 0; // read position
    qsizetype m_size = 0; // bytes held
    bool m_ended = false;
};

} // namespace zaf::media::playback
