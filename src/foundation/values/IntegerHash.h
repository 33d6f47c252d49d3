// SPDX-License-Identifier: Apache-2.0
// A hash of integers that clients choose, such as IDs. The standard hash is the number itself, so a client could choose
// numbers that fall into one bucket, and every look-up would be as slow as in a list. This hash mixes them with a
// number that the process draws at its start, which no client can know.
#pragma once

#include <cstddef>
#include <cstdint>
#include <random>

namespace foundation {

// Any thread.
struct IntegerHash {
    [[nodiscard]] std::size_t operator()(std::int64_t number) const noexcept
    {
        return mix(static_cast<std::uint64_t>(number) ^ seed);
    }

private:
    static std::uint64_t draw()
    {
        std::random_device random;
        return std::uint64_t{random()} << 32 | random();
    }
    static inline const std::uint64_t seed = draw();

    // Every bit of the result depends on all bits of the number (the finisher of SplitMix64).
    static constexpr std::uint64_t mix(std::uint64_t number) noexcept
    {
        number = (number ^ number >> 30) * 0xBF58476D1CE4E5B9;
        number = (number ^ number >> 27) * 0x94D049BB133111EB;
        return number ^ number >> 31;
    }
};

} // namespace foundation
