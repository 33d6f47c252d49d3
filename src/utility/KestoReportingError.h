// The one error in answers to clients, and the callbacks that carry answers.
#pragma once

#include "platform/Turn.h"

#include <cstdint>
#include <functional>
#include <optional>
#include <string_view>

// A domain and a code.
struct KestoReportingError {
    std::string_view domain; // a constant of the program
    std::int64_t code = 0;
    friend bool operator==(const KestoReportingError&, const KestoReportingError&) = default;
};

// Reporting is disabled on this device.
constexpr KestoReportingError KestoReportingErrorDisabled{"com.quarn.audio.reporting", 1};

// Callbacks that answer a client: with the turn that the answer leaves with, the error, if any, and the operation's
// result. May be copied, and called more than once.
using KestoReportingReply = std::function<void(platform::Turn& turn, const std::optional<KestoReportingError>& error)>;
template <typename Result>
using KestoReportingResultReply =
    std::function<void(platform::Turn& turn, const std::optional<KestoReportingError>& error, Result result)>;
