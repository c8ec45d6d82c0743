#pragma once

// The audio stage of a cut that keeps AAC as it is (private to platform/media): the source
// stream's packets from the one before the cut's start (the decoder's pre-roll: an AAC frame
// overlaps the one before it) to the one holding the last sample before the cut's end are copied
// unchanged. Their timestamps are moved so the cut's start is 0: the first packets get negative
// timestamps, which the MPEG-4 muxer turns into an edit list that skips the samples before the
// start, the same way AAC files carry their encoder priming. The last packet is shortened to end at
// the cut's end, so the edit list ends there too.
//
// Streams whose packets cannot be cut this way (whyNotCopyable) go to ExportAudioEncoder instead.
// Every call runs on the export's worker thread.

#include "platform/media/export/export_audio_stage.h"

#include <QString>

#include <memory>
#include <optional>

namespace zaf::media::exportpipe {

class ExportAudioCopier final : public ExportAudioStage {
public:
    struct Options {
        const AVStream *input = nullptr; // a source AAC stream
        std::int64_t startMicros = 0;    // first instant kept, in microseconds of the source
        std::int64_t endMicros = 0;      // first instant dropped
    };

    // Why the stream's packets cannot be cut by copying them (it is then re-encoded), or nothing:
    // AAC with 1024-sample frames, timestamps counting samples, and a sample index whose frames
    // follow each other without gaps over the range.
    static std::optional<QString> whyNotCopyable(const Options &options);

    // Adds the output stream to `output` (before its header is written), with the source's codec
    // parameters, side data and metadata. Expects a stream whyNotCopyable() accepted.
    static std::unique_ptr<ExportAudioCopier> create(const Options &options, AVFormatContext *output,
                                                     PacketWriter writer, Error *error);
    ~ExportAudioCopier() override;

    bool handlesStream(int sourceStreamIndex) const override;
    StageResult sendPacket(const AVPacket *packet) override;
    StageResult finish() override;
    bool isPastEnd() const override;

private:
    ExportAudioCopier();
    struct Private;
    std::unique_ptr<Private> d;
};

} // namespace zaf::media::exportpipe
