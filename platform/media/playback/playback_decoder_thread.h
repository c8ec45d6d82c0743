#pragma once

// The thread of a playback decoder and the mailbox that hands it requests: what the video and the
// audio decoder share. The owner posts requests from any thread; the decoder's thread takes them,
// waiting while it has nothing to do, and asks between its steps whether a newer one has come, so
// that a newer request abandons an older one at once and a burst of requests costs one decode.
//
// The owner starts the thread in its constructor, once everything the thread reads is in place, and
// stops it first thing in its destructor: stop() cancels the stop token (which interrupts a blocking
// read of an input opened with it), wakes the thread wherever it waits (the mailbox, or the output
// it writes to, through `wakeOutput`) and joins it.

#include "platform/media/core/cancel_token.h"

#include <atomic>
#include <condition_variable>
#include <cstdint>
#include <functional>
#include <mutex>
#include <optional>
#include <thread>
#include <utility>

namespace zaf::media::playback {

template <typename Request>
class DecoderThread {
public:
    struct Taken {
        std::uint64_t number; // 1 for the first request posted, then counting up
        Request request;
    };

    // `wakeOutput` wakes the thread when it waits for room in its output, so that it re-checks its
    // reason to give up; it is called on the thread that posts a request or stops this one.
    explicit DecoderThread(std::function<void()> wakeOutput) : m_wakeOutput(std::move(wakeOutput)) {}
    ~DecoderThread() { stop(); }
    DecoderThread(const DecoderThread &) = delete;
    DecoderThread &operator=(const DecoderThread &) = delete;

    // The owner's constructor: runs `body` on a new thread.
    void start(std::function<void()> body) { m_thread = std::thread(std::move(body)); }

    // The owner's destructor (not the decoder's thread): stops the thread and waits for it. Safe to
    // call twice.
    void stop()
    {
        m_stop.cancel();
        wake();
        if (m_thread.joinable())
            m_thread.join();
    }

    // Any thread. Replaces a request not yet taken; returns the new request's number.
    std::uint64_t post(Request request)
    {
        std::uint64_t number;
        {
            std::lock_guard lock(m_mutex);
            m_request = std::move(request);
            number = ++m_posted;
        }
        wake();
        return number;
    }

    // The decoder's thread. Takes the request posted since the last one taken; with `wait`, waits
    // for one first. Nothing once the thread is told to stop.
    std::optional<Taken> take(bool wait)
    {
        std::unique_lock lock(m_mutex);
        if (wait && !m_request)
            m_wake.wait(lock, [this] { return m_stop.isCancelled() || m_request.has_value(); });
        if (m_stop.isCancelled() || !m_request)
            return std::nullopt;
        Taken taken{m_posted.load(), std::move(*m_request)};
        m_request.reset();
        m_taken.store(taken.number);
        return taken;
    }

    // The decoder's thread: a request newer than the last one taken is waiting.
    bool hasNewerRequest() const { return m_posted.load() != m_taken.load(); }
    bool stopping() const { return m_stop.isCancelled(); }
    // Interrupts the blocking reads of an input opened with it; must outlive that input.
    const CancelToken &stopToken() const { return m_stop; }

private:
    void wake()
    {
        // Taking the lock orders the wake after a waiter's check of its condition, so none is lost.
        { std::lock_guard lock(m_mutex); }
        m_wake.notify_all();
        if (m_wakeOutput)
            m_wakeOutput();
    }

    const std::function<void()> m_wakeOutput;
    CancelToken m_stop;
    std::atomic<std::uint64_t> m_posted{0};
    std::atomic<std::uint64_t> m_taken{0};
    std::mutex m_mutex;
    std::condition_variable m_wake;
    std::optional<Request> m_request;
    std::thread m_thread;
};

} // namespace zaf::media::playback
