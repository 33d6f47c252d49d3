// SPDX-License-Identifier: Apache-2.0
// The clock on the wall is the moment plus the zone's difference from UTC, which changes at some moments. The library's
// way back from the clock to the moment (mktime) leaves open what it does with a time that is shown twice or never, so
// only the way forth is used.
#include "kesto/report/Calendar.h"

#include <algorithm>
#include <cmath>
#include <ctime>

namespace {

using std::chrono::days;
using std::chrono::sys_days;
using std::chrono::year_month_day;
using Seconds = std::int64_t; // since 1970, of UTC or of the clock on the wall

constexpr Seconds secondsADay = 86400; // of the calendar, not of the clock

Seconds wallAt(Seconds moment, bool isUTC)
{
    if (isUTC)
        return moment;
    const std::time_t time = moment;
    std::tm local{};
    ::localtime_r(&time, &local);
    return moment + local.tm_gmtoff;
}

// The first moment at which the clock shows that time or a later one.
Seconds firstMomentOf(Seconds wall, bool isUTC)
{
    // Far enough on either side: no zone is further from UTC, and none has changed its difference by more than a day.
    const Seconds before = wall - 2 * secondsADay;
    const Seconds after = wall + 2 * secondsADay;
    const auto [early, late] =
        std::minmax({wall - (wallAt(before, isUTC) - before), wall - (wallAt(after, isUTC) - after)});
    for (const Seconds moment : {early, late}) // both of a time that is shown twice
        if (wallAt(moment, isUTC) == wall)
            return moment;
    Seconds isBefore = before;
    Seconds isThere = after;
    while (isThere - isBefore > 1) {
        const Seconds middle = isBefore + (isThere - isBefore) / 2;
        (wallAt(middle, isUTC) < wall ? isBefore : isThere) = middle;
    }
    return isThere;
}

Seconds wallBeginningOf(sys_days date, DayStart dayStart)
{
    return Seconds{date.time_since_epoch().count()} * secondsADay
        + std::chrono::seconds(dayStart.afterMidnight).count();
}

Seconds beginning(sys_days date, DayStart dayStart)
{
    return firstMomentOf(wallBeginningOf(date, dayStart), dayStart.isUTC);
}

} // namespace

double beginningOf(year_month_day date, DayStart dayStart)
{
    ::tzset();
    return static_cast<double>(beginning(sys_days(date), dayStart));
}

year_month_day dayOf(double moment, DayStart dayStart)
{
    ::tzset();
    const auto whole = static_cast<Seconds>(std::floor(std::clamp(moment, calendarSpan.from, calendarSpan.until)));
    // No clock is set by more than a day.
    sys_days date =
        std::chrono::floor<days>(std::chrono::sys_seconds(std::chrono::seconds(wallAt(whole, dayStart.isUTC))))
        + days(2);
    while (beginning(date, dayStart) > whole)
        date -= days(1);
    return date;
}

std::vector<CalendarDay> daysOf(const TimeSpan& span, DayStart dayStart)
{
    const double from = std::max(span.from, calendarSpan.from);
    const double until = std::min(span.until, calendarSpan.until);
    std::vector<CalendarDay> found;
    if (!(from < until))
        return found;
    sys_days date(dayOf(from, dayStart));
    for (double begins = from; begins < until; date += days(1)) {
        const double ends = std::min(until, static_cast<double>(beginning(date + days(1), dayStart)));
        if (ends > begins) // else the country skipped it
            found.push_back({.date = date, .span = {.from = begins, .until = ends}});
        begins = std::max(begins, ends);
    }
    return found;
}
