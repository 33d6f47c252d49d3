// What is kept for somebody who may look into it one day must end somewhere: beyond a number or a size the oldest goes.
#pragma once

#include <cstddef>
#include <cstdint>
#include <numeric>
#include <span>

namespace platform {

// Of things in the order of their age, the oldest first: how many must go so that the others are within the limits.
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
