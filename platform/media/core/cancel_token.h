#pragma once

// CancelToken: how a caller tells a media stage to stop. Private to platform/media.

#include <atomic>
#include <chrono>

namespace zaf::media {

// Tells long FFmpeg I/O to stop: a flag any thread may set, and an optional deadline after which
// the token counts as cancelled by itself. Wired into AVFormatContext::interrupt_callback by
// openInput(), so a blocking read of that context returns at once; the stages also poll
// isCancelled() between their own steps. Every member may be called from any thread.
class CancelToken {
public:
    using Clock = std::chrono::steady_clock;

    CancelToken() = default;
    CancelToken(const CancelToken &) = delete;
    CancelToken &operator=(const CancelToken &) = delete;

    void cancel() { m_cancelled.store(true); }
    // Clears the flag so the token can serve the next piece of work; the deadline stays.
    void reset() { m_cancelled.store(false); }
    // From now on the token is cancelled once `bound` has passed.
    void setDeadlineAfter(Clock::duration bound);
    bool isCancelled() const;

    // FFmpeg's interrupt callback; `opaque` is a const CancelToken *.
    static int interruptCallback(void *opaque);

private:
    std::atomic<bool> m_cancelled{false};
    std::atomic<Clock::rep> m_deadline{0}; // ticks of Clock since its epoch; 0: none
};

} // namespace zaf::media
