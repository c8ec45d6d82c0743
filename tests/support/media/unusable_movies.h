#pragma once

// Files that are no usable movie, which every stage that opens a movie must refuse with an error:
// nothing at the path, an empty file, text, a directory, and either part of a movie cut in two (the
// first half loses the header at its end, the last two thirds their file type box).

#include "tests/support/named_cases.h"
#include "tests/support/temp_dir.h"

#include <functional>
#include <vector>

namespace zaf::test {

struct UnusableMovie {
    const char *name;
    std::function<QString(const ScratchDir &)> make; // makes the file in the directory; its path
};

const std::vector<UnusableMovie> &unusableMovies();

inline void PrintTo(const UnusableMovie &movie, std::ostream *os)
{
    *os << movie.name;
}

} // namespace zaf::test
