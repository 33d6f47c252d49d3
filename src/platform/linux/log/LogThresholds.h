// Which log statements are let through: one level for all, and others for single tags.
//
// Written as a list such as "info" or "default,kerr=debug,kers=error"; where two items speak of the same tag
// the later one counts.
#pragma once

#include "platform/Log.h"

#include <expected>
#include <map>
#include <string>
#include <string_view>

namespace platform {

// Plain data. Any thread.
class LogThresholds {
public:
    // Reads such a list; the empty one is the default. The error says what was wrong and what may stand there.
    [[nodiscard]] static std::expected<LogThresholds, std::string> parse(std::string_view text);

    [[nodiscard]] LogLevel threshold(std::string_view tag) const;

private:
    LogLevel general_ = LogLevel::Default;
    std::map<std::string, LogLevel, std::less<>> byTag_;
};

} // namespace platform
