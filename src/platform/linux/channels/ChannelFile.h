// SPDX-License-Identifier: Apache-2.0
// The content of a channel's file:
//
//     simple         histogram ms       state
//     1234           3 37               Running 12 88000 0.880000
//                    0 10 5             Idle 11 12000 0.120000
//                    10 20 0
//
// A value; or the unit, minimum and maximum, and lower bound, upper bound and hits of every bucket; or name,
// transitions, residency and duty cycle of every state. One blank between two fields; only the name of a state and a
// unit may have blanks of their own. Every line has an end, the last too: a file without it is unfinished.
//
// A first line may name the file's owner (ChannelOwner.h); here it has been removed.
//
// Every user may publish, so the parser checks the whole file before it returns anything.
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
    UnknownKind, // its first line names none of the three kinds
    Malformed, // a line does not fit its place
    TooManyLines, // more buckets or states than a channel may have
    RepeatedState, // two states of the same name
    NotUtf8
};

// The text of the error, such as "a line is malformed". A constant.
[[nodiscard]] std::string_view description(ChannelFileError error) noexcept;

// A channel with the content of its file, without its names, which come from its path. Any thread.
[[nodiscard]] std::expected<ReportingChannel, ChannelFileError> parseChannelFile(std::string_view text);

} // namespace platform
