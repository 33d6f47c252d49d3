// SPDX-License-Identifier: Apache-2.0
// Where days begin and end. The moments come from the tables of the time zones, read by another program.
#include "kesto/report/Calendar.h"

#include "kesto/report/ReportTable.h"
#include "tools/kesto/report/ZoneForTest.h"

#include <cmath>
#include <fmt/format.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <limits>

namespace kesto_tool {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

std::vector<std::string> linesOf(const std::vector<CalendarDay>& days)
{
    std::vector<std::string> lines;
    for (const auto& [date, span] : days)
        lines.push_back(fmt::format("{} {:.0f} {:.0f} {} h", dateText(date), span.from, span.until,
                                    (span.until - span.from) / 3600));
    return lines;
}

std::vector<std::string> daysIn(const char* zone, double from, double until, DayStart dayStart = {})
{
    const ZoneForTest inZone(zone);
    return linesOf(daysOf({.from = from, .until = until}, dayStart));
}

TEST(Calendar, CutsTheFirstDayAndTheLast)
{
    EXPECT_THAT(daysIn("UTC", 1'795'000'000, 1'795'100'000),
                ElementsAre("2026-11-18 1795000000 1795046400 12.88888888888889 h",
                            "2026-11-19 1795046400 1795100000 14.88888888888889 h"));
    EXPECT_THAT(daysIn("UTC", 1'795'046'400, 1'795'132'800), ElementsAre("2026-11-19 1795046400 1795132800 24 h"));
}

TEST(Calendar, HasDaysOf23And25HoursWhereClocksChange)
{
    EXPECT_THAT(daysIn("Europe/Berlin", 1'774'738'800, 1'774'821'600),
                ElementsAre("2026-03-29 1774738800 1774821600 23 h"));
    EXPECT_THAT(daysIn("Europe/Berlin", 1'792'879'200, 1'792'969'200),
                ElementsAre("2026-10-25 1792879200 1792969200 25 h"));
}

TEST(Calendar, KnowsHalfAnHourOfSummer)
{
    EXPECT_THAT(daysIn("Australia/Lord_Howe", 1'775'307'600, 1'775'395'800),
                ElementsAre("2026-04-05 1775307600 1775395800 24.5 h"));
    EXPECT_THAT(daysIn("Australia/Lord_Howe", 1'791'034'200, 1'791'118'800),
                ElementsAre("2026-10-04 1791034200 1791118800 23.5 h"));
}

TEST(Calendar, BeginsADayWithoutMidnightAtItsFirstMoment)
{
    EXPECT_THAT(daysIn("America/Sao_Paulo", 1'541'214'000, 1'541'383'200),
                ElementsAre("2018-11-03 1541214000 1541300400 24 h", "2018-11-04 1541300400 1541383200 23 h"));
    EXPECT_THAT(daysIn("Africa/Cairo", 1'776'981'599, 1'777'064'400),
                ElementsAre("2026-04-23 1776981599 1776981600 0.0002777777777777778 h",
                            "2026-04-24 1776981600 1777064400 23 h"));
}

TEST(Calendar, EndsADayThatBeginsItsLastHourAgain)
{
    EXPECT_THAT(daysIn("America/Sao_Paulo", 1'518'832'800, 1'518'922'801),
                ElementsAre("2018-02-17 1518832800 1518922800 25 h",
                            "2018-02-18 1518922800 1518922801 0.0002777777777777778 h"));
    EXPECT_THAT(daysIn("Africa/Cairo", 1'793'221'200, 1'793'397'600),
                ElementsAre("2026-10-29 1793221200 1793311200 25 h", "2026-10-30 1793311200 1793397600 24 h"));
}

TEST(Calendar, BeginsADayWithTwoMidnightsAtTheFirst)
{
    EXPECT_THAT(daysIn("America/Havana", 1'793'505'600, 1'793'595'600),
                ElementsAre("2026-11-01 1793505600 1793595600 25 h"));
    EXPECT_THAT(daysIn("America/Havana", 1'793'509'200, 1'793'595'600),
                ElementsAre("2026-11-01 1793509200 1793595600 24 h"));
}

TEST(Calendar, LeavesOutADayThatACountrySkipped)
{
    EXPECT_THAT(daysIn("Pacific/Apia", 1'325'152'800, 1'325'325'600),
                ElementsAre("2011-12-29 1325152800 1325239200 24 h", "2011-12-31 1325239200 1325325600 24 h"));
    const ZoneForTest inApia("Pacific/Apia");
    EXPECT_EQ(dateText(dayOf(1'325'239'200, {})), "2011-12-31");
    EXPECT_EQ(dateText(dayOf(1'325'239'199, {})), "2011-12-29");
}

TEST(Calendar, BeginsDaysWhenItIsTold)
{
    const DayStart atFour{.afterMidnight = std::chrono::hours(4), .isUTC = false};
    // 02:00 of 25 October, when clocks had been set back at 03:00, is still a part of the day before.
    EXPECT_THAT(daysIn("Europe/Berlin", 1'792'890'000, 1'792'983'600, atFour),
                ElementsAre("2026-10-24 1792890000 1792897200 2 h", "2026-10-25 1792897200 1792983600 24 h"));
    EXPECT_THAT(daysIn("Europe/Berlin", 1'774'738'800, 1'774'749'600, atFour),
                ElementsAre("2026-03-28 1774738800 1774749600 3 h"));
}

TEST(Calendar, BeginsDaysAtATimeThatTheClockLeavesOut)
{
    const DayStart halfPastTwo{.afterMidnight = std::chrono::minutes(150), .isUTC = false};
    EXPECT_THAT(daysIn("Europe/Berlin", 1'774'659'600, 1'774'832'400, halfPastTwo),
                ElementsAre("2026-03-27 1774659600 1774661400 0.5 h", "2026-03-28 1774661400 1774746000 23.5 h",
                            "2026-03-29 1774746000 1774830600 23.5 h", "2026-03-30 1774830600 1774832400 0.5 h"));
}

TEST(Calendar, HasDaysOfUTCInAnyZone)
{
    const DayStart ofUTC{.afterMidnight = {}, .isUTC = true};
    EXPECT_THAT(daysIn("Pacific/Apia", 1'795'046'400, 1'795'132'800, ofUTC),
                ElementsAre("2026-11-19 1795046400 1795132800 24 h"));
}

TEST(Calendar, EndsWhereNoCalendarGoes)
{
    constexpr double infinity = std::numeric_limits<double>::infinity();
    EXPECT_THAT(daysIn("UTC", -infinity, 86'400.5),
                ElementsAre("1970-01-01 0 86400 24 h", "1970-01-02 86400 86400 0.0001388888888888889 h"));
    EXPECT_THAT(daysIn("UTC", 7'258'118'399, infinity),
                ElementsAre("2199-12-31 7258118399 7258118400 0.0002777777777777778 h"));
    EXPECT_THAT(daysIn("America/Havana", -infinity, infinity), SizeIs(84'007));
    EXPECT_THAT(daysIn("UTC", 100, 100), IsEmpty());
    EXPECT_THAT(daysIn("UTC", 100, 99), IsEmpty());
    EXPECT_THAT(daysIn("UTC", std::nan(""), 99), IsEmpty());
    EXPECT_THAT(daysIn("UTC", 1, std::nan("")), IsEmpty());
}

TEST(Calendar, KnowsWhenADayBegins)
{
    const ZoneForTest inBerlin("Europe/Berlin");
    EXPECT_EQ(beginningOf(std::chrono::year(2026) / 3 / 29, {}), 1'774'738'800);
    EXPECT_EQ(beginningOf(std::chrono::year(2026) / 3 / 30, {}), 1'774'821'600);
}

} // namespace
} // namespace kesto_tool
