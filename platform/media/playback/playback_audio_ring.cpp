#include "platform/media/playback/playback_audio_ring.h"

#include <algorithm>
#include <chrono>
#include <cstring>

namespace zaf::media::playback {

AudioRing::AudioRing(qsizetype capacityBytes)
    : m_buffer(std::max<qsizetype>(capacityBytes, 64), Qt::Uninitialized)
{
}

bool AudioRing::write(const char *data, qsizetype size, const std::function<bool()> &giveUp)
{
    const qsizetype capacity = m_buffer.size();
    std::unique_lock lock(m_mutex);
    while (size > 0) {
        if (giveUp && giveUp())
            return false;
        const qsizetype room = capacity - m_size;
        if (room == 0) {
            m_room.wait_for(lock, std::chrono::milliseconds(50));
            continue;
        }
        qsizetype tail = (m_head + m_size) % capacity;
        const qsizetype chunk = std::min({size, room, capacity - tail});
        std::memcpy(m_buffer.data() + tail, data, size_t(chunk));
        m_size += chunk;
        data += chunk;
        size -= chunk;
    }
    return true;
}

void AudioRing::setEnded()
{
    std::lock_guard lock(m_mutex);
    m_ended = true;
}

qsizetype AudioRing::read(char *out, qsizetype maxSize)
{
    const qsizetype capacity = m_buffer.size();
    qsizetype copied = 0;
    {
        std::lock_guard lock(m_mutex);
        while (copied < maxSize && m_size > 0) {
            const qsizetype chunk = std::min({maxSize - copied, m_size, capacity - m_head});
            std::memcpy(out + copied, m_buffer.constData() + m_head, size_t(chunk));
            m_head = (m_head + chunk) % capacity;
            m_size -= chunk;
            copied += chunk;
        }
    }
    m_room.notify_all();
    return copied;
}

qsizetype AudioRing::available() const
{
    std::lock_guard lock(m_mutex);
    return m_size;
}

bool AudioRing::ended() const
{
    std::lock_guard lock(m_mutex);
    return m_ended;
}

void AudioRing::clear()
{
    {
        std::lock_guard lock(m_mutex);
        m_head = 0;
        m_size = 0;
        m_ended = false;
    }
    m_room.notify_all();
}

void AudioRing::wake()
{
    m_room.notify_all();
}

} // namespace zaf::media::playback
