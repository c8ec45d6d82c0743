#include "platform/media/playback/playback_frame_queue.h"

#include <algorithm>
#include <chrono>

namespace zaf::media::playback {

bool FrameQueue::push(VideoFrame frame, const std::function<bool()> &giveUp)
{
    std::unique_lock lock(m_mutex);
    // Pictures of an older request can never be shown any more; they must not keep out this one.
    std::erase_if(m_frames, [&](const VideoFrame &queued) { return queued.generation != frame.generation; });
    while (m_frames.size() >= m_capacity) {
        if (giveUp && giveUp())
            return false;
        m_room.wait_for(lock, std::chrono::milliseconds(50));
    }
    if (giveUp && giveUp())
        return false;
    m_frames.push_back(std::move(frame));
    return true;
}

std::optional<VideoFrame> FrameQueue::takeDue(std::uint64_t generation, std::int64_t ptsNs)
{
    std::optional<VideoFrame> due;
    {
        std::lock_guard lock(m_mutex);
        while (!m_frames.empty()) {
            VideoFrame &front = m_frames.front();
            const bool answer = front.seekResult || front.preview;
            if (front.generation != generation) {
                if (answer && front.generation < generation)
                    due = std::move(front);
                m_frames.pop_front();
                continue;
            }
            if (!answer && front.ptsNs > ptsNs)
                break;
            due = std::move(front);
            m_frames.pop_front();
        }
    }
    m_room.notify_all();
    return due;
}

void FrameQueue::wake()
{
    m_room.notify_all();
}

void FrameQueue::clear()
{
    {
        std::lock_guard lock(m_mutex);
        m_frames.clear();
    }
    m_room.notify_all();
}

std::size_t FrameQueue::size() const
{
    std::lock_guard lock(m_mutex);
    return m_frames.size();
}

} // namespace zaf::media::playback
