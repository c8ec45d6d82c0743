#pragma once

// The media engine's logging: the "zaf.media" category, and FFmpeg's own messages routed into
// "zaf.ffmpeg" (errors as warnings, warnings as informational entries; FFmpeg's chatter below that
// is dropped instead of going to the terminal).

#include <QLoggingCategory>

namespace zaf::media {

const QLoggingCategory &lcMedia();

// Installs the FFmpeg log routing once per process; thread-safe, cheap after the first call.
void ensureFFmpegLogging();

} // namespace zaf::media
