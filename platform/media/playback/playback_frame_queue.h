#pragma once

// The small bounded queue that carries decoded pictures from the video decoder's thread to the main
// thread. Thread-safe: one producer (the decoder thread) and one consumer (the main thread).

#include <QImage>

#include <condition_variable>
#include <cstdint>
#include <deque>
#include <functional>
#include <mutex>
#include <optional>

namespace zaf::media::playback {

struct VideoFrame {
    QImage image;                 // the decoded picture, as coded (no transform applied)
    std::int64_t ptsNs = 0;       // media time of the picture, in nanoseconds
    std::uint64_t generation = 0; // the seek request the picture answers
    bool seekResult = false;      // the picture at the target of that seek
    bool preview = false;         // a stand-in for it while it is being decoded (a drag)
};

class FrameQueue {
public:
    explicit FrameQueue(std::size_t capacity) : m_capacity(capacity ? capacity : 1) {}

    // Producer: drops the frames of other generations, waits for room, then appends. Returns false without appending when `giveUp` turns
    // true while waiting (it is re-checked whenever wake() is called, and at least every 50 ms).
    bool push(VideoFrame frame, const std::function<bool()> &giveUp);

    // Consumer: of the frames of `generation` that are due at `ptsNs` (their time has come, or they
    // answer the seek or stand in for its answer), and of the answers and stand-ins of earlier
    // generations (a drag's earlier seeks, still the best picture there is), removes them all and
    // returns the last. Other frames of other generations are dropped.
    std::optional<VideoFrame> takeDue(std::uint64_t generation, std::int64_t ptsNs);

    // Wakes a producer waiting in push() so that it re-checks its reason to give up.
    void wake();
    void clear();
    std::size_t size() const;

private:
    const std::size_t m_capacity;
    mutable std::mutex m_mutex;
    std::condition_variable_any m_room; // _any: its timed wait is visible to ThreadSanitizer
    std::deque<VideoFrame> m_frames;
};

} // namespace zaf::media::playback
