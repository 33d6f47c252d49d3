// What stands in the file of one channel:
//
//     simple         histogram ms       state
//     1234           3 37               Running 12 88000 0.880000
//                    0 10 5             Idle 11 12000 0.120000
//                    10 20 0
//
// A value; or the unit, minimum and maximum, and lower bound, upper bound and hits of every bucket; or name,
// transitions, residency and duty cycle of every state. One blank between two fields; only the name of a state and a
// unit may have blanks of their own. The last line ends like every other: a file that does not is not finished.
//
// A line that names the file's owner may stand before all that (ChannelOwner.h); it has been taken off here.
//
// Whoever may publish writes it, so nothing in it is believed before it is read in full.
#pragma once

#include "platform/ReportingChannels.h"

#include <cstddef>
#include <expected>
#include <string_view>

namespace platform {

inline constexpr std::size_t largestChannelFile = std::size_t{32} * 1024;
inline constexpr std::size_t mostChannelBuckets = 512;
inline constexpr std::size_t mostChannelStates = 128;

enum class ChannelFileError : std::uint8_t {
    Unfinished, // it is empty, or its last line has no end
    UnknownKind, // its first line is none of the three
    Malformed, // a line is not what its place asks for
    TooManyLines, // more buckets or states than a channel may have
    RepeatedState, // two states of the same name
    NotUtf8
};

// In words, such as "a line is malformed". A constant.
[[nodiscard]] std::string_view description(ChannelFileError error) noexcept;

// A channel with what its file says; where it stands, and so what it is called, is not in it. Any thread.
[[nodiscard]] std::expected<ReportingChannel, ChannelFileError> parseChannelFile(std::string_view text);

} // namespace platform
