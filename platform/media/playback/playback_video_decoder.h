#pragma once

// The video stage of the playback pipeline: demuxes one video stream of a movie and decodes it on a
// thread of its own, into a FrameQueue.
//
// Input: seek requests (a target time and a generation number). Output: pictures in the queue,
// tagged with the generation of the request they follow, and a call of `framesReady` after each.
// After a request the answer is the picture shown at the target, exact, followed, when the request
// is for playing, by the pictures after it in order until the end of the stream.
//
// Decoded pictures stay in a window around the playhead (FrameWindow, in the decoder's format and
// within a memory budget), so a request near the playhead is answered from it without decoding,
// and stepping back across a group of pictures decodes that group once. The decoder only seeks when
// it must: a request ahead of where it stands in the same group of pictures is reached by decoding
// on. A newer request replaces an older one at once. While requests come in a quick series (the
// playhead dragged), the decoder hands on, before the exact picture, the best stand-in it has for
// the latest target: the latest picture it holds at or before it in the same group, refreshed as
// decoding moves toward the target.

#include "platform/media/playback/playback_decoder_thread.h"
#include "platform/media/playback/playback_frame_queue.h"
#include "platform/media/playback/playback_statistics.h"

#include <QString>

#include <atomic>
#include <chrono>
#include <cstdint>
#include <functional>

namespace zaf::media::playback {

class VideoDecoder {
public:
    // `framesReady` runs on the decoder thread after each picture it queues; it must be cheap and
    // must not call back into the decoder. `failed` runs on the decoder thread once when the stream
    // cannot be opened or decoded, with a message.
    VideoDecoder(QString path, int streamIndex, FrameQueue *queue, std::int64_t windowBudgetBytes,
        std::function<void()> framesReady, std::function<void(const QString &)> failed);
    // Stops the thread (interrupting any blocking read) and waits for it.
    ~VideoDecoder();
    VideoDecoder(const VideoDecoder &) = delete;
    VideoDecoder &operator=(const VideoDecoder &) = delete;

    // Any thread. Replaces any request not yet started. With `playing`, the pictures after the
    // target follow its answer; without, the decoder stops at the answer.
    void seek(std::int64_t targetNs, std::uint64_t generation, bool playing);
    // Any thread. The window's budget from its next picture on.
    void setWindowBudget(std::int64_t bytes) { m_budget.store(bytes); }
    VideoDecoderStatistics statistics() const;

private:
    struct Request {
        std::int64_t targetNs;
        std::uint64_t generation;
        bool playing;
        std::chrono::steady_clock::time_point postedAt;
    };
    struct DecodeRun; // what one run of the thread holds, and its steps
    void run();

    const QString m_path;
    const int m_streamIndex;
    FrameQueue *const m_queue;
    const std::function<void()> m_framesReady;             // decoder thread
    const std::function<void(const QString &)> m_failed;  // decoder thread
    std::atomic<std::int64_t> m_budget;
    std::atomic<std::uint64_t> m_decoded{0};
    std::atomic<std::int64_t> m_windowBytes{0};
    std::atomic<std::int64_t> m_windowPeakBytes{0};
    std::atomic<std::int64_t> m_windowPictures{0};
    DecoderThread<Request> m_thread;
};

} // namespace zaf::media::playback
