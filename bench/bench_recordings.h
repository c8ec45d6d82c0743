#pragma once

// What the benchmarks share: running the ffmpeg command-line tool, and making the recordings they
// measure on (the fixture generator's numbered frames, then grain and an x264 re-encode with
// B-frames, as a busy screen recording comes out of a recorder).

#include "tools/fixture/fixture_movie.h"

#include <QString>
#include <QStringList>

namespace zaf::bench {

// Runs `ffmpeg -v error -y ARGS`; false (with its error output printed) when it fails.
bool runFfmpeg(const QStringList &args);

// Writes the fixture movie `spec` to `plain` unless it exists. Exits the benchmark on failure.
void makeFixtureMovie(const QString &plain, const zaf::fixture::FixtureSpec &spec);

// Re-encodes `plain` into `recording`: grain over the pictures, x264 veryfast at crf 20 with 3
// B-frames and groups of `groupFrames` pictures, audio copied. With `fixedGroups` every group has
// exactly that length (no keyframes at scene cuts). Written through a partial file, so a killed run
// never leaves a half recording to be reused. Exits the benchmark on failure.
void encodeRecording(const QString &plain, const QString &recording, int groupFrames, bool fixedGroups);

} // namespace zaf::bench
