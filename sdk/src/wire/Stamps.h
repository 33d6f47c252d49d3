// SPDX-License-Identifier: Apache-2.0
// The time stamps that the library adds to a message, as encoded entries.
//
// They are written into memory of the object itself: a real-time thread makes them at each send.
#pragma once

#include "Moment.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <string_view>

namespace libkesto {

constexpr std::string_view timestampKey = "kestoreporting_timestamp"; // a double: seconds since 1970
constexpr std::string_view uptimeKey = "systemuptime_sec"; // an integer: seconds since the device started

// The uptime as messages carry it.
[[nodiscard]] std::int64_t wholeSeconds(double uptime) noexcept;

class Stamps {
public:
    // No entries.
    Stamps() noexcept = default;
    // The entries of that moment that are asked for.
    Stamps(Moment moment, bool withTimestamp, bool withUptime) noexcept;

    [[nodiscard]] std::string_view entries() const noexcept { return {bytes_.data(), size_}; }
    [[nodiscard]] std::uint32_t entryCount() const noexcept { return count_; }

    static constexpr std::size_t longest = 70;

private:
    void put(char byte) noexcept { bytes_[size_++] = byte; }
    void putBigEndian(std::uint64_t value, unsigned bytes) noexcept;
    void putHead(unsigned majorType, std::uint64_t value) noexcept;
    void putKey(std::string_view key) noexcept;

    std::array<char, longest> bytes_{};
    std::size_t size_ = 0;
    std::uint32_t count_ = 0;
};

} // namespace libkesto
