#pragma once

// The audio stage of an export (private to platform/media): decodes one or more source audio
// streams, optionally cuts them to a range, sums them at unity gain and limits the sum (mix mode),
// and encodes the result as one AAC track at 48 kHz stereo.
//
// Inputs: the source streams' packets, through sendPacket(). Output: encoded packets handed to the
// PacketWriter for its one output stream. Every call runs on the export's worker thread.

#include "platform/media/export/export_audio_stage.h"

#include <QList>

#include <memory>
#include <optional>

namespace zaf::media::exportpipe {

class ExportAudioEncoder final : public ExportAudioStage {
public:
    struct Cut {
        std::int64_t startMicros = 0;   // first instant kept, in microseconds of the source
        std::int64_t endMicros = 0;     // first instant dropped
    };
    struct Options {
        QList<const AVStream *> inputs; // source audio streams, at least one
        bool mix = false;               // sum the inputs and limit the sum
        std::optional<Cut> cut;         // none: the whole streams, timestamps kept
    };

    // Opens the decoders, the filter graph and the encoder, and adds the output stream to `output`
    // (before its header is written).
    static std::unique_ptr<ExportAudioEncoder> create(const Options &options, AVFormatContext *output,
                                                      PacketWriter writer, Error *error);
    ~ExportAudioEncoder() override;

    bool handlesStream(int sourceStreamIndex) const override;
    // A packet of one of the input streams.
    StageResult sendPacket(const AVPacket *packet) override;
    // Drains decoders, filters and encoder at the end of the input.
    StageResult finish() override;
    // True once every input has delivered audio at or past the cut's end (always false without a cut).
    bool isPastEnd() const override;

private:
    ExportAudioEncoder();
    struct Private;
    std::unique_ptr<Private> d;
};

} // namespace zaf::media::exportpipe
