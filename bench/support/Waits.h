// SPDX-License-Identifier: Apache-2.0
// What clients waited, one figure of each kind for each round.
#pragma once

#include "support/Harness.h"

#include <algorithm>
#include <vector>

namespace bench {

struct Waits {
    std::vector<double> median;
    std::vector<double> percentile99;
    std::vector<double> longest;

    // All waits of a round, at least one.
    void add(const std::vector<double>& times)
    {
        constexpr double almostAll = 0.99;
        median.push_back(bench::median(times));
        percentile99.push_back(quantile(times, almostAll));
        longest.push_back(std::ranges::max(times));
    }
};

} // namespace bench
