// SPDX-License-Identifier: Apache-2.0
// Sessions for a person at a terminal, and for programs.
#pragma once

#include "kesto/sessions/SessionLine.h"

#include <cstddef>
#include <string>
#include <vector>

// A table that is cut to so many columns.
[[nodiscard]] std::string sessionsText(const std::vector<SessionLine>& lines, std::size_t width);
// docs/sessions.md describes the columns and the keys; an object a line.
[[nodiscard]] std::string sessionsCsv(const std::vector<SessionLine>& lines);
[[nodiscard]] std::string sessionsJson(const std::vector<SessionLine>& lines);

// One session: its numbers, its stretches and its faults.
[[nodiscard]] std::string sessionCsv(const History& history);
[[nodiscard]] std::string sessionJson(const SessionLine& line, const History& history);

// 128.6 as "0:02:08".
[[nodiscard]] std::string clockText(double seconds);
// "50 %", "muted", or "-" if no volume was told.
[[nodiscard]] std::string volumeText(const Played& played);
