#pragma once

// A second, independent demuxer and decoder for the movies the export writes: GStreamer's qtdemux
// and its libav H.264 decoder, run as the gst-launch-1.0 tool. A file that FFmpeg decodes but
// another player cannot is still a broken file for the user.

#include <QString>

namespace zaf::test {

// Whether the GStreamer tool is installed (tests that need it skip otherwise).
bool secondDecoderAvailable();

// Demuxes and decodes the first video track of the file to its end; the number of pictures
// decoded, or -1 (with a test failure carrying GStreamer's message) when anything failed.
int decodeVideoFramesWithSecondDecoder(const QString &path);

} // namespace zaf::test
