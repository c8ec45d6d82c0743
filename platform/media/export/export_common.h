#pragma once

// Internal pieces shared by the export pipeline stages (private to platform/media): the failure
// type a stage reports, and the packet hand-off between a
// stage and the muxer. Every stage runs on the export's worker thread.

#include "platform/error.h"
#include "platform/media/core/cancel_token.h"
#include "platform/media/core/ffmpeg_ptr.h"
#include "platform/media/core/media_log.h"
#include "platform/media/media_asset.h"

#include <QLoggingCategory>

#include <functional>

namespace zaf::media::exportpipe {

// The outcome of a stage's step: no error, or the media error that ends the export.
using StageResult = OptionalError;

inline Error stageError(int code, const QString &what, int averror = 0)
{
    QString message = what;
    if (averror != 0)
        message += QStringLiteral(": ") + ff::errorString(averror);
    return makeMediaError(code, message);
}

// The error for a failed write: a full disk has its own code.
inline Error writeError(const QString &what, int averror)
{
    return stageError(averror == AVERROR(ENOSPC) ? kMediaErrorDiskFull : kMediaErrorWriteFailed, what, averror);
}

// Hands an encoded packet (timestamps in `timeBase`) to the muxer for output stream `outputIndex`.
// Returns an AVERROR code or 0. Called on the export's worker thread.
using PacketWriter = std::function<int(AVPacket *packet, AVRational timeBase, int outputIndex)>;

} // namespace zaf::media::exportpipe
