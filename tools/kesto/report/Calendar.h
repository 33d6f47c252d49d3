// SPDX-License-Identifier: Apache-2.0
// The days of the reader, by the clock on the wall: a day begins when the clock shows its beginning for the first time,
// or later where that moment is left out. So a day may have 23 or 25 hours, or 23.5, and one that a country skips has
// none.
#pragma once

#include "kesto/report/Report.h"

#include <chrono>
#include <vector>

// What the calendar knows. Moments outside count as its ends.
constexpr TimeSpan calendarSpan{.from = 0, .until = 7'258'118'400}; // 1970 to 2199

// When that day begins, in seconds since 1970 UTC.
[[nodiscard]] double beginningOf(std::chrono::year_month_day date, DayStart dayStart);
// The day that holds that moment.
[[nodiscard]] std::chrono::year_month_day dayOf(double moment, DayStart dayStart);

struct CalendarDay {
    std::chrono::year_month_day date;
    TimeSpan span;
};

// The days that the span touches, cut at its ends. None of an empty span.
[[nodiscard]] std::vector<CalendarDay> daysOf(const TimeSpan& span, DayStart dayStart);
