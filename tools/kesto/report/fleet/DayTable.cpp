// SPDX-License-Identifier: Apache-2.0
// How late days begin changes twice a year, so that a table of these changes is short, however long the span is.
#include "kesto/report/fleet/DayTable.h"

#include <fmt/format.h>

namespace {

constexpr std::int64_t microsecondsADay = 86'400'000'000;

} // namespace

DayTable::DayTable(const std::vector<std::int64_t>& days)
    : first_(days[1] - microsecondsADay),
      last_(static_cast<std::int64_t>(days.size()) - 2)
{
    for (std::int64_t day = 1; day <= last_; ++day) {
        const std::int64_t late = days[static_cast<std::size_t>(day)] - first_ - day * microsecondsADay;
        if (late != (late_.empty() ? 0 : late_.back().second))
            late_.emplace_back(day, late);
    }
}

std::string DayTable::of(std::string_view moment, std::string_view name) const
{
    const std::string guess = fmt::format("{}_guess", name);
    const std::string day =
        fmt::format("(intDiv(greatest({0} - {1}, 0), {2}) AS {3}) + ({0} >= {4}) - ({0} < {5})", moment, first_,
                    microsecondsADay, guess, beginning(fmt::format("({} + 1)", guess)), beginning(guess));
    return fmt::format("toInt64(least(greatest({}, 0), {})) AS {}", day, last_, name);
}

std::string DayTable::beginning(std::string_view day) const
{
    std::string late;
    for (std::size_t place = 0; place < late_.size(); ++place)
        late += fmt::format("{} < {}, {}, ", day, late_[place].first, place == 0 ? 0 : late_[place - 1].second);
    if (!late_.empty())
        late = fmt::format(" + multiIf({}{})", late, late_.back().second);
    return fmt::format("({} + {} * {}{})", first_, day, microsecondsADay, late);
}
