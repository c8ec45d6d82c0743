#pragma once

// The one temporary directory of the system, and the names of the movies written into it.

#include <QString>

#include <cstdint>

// The directory every intermediate movie lives in: absolute, always ending in "/". It is this
// process's own directory inside the per-user root ($ZAF_TEMP_DIRECTORY when set, for tests, else
// $XDG_CACHE_HOME/Zafrel/, else ~/.cache/Zafrel/), claimed once on first use and held for the
// process's lifetime, so editors running side by side never empty each other's files (see
// tempstore/process_directory.h).
const QString &ZafScreenRecorderTempDirectory();

// The free space a recording needs, in bytes (decimal: one hundred million).
inline constexpr std::int64_t ZafScreenRecorderRequiredFreeSpace = 100000000;

// A movie name in the temporary directory: the stem, the current time in whole seconds since
// 1970 (truncated), then ".mp4". Stems hold the directory path, e.g. "<dir>/ZafReplay_Final".
QString ZafTempMovieFileName(const QString &stem);
// The same for a given time in seconds since 1970 (the fraction dropped toward zero).
QString ZafTempMovieFileNameAt(const QString &stem, double secondsSince1970);
