// SPDX-License-Identifier: Apache-2.0
// Days as expressions of SQL. Where days begin is known here, by the reader's clock, and not in the database.
//
// Most days have 24 hours. So the table is made of runs of such days: a run ends behind a day of another length, and so
// a long span has few runs. The lists of runs are constants for the database, named once in each SELECT.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

// All moments are microseconds since 1970 UTC.
class DayTable {
public:
    // When each day of a span begins, and when the last ends: one day at least. The first and the last may be cut.
    explicit DayTable(const std::vector<std::int64_t>& days);

    // Goes before a SELECT that has one of the expressions below.
    [[nodiscard]] std::string with() const;
    // The number of the day of a moment in the span, from 0 on, under that name.
    [[nodiscard]] std::string of(std::string_view moment, std::string_view name) const;
    // When the day of that number begins. Behind the last one, when that ends.
    [[nodiscard]] std::string beginning(std::string_view day) const;

private:
    // Of each run; at the end stands one more, in which no moment of the span is.
    std::vector<std::int64_t> moments_; // when it begins
    std::vector<std::int64_t> firsts_; // the number of its first day
    std::vector<std::int64_t> lasts_;
};
