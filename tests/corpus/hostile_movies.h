#pragma once

// Hostile and unusual movies, generated at test time into the fixture cache (see sharedGeneratedFile)
// under the digest of this generator: garbage, damaged movies, extreme shapes, other codecs, odd
// timing and track layouts, each with what the engine has to make of it.

#include "tests/support/named_cases.h"

#include <QSize>
#include <QString>

#include <functional>
#include <vector>

namespace zaf::test {
class LogCapture;
}

namespace zaf::test::corpus {

enum class Nature {
    Garbage,   // not a movie at all: every command fails with an error, nothing is written
    Damaged,   // a readable header over damaged data: any clean outcome, a success must be a movie
    Valid,     // a movie to handle correctly
    TooLarge,  // a valid movie whose pictures exceed what the decoders may allocate: no decoded picture
};

struct HostileMovie {
    const char *name;
    Nature nature;
    // Writes the movie to the path it is given; false (with a test failure) when it cannot.
    std::function<bool(const QString &path)> make;
    // What a valid movie holds (a damaged one held before the damage): the stored picture size
    // (empty: no video), its clockwise display rotation and the number of audio tracks.
    QSize videoSize = {};
    int rotation = 0;
    int audioTracks = 0;
    // The ffmpeg encoder the kind is made with, when it may be missing from an ffmpeg build.
    const char *encoder = nullptr;

    QSize displaySize() const { return rotation % 180 ? videoSize.transposed() : videoSize; }
    bool hasVideo() const { return !videoSize.isEmpty(); }
};

ZAF_PRINT_CASES_AS_NAMES

const std::vector<HostileMovie> &hostileMovies();
// The kind's file, made on first use ("" with a test failure when it cannot be made).
QString hostileMoviePath(const HostileMovie &movie);
// Why the kind cannot be made with the installed ffmpeg (its encoder is missing), or "".
QString unavailableReason(const HostileMovie &movie);
// Whether one of our own categories ("zaf.") logged a warning or worse: how a failure is reported.
bool loggedWarning(const LogCapture &log);

} // namespace zaf::test::corpus
