// SPDX-License-Identifier: Apache-2.0
// The days of a report as columns of a picture. Too many days are put together: as weeks, as months, as years, as
// decades.
#pragma once

#include "kesto/report/Report.h"

#include <chrono>
#include <cstddef>
#include <string>
#include <vector>

enum class ColumnUnit { Day, Week, Month, Year, Decade };

struct PageColumn {
    std::chrono::year_month_day first;
    double seconds = 0; // played
    std::vector<double> byApplication = {}; // seconds; the applications that the page names, then all others together
    struct Device {
        double seconds = 0;
        std::size_t faults = 0;
    };
    std::vector<Device> byDevice = {}; // as above
};

struct PageColumns {
    ColumnUnit unit = ColumnUnit::Day;
    std::vector<PageColumn> columns;

    // "Sun 8 Nov", "week of Mon 9 Nov", "November 2026", "2026", "2020s".
    [[nodiscard]] std::string name(const PageColumn& column) const;
    // In a table's first column: "Day", "Week", "Month", "Year", "Decade".
    [[nodiscard]] std::string heading() const;
};

// In the finest unit of which there are at most so many. Decades are never too many: the calendar has two dozen.
[[nodiscard]] PageColumns columnsOf(const Report& report, std::size_t most);

// How many applications and devices the page names. All beyond are "others".
constexpr std::size_t mostNamedApplications = 6;
constexpr std::size_t mostNamedDevices = 8;
[[nodiscard]] constexpr std::size_t namedOf(std::size_t count, std::size_t most)
{
    return count < most ? count : most;
}
// "3 others".
[[nodiscard]] std::string othersText(std::size_t count, std::size_t named);
