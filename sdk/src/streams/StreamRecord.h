// SPDX-License-Identifier: Apache-2.0
// A call of a playback or a recording as it stands in the client's queue.
#pragma once

#include "Moment.h"

#include <cstdint>
#include <string_view>

namespace libkesto {

class Stream;

enum class StreamAction : std::uint8_t { Start, Stop, Pause, Resume, Volume, Mute, Route, Format, Fault };

// Plain data. Its texts follow it: the device, and then the encoding.
struct StreamRecord {
    Stream* stream = nullptr; // null, of a stop: all started streams of the client
    StreamAction action = StreamAction::Stop;
    bool isMuted = false;
    bool hasDevice = false; // a start may come without one, and without a format
    bool hasFormat = false;
    std::uint16_t deviceBytes = 0;
    std::uint32_t rate = 0;
    std::uint32_t channels = 0;
    double number = 0; // the volume, or the seconds of a fault
    std::uint64_t cycles = 0; // of a fault
    Moment when{};
};

// The record as bytes.
[[nodiscard]] inline std::string_view bytesOf(const StreamRecord& record) noexcept
{
    return {reinterpret_cast<const char*>(&record), sizeof record};
}

} // namespace libkesto
