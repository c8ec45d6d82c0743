#pragma once

// What the export pipeline asks of an audio stage (private to platform/media), whether it
// re-encodes (ExportAudioEncoder) or copies packets (ExportAudioCopier). Every call runs on the
// export's worker thread.

#include "platform/media/export/export_common.h"

namespace zaf::media::exportpipe {

class ExportAudioStage {
public:
    virtual ~ExportAudioStage() = default;

    virtual bool handlesStream(int sourceStreamIndex) const = 0;
    // A packet of one of the stage's source streams.
    virtual StageResult sendPacket(const AVPacket *packet) = 0;
    // Writes what is still held at the end of the input.
    virtual StageResult finish() = 0;
    // True once every source stream has reached the cut's end (always false without a cut).
    virtual bool isPastEnd() const = 0;
};

} // namespace zaf::media::exportpipe
