// SPDX-License-Identifier: Apache-2.0
// Days as expressions of SQL. Where days begin is known here, by the reader's clock, and not in the database.
//
// Most days have 24 hours. So a day is looked for where it would be if all had, and is at most one beside it: clocks
// are set by some hours, and a day that a country skips takes no time.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

// All moments are microseconds since 1970 UTC.
class DayTable {
public:
    // When each day of a span begins, and when the last ends: one day at least. The first and the last may be cut.
    explicit DayTable(const std::vector<std::int64_t>& days);

    // The number of the day of a moment in the span, from 0 on, under that name.
    [[nodiscard]] std::string of(std::string_view moment, std::string_view name) const;
    // When the day of that number begins, if it is not cut.
    [[nodiscard]] std::string beginning(std::string_view day) const;

private:
    std::int64_t first_; // when the first day would begin
    std::int64_t last_; // the number of the last day
    std::vector<std::pair<std::int64_t, std::int64_t>> late_; // from which day on, by how much
};
