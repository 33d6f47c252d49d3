// SPDX-License-Identifier: Apache-2.0
// The room of sessions: who played when, for how long and how it ended, a line a session, or one session as a timeline.
#pragma once

#include "kesto/history/History.h"
#include "kesto/report/Report.h"

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

enum class SessionEnd : std::uint8_t { Unknown, Running, Stopped, Vanished, ServiceEnded };

// "running", "stopped", "vanished" or "service ended"; empty: not known.
[[nodiscard]] std::string_view name(SessionEnd end);
// Of one stretch; a change that the next one goes on from looks like a stop.
[[nodiscard]] SessionEnd endOf(const PlayedStretch& stretch);

struct SessionLine {
    HistorySession session;
    Played played;
    std::string devices; // all it played on, "speaker; headset", the longest first
    SessionEnd end = SessionEnd::Unknown;
};

// All sessions of the history, by number.
[[nodiscard]] std::vector<SessionLine> makeSessionLines(const History& history);

// As `Played` sums up.
void addTo(Played& played, const PlayedStretch& stretch);

enum class SessionOrder : std::uint8_t { Began, Played, Faults };

struct SessionChoice {
    bool withFaults = false; // only these
    bool isRunning = false; // only these
    SessionOrder order = SessionOrder::Began;
    std::size_t most = static_cast<std::size_t>(-1);
};

// Those that are chosen: the most recent, the longest or those with the most faults first.
[[nodiscard]] std::vector<SessionLine> chosen(std::vector<SessionLine> lines, const SessionChoice& choice);
