// SPDX-License-Identifier: Apache-2.0
// What the report of a fleet adds to that of a device: models, releases and distributions over units; and what it does
// with rows that come twice, with names that are made to harm, and with a database that it cannot ask.
#include "kesto-ingest/MetricsServer.h"
#include "kesto/report/fleet/FleetQueries.h"
#include "kesto/report/fleet/SqlText.h"
#include "kesto/store/EventDatabase.h"
#include "support/KeptPort.h"
#include "tools/kesto/report/fleet/Fleet.h"

#include <algorithm>
#include <chrono>
#include <fmt/format.h>
#include <fmt/ranges.h>
#include <gmock/gmock.h>
#include <thread>

namespace kesto_tool {
namespace {

using foundation::Dictionary;
using foundation::Value;
using testing::HasSubstr;
using testing::Not;

const std::string unit1(32, '1');
const std::string unit2(32, '2');
const std::string unit3(32, '3');
constexpr double monday = 1794787200; // 16 November 2026
const Tool::Arguments thatWeek{"--utc", "--since", "2026-11-16", "--until", "2026-11-23"};

Tool::Arguments inThatWeek(const Tool::Arguments& more)
{
    Tool::Arguments arguments = thatWeek;
    arguments.insert(arguments.end(), more.begin(), more.end());
    return arguments;
}

std::string stretch(int id, int session, double hoursAfterMonday, double hours, const std::string& application,
                    const std::string& more = R"("device_name":"speaker","format":"S16LE/48000/2","volume":0.5)")
{
    return fmt::format(R"("kind":"stretch","id":{},"recording":false,"began":{},"seconds":{},"session":{},)"
                       R"("application":{},"ending":"stopped",{}}})"
                       "\n",
                       id, monday + hoursAfterMonday * 3600, hours * 3600, session, application, more);
}

std::string fault(int id, int session, double hoursAfterMonday, const std::string& payload = R"({"late_cycles":1})")
{
    return fmt::format(R"("kind":"event","id":{},"time":{},"name":"com.quarn.kesto.Error.Overload","session":{},)"
                       R"("application":"player","payload":{}}})"
                       "\n",
                       id, monday + hoursAfterMonday * 3600, session, payload);
}

std::string faults(int first, int count, int session, double hoursAfterMonday)
{
    std::string lines;
    for (int index = 0; index < count; ++index)
        lines += fault(first + index, session, hoursAfterMonday);
    return lines;
}

std::string session(int id, const std::string& more)
{
    return fmt::format(R"("kind":"session","id":{},"began":{},"application":"player","process":"a player"{}}})"
                       "\n",
                       id, monday, more);
}

std::string at(const Dictionary& dictionary, std::string_view key)
{
    const Value* const value = dictionary.find(key);
    return value == nullptr ? "not there" : value->text();
}

// 0.5, 2 and 6 faults an hour; the last played for half an hour only.
class ThreeUnits : public FleetReports {
protected:
    ThreeUnits()
    {
        for (int time = 0; time < 2; ++time) { // each row comes twice
            insertLines(unit1,
                        stretch(1, 1, 1, 2, "\"player\"") + faults(2, 1, 1, 2) + session(1, R"(,"ended":1794800000)")
                            + session(1, ""));
            insertLines(unit2, stretch(1, 1, 22, 4, "\"player\"") + faults(2, 8, 1, 23), "lamp", "1.3");
            insertLines(unit3,
                        stretch(1, 1, 1, 0.25, "\"browser\"") + stretch(2, 2, 5, 0.25, "\"player\"")
                            + faults(3, 3, 1, 1.1),
                        "radio", "1.3");
        }
    }
};

TEST_F(ThreeUnits, AreComparedAndEachRowCountsOnce)
{
    const Dictionary report = json(thatWeek);
    EXPECT_EQ(at(report, "seconds"), "23400");
    EXPECT_EQ(at(report, "sessions"), "4");
    EXPECT_EQ(at(report, "faults"), "12");
    EXPECT_EQ(at(report, "units"), "3");
    EXPECT_EQ(at(report, "hours_of_units"), R"({"median":2,"ninetieth":4,"most":4})");
    EXPECT_EQ(at(report, "units_compared"), "2");
    EXPECT_EQ(at(report, "faults_an_hour_of_units"), R"({"median":2,"ninetieth":2,"most":2})");
    EXPECT_EQ(at(report, "sessions_with_faults"), "3");
    EXPECT_EQ(at(report, "running"), "not there");
    EXPECT_EQ(at(report, "models"),
              R"([{"model":"lamp","units":2,"units_compared":2,"faults_an_hour_of_units":{"median":2,"ninetieth":2,)"
              R"("most":2},"seconds":21600,"muted_seconds":0,"no_volume_seconds":0,"mean_volume":0.5,"sessions":2,)"
              R"("faults":9,"faults_an_hour":1.5},{"model":"radio","units":1,"units_compared":0,)"
              R"("faults_an_hour_of_units":null,"seconds":1800,"muted_seconds":0,"no_volume_seconds":0,)"
              R"("mean_volume":0.5,"sessions":2,"faults":3,"faults_an_hour":6}])");
    EXPECT_EQ(at(report, "worst_units"),
              fmt::format(R"([{{"unit":"{}","model":"lamp","version":"1.3","seconds":14400,"muted_seconds":0,)"
                          R"("no_volume_seconds":0,"mean_volume":0.5,"sessions":1,"faults":8,"faults_an_hour":2}},)"
                          R"({{"unit":"{}","model":"lamp","version":"1.2","seconds":7200,"muted_seconds":0,)"
                          R"("no_volume_seconds":0,"mean_volume":0.5,"sessions":1,"faults":1,"faults_an_hour":0.5}}])",
                          unit2, unit1));
    const auto worst = report.find("worst_sessions")->array().value();
    ASSERT_EQ(worst.size(), 3U);
    EXPECT_EQ(at(*worst[0].dictionary(), "unit"), unit2);
    EXPECT_EQ(at(*worst[0].dictionary(), "late_cycles"), "8");
    EXPECT_EQ(at(*worst[2].dictionary(), "unit"), unit1);
    EXPECT_EQ(at(*worst[2].dictionary(), "process"), "a player");
}

TEST_F(ThreeUnits, AreTablesForProgramsAndForPeople)
{
    EXPECT_EQ(print(inThatWeek({"--csv"})),
              "day,seconds,sessions,faults,mean_volume\n2026-11-16,16200.0,4,12,0.5\n2026-11-17,7200.0,1,0,0.5\n"
              "2026-11-18,0.0,0,0,\n2026-11-19,0.0,0,0,\n2026-11-20,0.0,0,0,\n2026-11-21,0.0,0,0,\n"
              "2026-11-22,0.0,0,0,\n");
    EXPECT_EQ(print(inThatWeek({"--csv", "--by", "version"})),
              "version,seconds,sessions,faults,mean_volume,units,median_faults_an_hour,ninetieth_faults_an_hour,"
              "most_faults_an_hour\n"
              "1.3,16200.0,3,11,0.5,2,2.0,2.0,2.0\n1.2,7200.0,1,1,0.5,1,0.5,0.5,0.5\n");
    EXPECT_EQ(print(inThatWeek({"--csv", "--by", "unit"})),
              fmt::format("unit,seconds,sessions,faults,mean_volume\n{},14400.0,1,8,0.5\n{},7200.0,1,1,0.5\n"
                          "{},1800.0,2,3,0.5\n",
                          unit2, unit1, unit3));
    EXPECT_THAT(print(inThatWeek({"--csv", "--by", "volume"})), HasSubstr("\n0.4375,0.0\n0.5,23400.0\n0.5625,0.0\n"));
    EXPECT_EQ(print(inThatWeek({"--csv", "--by", "fault"})), "fault,faults,sessions\nOverload,12,3\n");
    EXPECT_THAT(print(inThatWeek({"--csv", "--unit", unit1})),
                HasSubstr("mean_volume\n2026-11-16,7200.0,1,1,0.5\n2026-11-17,0.0,0,0,\n"));
    const std::string text = print(inThatWeek({"--by", "application"}));
    EXPECT_THAT(text,
                HasSubstr("6.5 h played in 4 sessions · 12 faults, 1.85 an hour\n"
                          "3 units; a unit played: median 2.0 h, 90 % up to 4.0 h, most 4.0 h\n"
                          "faults an hour of a unit: median 2.00, 90 % up to 2.00, worst 2.00; of 2 that played "
                          "an hour or more\n"));
    EXPECT_THAT(text,
                HasSubstr("APPLICATION   PLAYED  SHARE  VOLUME  FAULTS  /HOUR  UNITS  MEDIAN   90 %  WORST\n"
                          "player         6.2 h   96 %    50 %"));
    EXPECT_THAT(print(thatWeek), HasSubstr("browser"));
}

TEST_F(FleetReports, SayThatNothingWasPlayed)
{
    EXPECT_THAT(print(thatWeek),
                HasSubstr("Nothing that matches was played between 2026-11-16 00:00 and 2026-11-23 "
                          "00:00 on any unit whose reports have come.\n"));
    EXPECT_EQ(at(json(thatWeek), "hours_of_units"), "(null)");
    EXPECT_EQ(at(json(inThatWeek({"--recording"})), "units"), "0");
}

TEST_F(FleetReports, TakeNamesForNamesOnly)
{
    const std::string harmful = "\\\\'; DROP TABLE kesto.stretches; --\\\"\\n`\\u0001";
    insertLines(unit1, stretch(1, 1, 1, 2, "\"" + harmful + "\"") + stretch(2, 1, 4, 1, "\"it's\""));
    EXPECT_EQ(at(json(inThatWeek({"--application", "it's"})), "seconds"), "3600");
    EXPECT_EQ(at(json(inThatWeek({"--application", "\\'; DROP TABLE kesto.stretches; --\"\n`\x01"})), "seconds"),
              "7200");
    EXPECT_EQ(at(json(inThatWeek({"--device", "'); DROP TABLE kesto.stretches; --"})), "seconds"), "0");
    const auto applications = json(thatWeek).find("applications")->array().value();
    ASSERT_EQ(applications.size(), 2U);
    EXPECT_EQ(at(*applications[0].dictionary(), "application"), "\\'; DROP TABLE kesto.stretches; --\"\n`\x01");
}

// SQLite itself says what matches.
TEST_F(FleetReports, MatchAsTheReportOfADeviceDoes)
{
    const std::vector<std::string> names{"",    "a",    "A",     "ab",  "a.b", "a\nb", "aéb",  "é",  "]",
                                         "[",   "^",    "-",     "a-b", "*",   "?",    "a?b",  "\\", "a\\b",
                                         "org", "x{2}", "(a|b)", "a'b", "z",   "ü",    "日本", "$",  "a$"};
    const std::vector<std::string> globs{"*",     "?",       "a*",   "*b",    "a?b",   "[a-c]*", "[^a-c]*", "[]]",
                                         "[^]]",  "[a",      "a[]b", "[a-]",  "[-a]",  "[z-a]",  "[é-ü]",   "[^é]",
                                         "\\*",   "a\\b",    "a.b",  "x{2}",  "(a|b)", "a'b",    "[*]",     "[?]",
                                         "a[?]b", "*[é]*",   "??",   "日?",   "[\\]",  "[^^]",   "[[]",     "$",
                                         "a$",    "[a-c-z]", "",     "*a*b*", "[.-.]", "[!a]",   "^",       "[^-]"};
    for (const std::string& glob : globs)
        for (const std::string& name : names)
            EXPECT_EQ(
                server.select(fmt::format("SELECT match({}, {})", sqlText(name), sqlText(regularExpression(glob)))),
                matches(name, glob) ? "1" : "0")
                << "\"" << name << "\" " << glob << " " << regularExpression(glob);
}

// Days of 23, 25 and 23.5 hours, and such that are cut at the ends of a span.
TEST_F(FleetReports, FindDaysWhereverTheyBegin)
{
    constexpr std::int64_t hour = 3'600'000'000;
    const std::vector<std::vector<std::int64_t>> lengths{{24},
                                                         {3},
                                                         {5, 2},
                                                         {24, 24, 24},
                                                         {24, 23, 24, 24, 25, 24, 1},
                                                         {25, 24},
                                                         {24, 25},
                                                         {1, 25, 24, 23, 24},
                                                         {10, 23, 23, 23, 24},
                                                         {24, 23, 25, 23, 25, 23, 25, 23, 25, 23, 25}};
    for (const auto& hours : lengths) {
        std::vector<std::int64_t> days{1794787200123456};
        for (const std::int64_t each : hours)
            days.push_back(days.back() + each * hour - hour / 2 * (each == 23 ? -1 : 0));
        const DayTable table(days);
        for (std::size_t day = 0; day + 1 < days.size(); ++day)
            for (const std::int64_t moment : {days[day], days[day] + 1, days[day + 1] - 1})
                EXPECT_EQ(server.select(fmt::format("{}SELECT {}, {}, {} FROM (SELECT toInt64({}) AS moment)",
                                                    table.with(), table.of("moment", "day"), table.beginning("day"),
                                                    table.beginning("(day + 1)"), moment)),
                          fmt::format("{}\t{}\t{}", day, days[day], days[day + 1]))
                    << fmt::format("{}", fmt::join(hours, " "));
    }
}

// Each day is what of the stretch lies between its midnights, also a first or last day of 25 hours.
TEST_F(FleetReports, CutDaysOf25HoursWhereTheyBeginAndEnd)
{
    tool.setVariable("TZ=Europe/Berlin");
    constexpr double change = 1792879200; // 25 October 2026, 00:00 there
    insertLines(unit1, stretch(1, 1, (change - monday) / 3600 - 0.5, 25, "\"player\""));
    const auto daysOf = [this](const std::string& since, const std::string& until) {
        return print({"--csv", "--since", since, "--until", until});
    };
    EXPECT_EQ(daysOf("2026-10-24", "2026-10-26"),
              "day,seconds,sessions,faults,mean_volume\n2026-10-24,1800.0,1,0,0.5\n2026-10-25,88200.0,1,0,0.5\n");
    EXPECT_EQ(daysOf("2026-10-25", "2026-10-27"),
              "day,seconds,sessions,faults,mean_volume\n2026-10-25,88200.0,1,0,0.5\n2026-10-26,0.0,0,0,\n");
    insertLines(unit2, stretch(1, 1, (change - monday) / 3600 + 24.5, 1, "\"player\""));
    EXPECT_EQ(daysOf("2026-10-25", "2026-10-27"),
              "day,seconds,sessions,faults,mean_volume\n2026-10-25,90000.0,2,0,0.5\n2026-10-26,1800.0,1,0,0.5\n");
}

TEST_F(FleetReports, CanBeOfAllYearsOfAClockThatChanges)
{
    tool.setVariable("TZ=Africa/Casablanca");
    insertLines(unit1, stretch(1, 1, 1, 2, "\"player\"") + fault(2, 1, 1));
    EXPECT_THAT(print({"--csv", "--since", "1970-01-02", "--until", "2026-11-23"}),
                HasSubstr("\n2026-11-16,7200.0,1,1,0.5\n"));
    EXPECT_EQ(at(json({"--since", "1970-01-02", "--until", "2026-11-23"}), "seconds"), "7200");
}

TEST_F(ThreeUnits, AreAPage)
{
    const std::string page = print(inThatWeek({"--html", "-"}));
    EXPECT_LT(page.size(), 100'000U);
    EXPECT_THAT(page, HasSubstr("<h1>Audio report of a fleet</h1>"));
    EXPECT_THAT(page,
                HasSubstr("<h2>3 units</h2><p class=sub>Hours played by a unit: median 2.00 h, 90 % up to 4.00 h, "
                          "most 4.00 h<p class=sub>Faults an hour of a unit: median 2.00, 90 % up to 2.00, most "
                          "2.00; of 2 that played an hour or more"));
    EXPECT_THAT(page, HasSubstr("<th scope=row><bdi>radio</bdi><td>1<td>30 min<td>2<td>3<td>6.00<td>–<td>–<td>–"));
    EXPECT_THAT(page, HasSubstr("<h2>Worst units</h2>"));
    EXPECT_THAT(page, HasSubstr("<th scope=row>1<br><span class=sub>" + unit2 + "</span>"));
    EXPECT_THAT(page, Not(HasSubstr("<script")));
}

class Shards : public FleetReports {
protected:
    // Two servers, with a table over both on the first.
    Shards()
    {
        for (const auto* const shard : {&first, &second}) {
            shard->makeTables();
            for (const std::string table : {"events", "stretches", "sessions"})
                EXPECT_EQ(shard->select(fmt::format("RENAME TABLE {0} TO {0}_local", table)), "");
        }
        for (const std::string table : {"events", "stretches", "sessions"})
            EXPECT_EQ(first.select(fmt::format("CREATE TABLE {0} AS {0}_local ENGINE = Distributed(fleet, kesto, "
                                               "{0}_local, cityHash64(device))",
                                               table)),
                      "");
    }

    // All that the one server has, by their hashes.
    void divide() const
    {
        for (const auto& [shard, condition] :
             {std::pair(&first, "cityHash64(device) % 2 = 0"), std::pair(&second, "cityHash64(device) % 2 = 1")})
            for (const std::string table : {"events", "stretches", "sessions"}) {
                const std::string rows = server.select(
                    fmt::format("SELECT * FROM {} WHERE {} ORDER BY received FORMAT TabSeparated", table, condition));
                EXPECT_EQ(shard->select(fmt::format("INSERT INTO {}_local FORMAT TabSeparated\n{}", table, rows)), "");
            }
    }

    [[nodiscard]] std::string printShards(Tool::Arguments arguments) const
    {
        arguments.insert(arguments.begin(), {"report", "--fleet", first.address()});
        return tool.print(arguments);
    }

    support::KeptPort firstPort;
    support::KeptPort secondPort;
    kesto_ingest::ClickHouseServer::Membership membership{
        .zookeeper = "127.0.0.1:1", // is not asked
        .cluster = fmt::format("{}:{}", firstPort.number(), secondPort.number())};
    kesto_ingest::ClickHouseServer first{directory / "first", firstPort.number(), membership};
    kesto_ingest::ClickHouseServer second{directory / "second", secondPort.number(), membership};
};

TEST_F(Shards, AreAskedAsOneServerIs)
{
    const auto unit = [](int number) { return fmt::format("{:032x}", number); };
    for (int number = 1; number <= 6; ++number) {
        std::string recorded = stretch(5, 2, 3, 1, "\"recorder\"");
        recorded.replace(recorded.find("false"), 5, "true");
        const std::string lines = stretch(1, 1, 1, number, "\"player\"") + stretch(2, 1, 20, 9, "\"browser\"")
            + faults(10, number, 1, 2) + fault(30, 2, 3.5) + recorded + session(1, "");
        for (int time = 0; time < 1 + number % 2; ++time)
            insertLines(unit(number), lines, number % 3 == 0 ? "lamp" : "radio", fmt::format("1.{}", number % 4));
    }
    divide();
    for (const Tool::Arguments& more : std::vector<Tool::Arguments>{
             {"--json"}, {"--json", "--recording", "--device", "speaker"}, {"--csv", "--by", "unit"}})
        EXPECT_EQ(printShards(inThatWeek(more)), print(inThatWeek(more)));
    const std::string page = printShards(inThatWeek({"--html", "-"}));
    EXPECT_THAT(page, HasSubstr("<h2>6 units</h2>"));
    EXPECT_EQ(at(json(thatWeek), "faults"), "21");
    EXPECT_EQ(at(json(inThatWeek({"--recording"})), "faults"), "6");
}

// An update in between gave the second row another model and release, new rules another application.
TEST_F(FleetReports, CountRowsOnceAlsoIfTheyDiffer)
{
    const std::string lines = stretch(1, 1, 22, 4, "\"player\"") + fault(2, 1, 23);
    insertLines(unit1, lines, "lamp", "1.1");
    std::this_thread::sleep_for(std::chrono::milliseconds(1100)); // the database counts seconds
    std::string changed = lines;
    changed.replace(changed.find("player"), 6, "hash-1");
    insertLines(unit1, changed, "torch", "1.2");
    EXPECT_EQ(print(inThatWeek({"--csv", "--by", "version"})),
              "version,seconds,sessions,faults,mean_volume,units,median_faults_an_hour,ninetieth_faults_an_hour,"
              "most_faults_an_hour\n1.2,14400.0,1,1,0.5,1,0.25,0.25,0.25\n");
    EXPECT_EQ(print(inThatWeek({"--csv", "--by", "unit"})),
              fmt::format("unit,seconds,sessions,faults,mean_volume\n{},14400.0,1,1,0.5\n", unit1));
    EXPECT_THAT(print(inThatWeek({"--csv"})), HasSubstr("\n2026-11-16,7200.0,1,1,0.5\n2026-11-17,7200.0,1,0,0.5\n"));
    const Dictionary report = json(thatWeek);
    EXPECT_THAT(at(report, "models"), testing::StartsWith(R"([{"model":"torch","units":1,)"));
    EXPECT_THAT(at(report, "worst_units"), HasSubstr(R"("model":"torch","version":"1.2","seconds":14400,)"));
    EXPECT_EQ(at(json(inThatWeek({"--application", "player"})), "seconds"), "0");
}

// Of the release that it had last.
TEST_F(FleetReports, NameTheLastReleaseOfAWorstUnit)
{
    insertLines(unit1, stretch(1, 1, 1, 2, "\"player\"") + fault(2, 1, 2), "lamp", "1.9");
    insertLines(unit1, stretch(3, 2, 30, 2, "\"player\"") + fault(4, 2, 31), "lamp", "1.10");
    insertLines(unit2, stretch(3, 2, 30, 2, "\"player\"") + fault(4, 2, 31), "lamp", "1.10");
    insertLines(unit2, stretch(1, 1, 1, 2, "\"player\"") + fault(2, 1, 2), "lamp", "1.9");
    const std::string worst = at(json(thatWeek), "worst_units");
    EXPECT_THAT(worst, HasSubstr(unit1 + R"(","model":"lamp","version":"1.10")"));
    EXPECT_THAT(worst, HasSubstr(unit2 + R"(","model":"lamp","version":"1.10")"));
}

TEST_F(FleetReports, TellTheSameRateOfAUnitEverywhere)
{
    insertLines(unit1, stretch(1, 1, 1, 12767.024629 / 3600, "\"player\"") + faults(2, 7, 1, 2));
    const Dictionary report = json(thatWeek);
    const std::string rate = at(report, "faults_an_hour");
    EXPECT_EQ(at(report, "faults_an_hour_of_units"),
              fmt::format(R"({{"median":{0},"ninetieth":{0},"most":{0}}})", rate));
    EXPECT_THAT(at(report, "worst_units"), HasSubstr(fmt::format(R"("faults_an_hour":{}}}])", rate)));
}

TEST_F(FleetReports, LeaveOutWhatTookNoTime)
{
    insertLines(unit1, stretch(1, 1, 1, 1e-10, "\"player\"", R"("volume":0.5)"));
    EXPECT_THAT(print(thatWeek), HasSubstr("Nothing that matches was played"));
}

// 10.000001 s at half the slider are 5.0000005 s, and count as 5.000001 s.
TEST_F(FleetReports, RoundVolumesAsADeviceDoes)
{
    insertLines(unit1, stretch(1, 1, 1, 10.000001 / 3600, "\"player\""));
    EXPECT_EQ(at(json(thatWeek), "mean_volume"), "0.500000049999995");
}

TEST_F(FleetReports, ShowDaysOfALongSpan)
{
    insertLines(unit1, stretch(1, 1, 1, 2, "\"player\""));
    const std::string days = print({"--utc", "--since", "2026-10-01", "--until", "2026-11-23", "--by", "day"});
    EXPECT_THAT(days, HasSubstr("\n2026-11-16     2.0 h"));
    EXPECT_THAT(days, Not(HasSubstr("2026-11-15")));
}

// So many that queries can name one by one, and more.
TEST_F(FleetReports, CountRowsOfManyUnitsOnce)
{
    const auto insertUnits = [this](std::size_t first, std::size_t last) {
        for (int time = 0; time < 2; ++time)
            EXPECT_EQ(server.select(fmt::format(
                          "INSERT INTO stretches (device, epoch, id, began_us, microseconds, session, application)"
                          " SELECT toFixedString(lower(concat(hex(cityHash64(number)), hex(cityHash64(number, 1)))),"
                          " 32) AS unit, unit, 1, {} + 82800000000, 7200000000, 1, 'player' FROM numbers({}, {})",
                          static_cast<std::int64_t>(monday * 1e6), first, last - first)),
                      "");
    };
    insertUnits(0, FleetQueries::mostUnits);
    EXPECT_THAT(print(thatWeek), HasSubstr("6000 h played in 3000 sessions"));
    EXPECT_THAT(print(inThatWeek({"--csv", "--by", "day"})), HasSubstr("\n2026-11-17,10800000.0,3000,0,\n"));
    EXPECT_EQ(at(json(thatWeek), "units"), "3000");
    insertUnits(FleetQueries::mostUnits, 3900);
    EXPECT_THAT(print(thatWeek), HasSubstr("7800 h played in 3900 sessions"));
    EXPECT_THAT(print(inThatWeek({"--csv", "--by", "day"})), HasSubstr("\n2026-11-17,14040000.0,3900,0,\n"));
}

TEST_F(FleetReports, DrawApplicationsWithLongNames)
{
    std::string lines;
    for (int index = 1; index <= 8; ++index)
        lines += stretch(index, index, index, 1, fmt::format("\"{}{}\"", index, std::string(16'000, 'x')));
    insertLines(unit1, lines);
    EXPECT_THAT(print(inThatWeek({"--html", "-"})), HasSubstr("<h1>Audio report of a fleet</h1>"));
}

// One session with 3,000 stretches and 60,000 faults, 20 in each stretch: in memory of which their product needs more.
TEST_F(FleetReports, FindTheDevicesOfManyFaultsOfOneSession)
{
    const auto insertRows = [this](std::string_view columns, std::string_view values, int count) {
        EXPECT_EQ(server.select(fmt::format("INSERT INTO {0} SELECT toFixedString('{1}', 32) AS unit, unit, {2} FROM"
                                            " (SELECT toInt64({3}) AS monday, toInt64(number) AS n FROM numbers({4}))",
                                            columns, unit1, values, static_cast<std::int64_t>(monday * 1e6), count)),
                  "");
    };
    insertRows("stretches (device, epoch, id, began_us, microseconds, session, audio_device, format)",
               "n, monday + n * 20000000, 19000000, 1, if(n % 3 = 0, 'left', 'right'), if(n % 3 = 0, 'S16', 'F32')",
               3000);
    insertRows("events (device, epoch, id, happened_us, name, session)",
               "n + 3000, monday + n * 1000000, 'com.quarn.kesto.Error.Overload', 1", 60'000);
    constexpr double week = 604'800;
    FleetQueries queries({.history = {.span = {.from = monday, .until = monday + week}}},
                         {static_cast<std::int64_t>(monday * 1e6), static_cast<std::int64_t>((monday + week) * 1e6)});
    queries.setRecordings({});
    for (const auto& [by, lines] :
         {std::pair("audio_device", "left\t20000\nright\t40000"), std::pair("format", "F32\t40000\nS16\t20000")})
        EXPECT_EQ(server.select(fmt::format("SELECT name, faults FROM (SELECT name, `sum(faults)` AS faults FROM ({}))"
                                            " ORDER BY name SETTINGS max_memory_usage = 400000000",
                                            queries.lines(by, {.withOverUnits = true}, 0))),
                  lines);
}

// A person gets the longest lines and one for all others, a program gets all.
TEST_F(FleetReports, ShowTheLargestLinesOfALongTable)
{
    EXPECT_EQ(server.select(fmt::format(
                  "INSERT INTO stretches (device, epoch, id, began_us, microseconds, session, application)"
                  " SELECT toFixedString('{0}', 32) AS unit, unit, number, {1} + number * 60000000,"
                  " if(number < 1000, 7200000000, 3600000000), number + 1, concat('player ', toString(number))"
                  " FROM numbers(1005)",
                  unit1, static_cast<std::int64_t>(monday * 1e6))),
              "");
    EXPECT_EQ(server.select(fmt::format(
                  "INSERT INTO events (device, epoch, id, happened_us, name, session, application)"
                  " SELECT toFixedString('{0}', 32) AS unit, unit, number, {1} + number * 60000000,"
                  " concat('com.quarn.kesto.Error.', toString(number % 1003)), 1, 'player 0' FROM numbers(2003)",
                  unit1, static_cast<std::int64_t>(monday * 1e6))),
              "");
    const auto countOfLines = [](const std::string& text) { return std::ranges::count(text, '\n'); };
    const std::string applications = print(inThatWeek({"--by", "application"}));
    EXPECT_THAT(applications, HasSubstr("\nand 5 more with 5.0 h: --csv shows all\n"));
    EXPECT_THAT(applications, HasSubstr("\nplayer 999 "));
    EXPECT_THAT(applications, Not(HasSubstr("\nplayer 1000 ")));
    EXPECT_THAT(print(thatWeek), HasSubstr("\nand 985 more with 1965 h: --by application shows more\n"));
    EXPECT_EQ(countOfLines(print(inThatWeek({"--csv", "--by", "application"}))), 1006);
    EXPECT_EQ(json(thatWeek).find("applications")->array().value().size(), 1005U);
    EXPECT_THAT(print(inThatWeek({"--html", "-"})), HasSubstr("999 others"));
    EXPECT_THAT(print(inThatWeek({"--by", "fault"})), HasSubstr("\nand 3 more with 3 faults: --csv shows all\n"));
    EXPECT_EQ(countOfLines(print(inThatWeek({"--csv", "--by", "fault"}))), 1004);
}

TEST_F(FleetReports, SayWhenTimesAddUpToMoreThanTheyCan)
{
    EXPECT_EQ(server.select(fmt::format("INSERT INTO stretches (device, epoch, id, began_us, microseconds, session)"
                                        " SELECT toFixedString('{0}', 32) AS unit, unit, number, 86400000000,"
                                        " 4294967295000000, 1 FROM numbers(6000)",
                                        unit1)),
              "");
    EXPECT_THAT(failure({"--utc", "--since", "1970-01-02"}), HasSubstr("more than 292,000 years together"));
}

// As the server's settings say while it answers.
TEST_F(FleetReports, LimitTheTimeOfTheServerToo)
{
    EXPECT_EQ(server.select("RENAME TABLE stretches TO real_stretches"), "");
    EXPECT_EQ(server.select("CREATE VIEW stretches AS SELECT * FROM real_stretches WHERE (SELECT throwIf(value = '7')"
                            " FROM system.settings WHERE name = 'max_execution_time') = 0"),
              "");
    EXPECT_THAT(print(inThatWeek({"--time-limit", "8"})), HasSubstr("Nothing that matches was played"));
    EXPECT_THAT(failure(inThatWeek({"--time-limit", "7"})), HasSubstr("throwIf"));
}

TEST_F(FleetReports, KnowAnAnswerThatIsCut)
{
    fleet_database::ClickHouseServers servers({.servers = {server.address()}}, 6);
    const auto isFinal = [](const fleet_database::Answer&) { return true; };
    const auto whole = servers.ask("", "SELECT 12345", isFinal);
    EXPECT_EQ(whole.text, "12345\n");
    EXPECT_FALSE(whole.isCut);
    const auto cut = servers.ask("", "SELECT 123456", isFinal);
    EXPECT_EQ(cut.text, "123456");
    EXPECT_TRUE(cut.isCut);
}

TEST_F(FleetReports, SayWhyTheDatabaseCannotBeAsked)
{
    EXPECT_EQ(server.select("DROP TABLE edition"), "");
    EXPECT_THAT(failure({}), HasSubstr("the database kesto has no tables: make them by `kesto-ingest tables | "));
    EXPECT_EQ(server.select("CREATE VIEW edition AS SELECT toUInt64(7) AS edition"), "");
    EXPECT_EQ(failure({}),
              "kesto: the tables in the database kesto are of edition 7, and this program reads edition 1: update the "
              "older of the two\n");
    EXPECT_THAT(failure({"--fleet-database", "other"}), HasSubstr("the database other has no tables"));
    support::writeFile(directory / "credentials", "user = \"stranger\"\npassword = \"wrong\"\n");
    std::filesystem::permissions(directory / "credentials", std::filesystem::perms(0644));
    EXPECT_THAT(failure({"--credentials", directory / "credentials"}), HasSubstr("everybody may read it: chmod o-r"));
    std::filesystem::permissions(directory / "credentials", std::filesystem::perms(0600));
    EXPECT_THAT(failure({"--credentials", directory / "credentials"}),
                HasSubstr("the database refuses the user stranger: name a file with another user and password by "
                          "--credentials"));
    EXPECT_EQ(server.select("DROP TABLE edition"), "");
    EXPECT_EQ(server.select("CREATE VIEW edition AS SELECT toUInt64(1) AS edition"), "");
    EXPECT_EQ(server.select("DROP TABLE stretches"), "");
    EXPECT_THAT(failure({}), HasSubstr("the database of the fleet refuses a question: "));
    server.end();
    EXPECT_THAT(failure({}), HasSubstr("the database of the fleet cannot be asked: http://127.0.0.1:"));
}

TEST_F(FleetReports, DoNotTakeAnotherProgramForTheDatabase)
{
    const kesto_ingest::Metrics metrics;
    const kesto_ingest::MetricsServer other(metrics, 0);
    const Finished finished = tool.run({"report", "--fleet", fmt::format("http://127.0.0.1:{}", other.port())});
    EXPECT_EQ(finished.status, 1);
    EXPECT_EQ(finished.output, "");
    EXPECT_THAT(finished.errors, HasSubstr("the database of the fleet cannot be asked: http://127.0.0.1:"));
}

TEST_F(FleetReports, AreAskedForByARightCommandLine)
{
    EXPECT_EQ(tool.run({"report", "--by", "model"}).status, 2);
    EXPECT_EQ(tool.run({"report", "--unit", unit1}).status, 2);
    EXPECT_EQ(tool.run({"report", "--fleet", "127.0.0.1:8123"}).status, 2);
    EXPECT_EQ(tool.run(withFleet({"--unit", "x'"})).status, 2);
    EXPECT_EQ(tool.run(withFleet({"--database", "x"})).status, 2);
}

} // namespace
} // namespace kesto_tool
