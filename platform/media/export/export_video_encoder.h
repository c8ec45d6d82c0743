#pragma once

// The video stage of a cut export (private to platform/media): decodes one source video stream
// from the keyframe before the cut, drops the frames before the frame shown at the cut's start,
// and encodes the frames up to the cut's end with libx264 at the source size and frame rate,
// timestamps starting at 0. The source's display matrix goes onto the output stream.
//
// In splice mode it encodes one stretch of a smart cut instead: no output stream of its own, packets
// go to the splicer's stream through the writer, and the encoding is made to sit between copied
// source pictures (the source's profile, level and picture format, parameter sets under an id of
// their own, an IDR first, no B-frames).
//
// Input: the source stream's packets through sendPacket(). Output: encoded packets handed to the
// PacketWriter for its one output stream. Every call runs on the export's worker thread.

#include "platform/media/export/export_common.h"

#include <QByteArray>

#include <memory>
#include <optional>

namespace zaf::media::exportpipe {

class ExportVideoEncoder {
public:
    struct Options {
        const AVStream *input = nullptr;
        std::int64_t startMicros = 0;   // the frame shown at this instant is the first output frame
        std::int64_t endMicros = 0;     // frames starting at or after it are dropped
        struct Splice {
            int parameterSetId = 0;     // the id of the encoder's SPS and PPS
            int outputIndex = -1;       // the output stream its packets belong to
        };
        std::optional<Splice> splice;
    };

    // The encoder profile that reproduces the source's in splice mode; null if there is none.
    static const char *spliceProfile(const AVCodecParameters *source);

    static std::unique_ptr<ExportVideoEncoder> create(const Options &options, AVFormatContext *output,
                                                      PacketWriter writer, Error *error);
    ~ExportVideoEncoder();

    int sourceStreamIndex() const;
    StageResult sendPacket(const AVPacket *packet);
    // Drains the decoder and the encoder. Without splice mode, a range with no frame is an error.
    StageResult finish();
    // Frames starting at or after `sourcePts` (the input's time base) are no longer this stage's.
    void endBefore(std::int64_t sourcePts);
    // The encoder's SPS and PPS (Annex B), as written into a sample description.
    QByteArray parameterSets() const;
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
