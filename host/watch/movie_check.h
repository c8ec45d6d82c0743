#pragma once

// What `zaf-host --watch` asks of a file in the watched folder before it offers it to the editor:
// that its name is not one given to a file still being written, and that the file is a complete
// MPEG-4 or QuickTime movie.
//
// The movie rule (checkMovieFile), on the file's top-level boxes only (no media is decoded):
//   - the path names a regular file, opened without following a symbolic link and without waiting
//     (a FIFO named like a movie is refused, never blocks);
//   - a box header is a 32-bit big-endian size and a four-character type; size 1 means a 64-bit
//     size follows, size 0 means the box runs to the end of the file;
//   - the first box is `ftyp` and holds at least a major brand and a minor version (16 bytes):
//     otherwise the file is not an MPEG-4 movie;
//   - every box is at least as long as its header and ends within the file, and the boxes follow
//     one another up to the exact end of the file: a box that runs past the end is a file cut
//     short or still being written;
//   - one of them is `moov`, which the muxer writes when the recording ends (or, in a fragmented
//     movie, at its start): without it the movie cannot be played;
//   - at most kMaxTopLevelBoxes boxes are walked; a file of more is refused.
//
// Threads: plain values and free functions, callable from any thread. checkMovieFile does blocking
// file I/O (a few small reads), so it belongs on a worker thread.

#include <QString>
#include <QtGlobal>

#include <sys/types.h>

#include <cstddef>

namespace zaf::host::watch {

// One version of one file: the same inode, with the same size and modification time. A file renamed
// keeps it; a file rewritten gets a new one.
struct FileIdentity {
    dev_t device = 0;
    ino_t inode = 0;
    qint64 size = 0;
    qint64 modifiedNs = 0; // nanoseconds since the epoch

    friend bool operator==(const FileIdentity &, const FileIdentity &) = default;
};

size_t qHash(const FileIdentity &identity, size_t seed = 0) noexcept;

// True for a name a file gets while it is still being written or is not meant to be seen: a hidden
// name (leading '.') and the suffixes ".part", ".partial", ".tmp", ".temp", ".crdownload",
// ".download" (any case) and "~". Only the name is looked at.
bool isPartialName(const QString &fileName);

enum class MovieVerdict {
    Movie,      // a complete MPEG-4 or QuickTime movie
    NotAFile,   // missing, a directory, a link, a FIFO, ...
    Unreadable, // cannot be opened or read
    NotMpeg4,   // does not start with an `ftyp` box
    Incomplete, // empty, cut short, still being written, or without a `moov` box
};

struct MovieCheck {
    MovieVerdict verdict = MovieVerdict::NotAFile;
    QString reason;        // why it is not a movie, for the log; empty for a movie
    FileIdentity identity; // filled whenever the file could be opened
};

inline constexpr int kMaxTopLevelBoxes = 1000000;

MovieCheck checkMovieFile(const QString &path);

} // namespace zaf::host::watch
