#pragma once

// The media engine's logging: "zaf.media" for the roles, a sub-category for each pipeline
// ("zaf.media.playback", "zaf.media.export"), so a message says by its category which stage wrote
// it, and FFmpeg's own messages routed into "zaf.ffmpeg" (errors as warnings, warnings as
// informational entries; FFmpeg's chatter below that is dropped instead of going to the terminal).

#include <QLoggingCategory>

namespace zaf::media {

const QLoggingCategory &lcMedia();
const QLoggingCategory &lcPlayback();
const QLoggingCategory &lcExport();

// Installs the FFmpeg log routing once per process; thread-safe, cheap after the first call.
void ensureFFmpegLogging();

} // namespace zaf::media
