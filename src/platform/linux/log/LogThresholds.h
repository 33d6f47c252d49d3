// SPDX-License-Identifier: Apache-2.0
// Which log statements are enabled: one level for all tags, and other levels for single tags.
//
// Written as a list such as "info" or "default,kerr=debug,kers=error"; of two items for one tag the later counts.
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
    // Reads such a list; an empty list gives the default. The error quotes the wrong item and names the allowed forms.
    [[nodiscard]] static std::expected<LogThresholds, std::string> parse(std::string_view text);

    [[nodiscard]] LogLevel threshold(std::string_view tag) const;

private:
    LogLevel general_ = LogLevel::Default;
    std::map<std::string, LogLevel, std::less<>> byTag_;
};

} // namespace platform
