// SPDX-License-Identifier: Apache-2.0
// One session over its time: when it played, how loud, and where it went wrong.
#pragma once

#include "kesto/sessions/SessionLine.h"

#include <cstddef>
#include <string>

struct TimelineStyle {
    std::size_t width = std::string::npos; // npos: 80 columns
    bool isUTF8 = true; // else ASCII
};

// The history is that of the session alone.
[[nodiscard]] std::string sessionTimeline(const SessionLine& line, const History& history, const TimelineStyle& style);
