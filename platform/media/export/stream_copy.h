#pragma once

// Adds an output stream that carries a source stream's packets unchanged (private to
// platform/media): codec parameters, time base, frame rates, aspect ratio, disposition, metadata
// and stream side data are taken from the source. Used by every export stage that copies packets;
// runs on the export's worker thread, before the output's header is written.

#include "platform/media/export/export_common.h"

namespace zaf::media::exportpipe {

// The new output stream, or nullptr with `*error` set.
AVStream *addStreamCopy(AVFormatContext *output, const AVStream *in, Error *error);

} // namespace zaf::media::exportpipe
