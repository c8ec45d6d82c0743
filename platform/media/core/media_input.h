#pragma once

// Opening a movie file for reading, the one way every stage does it (probe, playback, thumbnails,
// export). Private to platform/media.

#include "platform/media/core/cancel_token.h"
#include "platform/media/core/ffmpeg_ptr.h"

#include <QString>

namespace zaf::media {

// Opens the local file `path` (never another protocol, whatever the name looks like) and reads its
// stream information. `cancel` is polled during every blocking read of the returned context, so it must
// outlive it. Returns null with `error` set to a message naming the file on failure; a cancelled
// open fails too.
ff::InputFormatContextPtr openInput(const QString &path, const CancelToken &cancel, QString *error);

// The container's start time in seconds (0 when unknown): media time 0 of the player.
double containerStartSeconds(const AVFormatContext *format);

} // namespace zaf::media
