// SPDX-License-Identifier: Apache-2.0
// What a message says about playing and recording. It is read beside the time stamp, where the payload becomes JSON.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string_view>

namespace platform {

// The key under which a message says when it happened, in seconds since 1970 UTC.
inline constexpr std::string_view timestampKey = "kestoreporting_timestamp";

// Nothing: the message has no such key, or a value of another type there. Any value but a true one, such as null, says
// that output or input does not run.
struct PlayingFacts {
    // In bytes; longer texts are cut.
    static constexpr std::size_t longestDevices = 256;
    static constexpr std::size_t longestFormat = 64;

    std::optional<bool> isOutputRunning; // "session_output_running"
    std::optional<bool> isInputRunning; // "session_input_running"
    bool hasDuration = false; // "session_duration", which comes with the end
    std::optional<std::string_view> devices; // "active_devices"
    std::optional<std::string_view> format; // "session_selected_format"
    std::optional<std::int64_t> channels; // "mChannelsPerFrame"
    std::optional<double> volume; // "PomoSessionVolume"

    friend bool operator==(const PlayingFacts&, const PlayingFacts&) = default;
};

} // namespace platform
