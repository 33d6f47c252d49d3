// SPDX-License-Identifier: Apache-2.0
// The one error in answers to clients, and the callbacks that carry answers.
#pragma once

#include "platform/Turn.h"

#include <cstdint>
#include <functional>
#include <optional>
#include <string_view>

namespace utility {

// A domain and a code.
struct ReplyError {
    std::string_view domain; // a constant of the program
    std::int64_t code = 0;
    friend bool operator==(const ReplyError&, const ReplyError&) = default;
};

// Reporting is disabled on this device.
constexpr ReplyError reportingDisabled{"com.quarn.audio.reporting", 1};

// Callbacks that answer a client: with the turn that the answer leaves with, the error, if any, and the operation's
// result. May be copied, and called more than once.
using Reply = std::function<void(platform::Turn& turn, const std::optional<ReplyError>& error)>;
template <typename Result>
using ResultReply = std::function<void(platform::Turn& turn, const std::optional<ReplyError>& error, Result result)>;

} // namespace utility
