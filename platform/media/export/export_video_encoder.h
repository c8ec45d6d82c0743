#pragma once

// The video stage of a cut export (private to platform/media): decodes one source video stream
// from the keyframe before the cut, drops the frames before the frame shown at the cut's start,
// and encodes the frames up to the cut's end with libx264 at the source size and frame rate,
// timestamps starting at 0. The source's display matrix goes onto the output stream.
//
// Input: the source stream's packets through sendPacket(). Output: encoded packets handed to the
// PacketWriter for its one output stream. Every call runs on the export's worker thread.

#include "platform/media/export/export_common.h"

#include <memory>

namespace zaf::media::exportpipe {

class ExportVideoEncoder {
public:
    struct Options {
        const AVStream *input = nullptr;
        std::int64_t startMicros = 0;   // the frame shown at this instant is the first output frame
        std::int64_t endMicros = 0;     // frames starting at or after it are dropped
    };

    static std::unique_ptr<ExportVideoEncoder> create(const Options &options, AVFormatContext *output,
                                                      PacketWriter writer, Error *error);
    ~ExportVideoEncoder();

    int sourceStreamIndex() const;
    StageResult sendPacket(const AVPacket *packet);
    StageResult finish();
    // True once a decoded frame at or past the cut's end has been seen.
    bool isPastEnd() const;
    // Seconds of output encoded so far (for progress).
    double encodedSeconds() const;

private:
    ExportVideoEncoder();
    struct Private;
    std::unique_ptr<Private> d;
};

} // namespace zaf::media::exportpipe
