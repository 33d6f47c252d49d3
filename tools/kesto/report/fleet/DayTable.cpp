// SPDX-License-Identifier: Apache-2.0
// The last day of a run may be longer than 24 hours; a moment in its last hour is still in that day.
#include "kesto/report/fleet/DayTable.h"

#include <fmt/format.h>
#include <fmt/ranges.h>

namespace {

constexpr std::int64_t microsecondsADay = 86'400'000'000;

// The number of the run in which a figure is, by what each run begins with: never before the first one. Few runs are
// compared one by one, which is quicker; the end, where `canBeEnd` does not say otherwise, is not compared at all.
std::string runOf(std::string_view figure, const std::vector<std::int64_t>& beginnings, std::string_view name,
                  bool canBeEnd)
{
    constexpr std::size_t few = 8;
    if (beginnings.size() > few)
        return fmt::format("arrayCount(x -> x <= {}, {})", figure, name);
    std::string sum = "(1";
    for (std::size_t run = 1; run + (canBeEnd ? 0 : 1) < beginnings.size(); ++run)
        sum += fmt::format(" + ({} >= {})", figure, beginnings[run]);
    return sum + ')';
}

} // namespace

DayTable::DayTable(const std::vector<std::int64_t>& days)
{
    const auto count = static_cast<std::int64_t>(days.size()) - 1;
    for (std::int64_t day = 0; day <= count; ++day) {
        const std::int64_t moment = days[static_cast<std::size_t>(day)];
        const bool goesOn =
            day != 0 && day != count && moment == moments_.back() + (day - firsts_.back()) * microsecondsADay;
        if (goesOn)
            continue;
        if (day != 0)
            lasts_.push_back(day - 1);
        moments_.push_back(moment);
        firsts_.push_back(day);
    }
    lasts_.push_back(count - 1);
}

std::string DayTable::with() const
{
    const auto list = [](const std::vector<std::int64_t>& numbers, std::string_view name) {
        return fmt::format("CAST([{}] AS Array(Int64)) AS {}", fmt::join(numbers, ","), name);
    };
    return fmt::format("WITH {}, {}, {} ", list(moments_, "run_moments"), list(firsts_, "run_firsts"),
                       list(lasts_, "run_lasts"));
}

// Divided by a signed number: the server divides by an unsigned one as if both were.
std::string DayTable::of(std::string_view moment, std::string_view name) const
{
    return fmt::format("least(run_firsts[{0} AS {1}_run] + intDiv({2} - run_moments[{1}_run], toInt64({3})),"
                       " run_lasts[{1}_run]) AS {1}",
                       runOf(moment, moments_, "run_moments", false), name, moment, microsecondsADay);
}

std::string DayTable::beginning(std::string_view day) const
{
    const std::string run = runOf(day, firsts_, "run_firsts", true);
    return fmt::format("(run_moments[{0}] + ({1} - run_firsts[{0}]) * {2})", run, day, microsecondsADay);
}
