#pragma once

// Figures the benchmarks report over their samples.

#include <algorithm>
#include <cmath>
#include <vector>

namespace zaf::bench {

// The nearest-rank percentile `p` (0 ... 1) of `v`; NaN when there is no sample.
inline double percentile(std::vector<double> v, double p)
{
    if (v.empty())
        return NAN;
    std::sort(v.begin(), v.end());
    return v[std::min(v.size(), size_t(std::max(1.0, std::ceil(p * double(v.size()))))) - 1];
}

} // namespace zaf::bench
