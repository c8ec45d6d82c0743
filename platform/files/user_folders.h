#pragma once

// The user's folders this system saves into or reads from, as the desktop names them.
//
// Threads: any; pure look-ups of the environment and the user's folder settings.

#include <QString>

namespace zaf::files {

// The user's Videos folder: as user-dirs.dirs names it (QStandardPaths::MoviesLocation), else
// ~/Videos.
QString videosFolder();

// The video library the editor saves into: $ZAF_VIDEO_LIBRARY when set (tests), else the Videos
// folder.
QString videoLibraryFolder();

} // namespace zaf::files
