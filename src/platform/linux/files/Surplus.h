// SPDX-License-Identifier: Apache-2.0
// Bounds for kept files: beyond a number or a size the oldest are removed.
#pragma once

#include <cstddef>
#include <cstdint>
#include <numeric>
#include <span>

namespace platform {

// How many of the items must be removed so that the others are within the limits. The items are sorted, the oldest
// first.
[[nodiscard]] inline std::size_t surplus(std::span<const std::uint64_t> bytesOfEach, std::size_t most,
                                         std::uint64_t mostBytes)
{
    std::uint64_t bytes = std::accumulate(bytesOfEach.begin(), bytesOfEach.end(), std::uint64_t{0});
    std::size_t gone = 0;
    while (gone < bytesOfEach.size() && (bytesOfEach.size() - gone > most || bytes > mostBytes))
        bytes -= bytesOfEach[gone++];
    return gone;
}

} // namespace platform
