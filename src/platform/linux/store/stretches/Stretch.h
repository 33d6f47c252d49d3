// SPDX-License-Identifier: Apache-2.0
// The room of stretches: who played what for how long, made of the messages on their way into the store. It knows no
// database.
//
// A stretch is a time in which a session played or recorded in one way: through the same devices, in the same format,
// at the same volume.
#pragma once

#include "platform/Origin.h"

#include <array>
#include <cmath>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace platform {

enum class StretchEnding : std::uint8_t {
    Change, // the session went on in another way
    Stopped, // a message said so, or the client stopped or destroyed the session
    Vanished, // the client's connection ended
    ServiceEnded // the service ended, or was killed, or stopped keeping stretches
};

[[nodiscard]] constexpr std::string_view name(StretchEnding ending) noexcept
{
    constexpr std::array<std::string_view, 4> names = {"change", "stopped", "vanished", "service-ended"};
    return names[static_cast<std::size_t>(ending)];
}

// What a session's messages said last. None: nothing yet.
struct PlayingState {
    std::optional<std::string> devices;
    std::optional<std::string> format;
    std::optional<std::int64_t> channels;
    std::optional<double> volume;

    friend bool operator==(const PlayingState&, const PlayingState&) = default;
};

// In seconds since 1970 UTC.
struct StretchMoment {
    double arrived = 0; // by the service's clock
    std::optional<double> happened; // by the message

    [[nodiscard]] double time() const noexcept { return happened.value_or(arrived); }
};

struct OpenStretch {
    Origin origin; // of the message that began it, whose sender pays for it
    StretchMoment began;
};

// One that is over.
struct Stretch {
    Origin origin;
    bool isRecording = false;
    double began = 0; // seconds since 1970 UTC
    double seconds = 0;
    PlayingState state;
    StretchEnding ending = StretchEnding::Stopped;

    friend bool operator==(const Stretch&, const Stretch&) = default;
};

// Whose a session is. One with the same owner as an earlier one is its continuation: its client's connection broke, and
// the client made the session anew.
struct SessionOwner {
    std::uint32_t user = 0;
    std::int32_t process = 0;
    std::int64_t reporterID = 0;

    friend bool operator==(const SessionOwner&, const SessionOwner&) = default;
};

// A time that runs backwards is 0, and so is one that no number can hold.
[[nodiscard]] inline double lengthOfTime(double from, double until) noexcept
{
    const double seconds = until - from;
    return seconds > 0 && std::isfinite(seconds) ? seconds : 0;
}

} // namespace platform
