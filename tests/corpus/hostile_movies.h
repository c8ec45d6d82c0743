#pragma once

// A corpus of hostile and unusual movies, generated at test time: garbage that only looks like a
// movie, damaged movies, extreme shapes, other codecs, and odd timing and track layouts. Each kind
// says how it is made and what the engine has to make of it.
//
// Files are made once and kept in the fixture cache (see sharedGeneratedFile), under names that
// carry the digest of this generator's source, so every test process of one build, and the
// sanitizer build of the same tree, makes each file once.

#include <QSize>
#include <QString>
#include <QStringList>

#include <functional>
#include <vector>

namespace zaf::test {
class LogCapture;
}

namespace zaf::test::corpus {

// What a kind is, and so what every command must make of it.
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

    // The upright (displayed) picture size.
    QSize displaySize() const { return rotation % 180 ? videoSize.transposed() : videoSize; }
    bool hasVideo() const { return !videoSize.isEmpty(); }
};

const std::vector<HostileMovie> &hostileMovies();
const HostileMovie &hostileMovie(const QString &name);
// The names of every kind, in table order (for test parameters).
std::vector<std::string> hostileMovieNames();

// The kind's file, made on first use ("" with a test failure when it cannot be made).
QString hostileMoviePath(const HostileMovie &movie);
// Why the kind cannot be made with the installed ffmpeg (its encoder is missing), or "".
QString unavailableReason(const HostileMovie &movie);

// Whether one of our own categories ("zaf.") logged a warning or worse: how a failure is reported.
bool loggedWarning(const LogCapture &log);

} // namespace zaf::test::corpus
