// SPDX-License-Identifier: Apache-2.0
// The figures of a report as numbers with names, so that a report can be held against an independent truth: "all
// seconds", "day 2026-10-25 faults", "device speaker sessions". What is nothing has no entry.
#pragma once

#include "kesto/report/Report.h"
#include "support/weeks/MadeUpWeeks.h"

#include <chrono>
#include <map>
#include <string>
#include <vector>

namespace kesto_tool {

using Figures = std::map<std::string, double>;

// Days in a time zone: when each begins, and when the last ends, as the zone's tables have it.
struct ZoneDays {
    const char* zone;
    std::chrono::year_month_day first;
    std::vector<double> midnights;
};

// Each has a change of clocks, but for the last: India never changes its clocks, which are half an hour off.
[[nodiscard]] const std::vector<ZoneDays>& zonesWithDays();

// What the truth says, counted in another way than a report does: every figure alone, over all that was made up.
// Nothing runs: the service that kept the weeks has ended with them.
[[nodiscard]] Figures figuresOf(const weeks::Weeks& weeks, const ZoneDays& days, const TimeSpan& span,
                                bool isRecording);
[[nodiscard]] Figures figuresOf(const Report& report);

// What differs by more than rounding, a line each.
[[nodiscard]] std::string differences(const Figures& expected, const Figures& found);

} // namespace kesto_tool
