#pragma once

// Opening a movie for one stage of the playback pipeline. Private to platform/media.

#include "platform/media/ffmpeg_ptr.h"

#include <QString>

#include <atomic>

namespace zaf::media::playback {

// Opens `path` and reads its stream information. `cancel` is wired into the context's interrupt
// callback, so setting it makes any blocking read of this context return at once; it must outlive
// the context. Returns null with `error` filled on failure.
ff::InputFormatContextPtr openInput(const QString &path, const std::atomic<bool> *cancel, QString *error);

// A decoder for `stream`, opened, with the pixel limit set. Null with `error` filled on failure.
ff::CodecContextPtr openDecoder(const AVStream *stream, QString *error);

// The container's start time in seconds (0 when unknown): media time 0 of the player.
double containerStartSeconds(const AVFormatContext *format);

} // namespace zaf::media::playback
