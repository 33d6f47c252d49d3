// SPDX-License-Identifier: Apache-2.0
// How much came in the last minute, counted by seconds, so that reading it needs no timer.
#pragma once

#include <array>
#include <chrono>
#include <cstdint>

namespace ledger {

// One thread at a time.
class LastMinute {
public:
    using Clock = std::chrono::steady_clock;

    void add(std::uint64_t count, Clock::time_point now) noexcept
    {
        const std::int64_t second = secondOf(now);
        Second& place = seconds_[static_cast<std::size_t>(second % length)];
        if (place.second != second)
            place = {second, 0};
        place.count += count;
    }

    // Without what is a minute old.
    [[nodiscard]] std::uint64_t sum(Clock::time_point now) const noexcept
    {
        std::uint64_t sum = 0;
        for (const auto& [second, count] : seconds_)
            if (second > secondOf(now) - length)
                sum += count;
        return sum;
    }

private:
    static constexpr std::int64_t length = 60;
    struct Second {
        std::int64_t second = -length; // of the clock
        std::uint64_t count = 0;
    };

    static std::int64_t secondOf(Clock::time_point moment) noexcept
    {
        return std::chrono::floor<std::chrono::seconds>(moment.time_since_epoch()).count();
    }

    std::array<Second, length> seconds_;
};

} // namespace ledger
