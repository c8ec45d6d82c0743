#pragma once

// The video stage of the playback pipeline: demuxes one video stream of a movie and decodes it on a
// thread of its own, into a FrameQueue.
//
// Input: seek requests (a target time and a generation number). Output: pictures in the queue,
// tagged with the generation of the request they follow, and a call of `framesReady` after each.
// After a request the first picture is the one shown at the target (exact: decoding starts at the
// keyframe before the target and drops the pictures before it), followed by the pictures after it
// in order until the end of the stream. A newer request abandons an older one at once, so a burst
// of requests costs one decode.

#include "platform/media/playback/playback_decoder_thread.h"
#include "platform/media/playback/playback_frame_queue.h"

#include <QString>

#include <cstdint>
#include <functional>

namespace zaf::media::playback {

class VideoDecoder {
public:
    // `framesReady` runs on the decoder thread after each picture it queues; it must be cheap and
    // must not call back into the decoder. `failed` runs on the decoder thread once when the stream
    // cannot be opened or decoded, with a message.
    VideoDecoder(QString path, int streamIndex, FrameQueue *queue, std::function<void()> framesReady,
        std::function<void(const QString &)> failed);
    // Stops the thread (interrupting any blocking read) and waits for it.
    ~VideoDecoder();
    VideoDecoder(const VideoDecoder &) = delete;
    VideoDecoder &operator=(const VideoDecoder &) = delete;

    // Any thread. Replaces any request not yet started.
    void seek(std::int64_t targetNs, std::uint64_t generation);

private:
    struct Request {
        std::int64_t targetNs;
        std::uint64_t generation;
    };
    struct DecodeRun; // what one run of the thread holds, and its steps
    void run();

    const QString m_path;
    const int m_streamIndex;
    FrameQueue *const m_queue;
    const std::function<void()> m_framesReady;             // decoder thread
    const std::function<void(const QString &)> m_failed;  // decoder thread
    DecoderThread<Request> m_thread;
};

} // namespace zaf::media::playback
