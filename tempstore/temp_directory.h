#pragma once

// The one temporary directory of the system, and the names of the movies written into it.

#include <QString>

#include <cstdint>

// The directory every intermediate movie lives in: absolute, always ending in "/".
// Resolved once per process: $ZAF_TEMP_DIRECTORY when set (tests), else $XDG_CACHE_HOME/Zafrel/,
// else ~/.cache/Zafrel/. A per-user cache directory, so two users never share it.
const QString &ZafScreenRecorderTempDirectory();

// The free space a recording needs, in bytes (decimal: one hundred million).
inline constexpr std::int64_t ZafScreenRecorderRequiredFreeSpace = 100000000;

// A movie name in the temporary directory: the stem, the current time in whole seconds since
// 1970 (truncated), then ".mp4". Stems hold the directory path, e.g. "<dir>/ZafReplay_Final".
QString ZafTempMovieFileName(const QString &stem);
// The same for a given time in seconds since 1970 (the fraction dropped toward zero).
QString ZafTempMovieFileNameAt(const QString &stem, double secondsSince1970);
