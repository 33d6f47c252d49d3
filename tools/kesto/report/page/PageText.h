// SPDX-License-Identifier: Apache-2.0
// Text of the page: names that strangers chose, made harmless, and figures as people read them.
#pragma once

#include <chrono>
#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

constexpr std::size_t longestName = 100; // characters, in tables
constexpr std::size_t longestLabel = 44; // in legends
constexpr std::size_t longestShortName = 28; // characters, beside marks

// As HTML shows it, in text and in quoted attributes. Characters that show nothing or change the direction of text
// become U+FFFD, as do bytes that are not UTF-8. Of a longer text the middle is left out.
[[nodiscard]] std::string htmlText(std::string_view text, std::size_t mostCharacters);
// The same for a key of the report, "not told" if it is empty.
[[nodiscard]] std::string htmlName(std::string_view key, std::size_t mostCharacters = longestName);
// Of several devices at once, which are one text with commas, something remains of each.
[[nodiscard]] std::string htmlDevices(std::string_view key, std::size_t mostCharacters = longestName);

// Figures are HTML, too.
// "50 s", "34 min", "5 h 37 min", "131 h".
[[nodiscard]] std::string durationText(double seconds);
// With two decimals; "0" only if it is nothing.
[[nodiscard]] std::string hoursText(double seconds);
// "100 %" only if it is all of it, "0 %" only if it is nothing.
[[nodiscard]] std::string percentText(double part, double whole);
// "0.55"; a dash if there is none.
[[nodiscard]] std::string rateText(const std::optional<double>& rate);

// "Sun 8 Nov".
[[nodiscard]] std::string dayText(std::chrono::year_month_day date);
// "8 to 21 November 2026", with as much of the first date as differs from the last.
[[nodiscard]] std::string daysText(std::chrono::year_month_day first, std::chrono::year_month_day last);
[[nodiscard]] std::string_view monthName(std::chrono::year_month_day date);
[[nodiscard]] bool isWeekend(std::chrono::year_month_day date);
// By a chrono format of {fmt}.
[[nodiscard]] std::string pageMoment(double secondsSince1970, bool isUTC, std::string_view format);
