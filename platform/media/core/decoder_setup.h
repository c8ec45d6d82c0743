#pragma once

// Setting up a decoder for one stream of an opened input, the one way every decoder is made
// (playback video and audio, thumbnails, export). Private to platform/media.

#include "platform/media/core/ffmpeg_ptr.h"

#include <QString>

#include <cstdint>

namespace zaf::media {

struct DecoderOptions {
    // Decoding threads; 0 lets FFmpeg pick one per core.
    int threadCount = 1;
    // FF_THREAD_FRAME and/or FF_THREAD_SLICE; 0 keeps FFmpeg's default.
    int threadType = 0;
    // Streams that declare larger pictures are refused, and no picture larger is ever allocated.
    std::int64_t maxPixels = ff::kMaxPixels;
    // AV_EF_* flags: which damage the decoder reports as an error instead of concealing it.
    int errorRecognition = 0;
};

// A decoder for `stream`, opened: its parameters come from the stream, its packet time base is the
// stream's, and it never allocates pictures over `options.maxPixels`. Null with `error` set on failure.
ff::CodecContextPtr openDecoder(const AVStream *stream, const DecoderOptions &options, QString *error);

} // namespace zaf::media
