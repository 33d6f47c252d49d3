// SPDX-License-Identifier: Apache-2.0
// A week begins on Monday.
#include "kesto/report/page/PageColumns.h"

#include "kesto/report/page/PageText.h"

#include <algorithm>
#include <array>
#include <fmt/format.h>

namespace chrono = std::chrono;

namespace {

chrono::year_month_day firstOf(chrono::year_month_day date, ColumnUnit unit)
{
    const chrono::sys_days day(date);
    switch (unit) {
    case ColumnUnit::Day: return date;
    case ColumnUnit::Week: return day - (chrono::weekday(day) - chrono::Monday);
    case ColumnUnit::Month: return date.year() / date.month() / 1;
    case ColumnUnit::Year: return date.year() / 1 / 1;
    case ColumnUnit::Decade: return chrono::year(static_cast<int>(date.year()) / 10 * 10) / 1 / 1;
    }
    return date;
}

std::size_t countOf(const std::vector<ReportDay>& days, ColumnUnit unit)
{
    std::size_t count = 0;
    for (std::size_t index = 0; index < days.size(); ++index)
        count += index == 0 || firstOf(days[index].date, unit) != firstOf(days[index - 1].date, unit) ? 1 : 0;
    return count;
}

// What a day has beside those that have a place of their own. A report tells only the first of them for each day.
void addDay(const ReportDay& day, PageColumn& column)
{
    double otherApplications = day.played.seconds;
    PageColumn::Device otherDevices{.seconds = day.played.seconds, .faults = day.played.faults};
    column.seconds += day.played.seconds;
    for (std::size_t index = 0; index < std::min(day.byApplication.size(), mostNamedApplications); ++index) {
        column.byApplication[index] += day.byApplication[index];
        otherApplications -= day.byApplication[index];
    }
    for (std::size_t index = 0; index < std::min(day.byDevice.size(), mostNamedDevices); ++index) {
        const Played& played = day.byDevice[index];
        column.byDevice[index].seconds += played.seconds;
        column.byDevice[index].faults += played.faults;
        otherDevices.seconds -= played.seconds;
        otherDevices.faults -= std::min(otherDevices.faults, played.faults);
    }
    constexpr double least = 1e-3; // what is left of nothing by rounding
    if (column.byApplication.size() > mostNamedApplications && otherApplications > least)
        column.byApplication.back() += otherApplications;
    if (column.byDevice.size() > mostNamedDevices) {
        column.byDevice.back().seconds += otherDevices.seconds > least ? otherDevices.seconds : 0;
        column.byDevice.back().faults += otherDevices.faults;
    }
}

std::size_t placesOf(std::size_t count, std::size_t most)
{
    return namedOf(count, most) + (count > most ? 1 : 0);
}

} // namespace

PageColumns columnsOf(const Report& report, std::size_t most)
{
    PageColumns made;
    for (const ColumnUnit unit :
         {ColumnUnit::Day, ColumnUnit::Week, ColumnUnit::Month, ColumnUnit::Year, ColumnUnit::Decade}) {
        made.unit = unit;
        if (countOf(report.days, unit) <= most)
            break;
    }
    for (const ReportDay& day : report.days) {
        const auto first = firstOf(day.date, made.unit);
        if (made.columns.empty() || made.columns.back().first != first) {
            made.columns.push_back({.first = first});
            made.columns.back().byApplication.resize(placesOf(report.applications.size(), mostNamedApplications));
            made.columns.back().byDevice.resize(placesOf(report.devices.size(), mostNamedDevices));
        }
        addDay(day, made.columns.back());
    }
    return made;
}

std::string PageColumns::name(const PageColumn& column) const
{
    const int year = static_cast<int>(column.first.year());
    switch (unit) {
    case ColumnUnit::Day: return dayText(column.first);
    case ColumnUnit::Week: return fmt::format("week of {}", dayText(column.first));
    case ColumnUnit::Month: return fmt::format("{} {}", monthName(column.first), year);
    case ColumnUnit::Year: return fmt::format("{}", year);
    case ColumnUnit::Decade: return fmt::format("{}s", year);
    }
    return {};
}

std::string PageColumns::heading() const
{
    constexpr std::array<const char*, 5> headings{"Day", "Week", "Month", "Year", "Decade"};
    return headings[static_cast<std::size_t>(unit)];
}

std::string othersText(std::size_t count, std::size_t named)
{
    return fmt::format("{} other{}", count - named, count - named == 1 ? "" : "s");
}
