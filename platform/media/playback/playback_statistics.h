#pragma once

// What the video decoder has done so far, for diagnostics, benchmarks and tests.

#include <cstdint>

namespace zaf::media::playback {

struct VideoDecoderStatistics {
    std::uint64_t picturesDecoded = 0;
    std::int64_t windowBytes = 0;     // held by the decoded-frame window now
    std::int64_t windowPeakBytes = 0; // the most it held once trimmed to its budget
    std::int64_t windowBudgetBytes = 0;
    std::int64_t windowPictures = 0;
};

} // namespace zaf::media::playback
