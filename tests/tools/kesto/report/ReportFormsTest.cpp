// SPDX-License-Identifier: Apache-2.0
// A report as text, as CSV and as JSON.
#include "kesto/Terminal.h"
#include "kesto/files/JsonReader.h"
#include "kesto/report/ReportCsv.h"
#include "kesto/report/ReportJson.h"
#include "kesto/report/ReportText.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sstream>

namespace kesto_tool {
namespace {

using testing::AllOf;
using testing::EndsWith;
using testing::HasSubstr;
using testing::Not;
using testing::StartsWith;

constexpr double dayBegins = 1'794'096'000; // 2026-11-08 00:00, a Sunday
constexpr double hour = 3600;

History historyForForms()
{
    History history;
    history.now = dayBegins + 48 * hour;
    history.stretches = {{.session = 1,
                          .began = dayBegins,
                          .seconds = 8 * hour,
                          .device = "speaker",
                          .format = "S16LE/48000/2",
                          .volume = 0.375},
                         {.session = 2,
                          .began = dayBegins + 24 * hour,
                          .seconds = 2 * hour,
                          .device = "dock,\"left\"",
                          .format = "S16LE/48000/2",
                          .volume = 0},
                         {.session = 3, .began = dayBegins + 25 * hour, .seconds = 1.5, .device = {}, .format = {}}};
    history.stretches[1].hasVanished = true;
    history.stretches[2].isRunning = true;
    HistorySession player;
    player.id = 1;
    player.application = "org.example.player";
    HistorySession hostile;
    hostile.id = 2;
    hostile.application = "a\x1B[2Jb\u202Ec,\nd";
    history.sessions = {player, hostile};
    history.faults = {
        {.session = 1, .happened = dayBegins + 5, .kind = "IssueDetector", .device = "speaker", .lateCycles = 7},
        {.session = 1, .happened = dayBegins + 9, .kind = "IssueDetector", .device = "speaker", .lateCycles = 2}};
    return history;
}

Report reportForForms(const History& history = historyForForms())
{
    return makeReport(history, {.from = dayBegins, .until = dayBegins + 48 * hour}, false,
                      {.afterMidnight = {}, .isUTC = true});
}

std::string textBy(ReportBy by, const ReportLayout& layout = {})
{
    const std::string text = reportText(reportForForms(), {by}, layout);
    return text.substr(text.find('\n') + 1);
}

TEST(ReportAsText, HasTablesWithBars)
{
    EXPECT_EQ(reportText(reportForForms(), {ReportBy::Day, ReportBy::Application}, {.width = 80, .isUTF8 = true}),
              "10.0 h played in 3 sessions · 2 faults, 0.20 an hour · 1 vanished, 1 still running\n"
              "DAY           PLAYED\n"
              "Sun 8          8.0 h  ██████████████████████████████\n"
              "Mon 9          2.0 h  ███████▌\n"
              "APPLICATION          PLAYED  SHARE  VOLUME  FAULTS  /HOUR\n"
              "org.example.player    8.0 h   80 %    38 %       2   0.25  █████████████████████\n"
              "a?[2Jb?c,?d           2.0 h   20 %               0   0.00  █████▎\n"
              "(unknown)               2 s    0 %               0         ▏\n"
              "2.0 h of it muted, which no mean volume counts\n"
              "2 s of it by streams that told no volume\n"
              "streams at the same time each count: a day may have more than 24 h\n");
}

TEST(ReportAsText, HasEachTable)
{
    const ReportLayout layout{.width = 60, .isUTF8 = false};
    EXPECT_THAT(textBy(ReportBy::Device, layout),
                StartsWith("DEVICE        PLAYED  SHARE  VOLUME  FAULTS  /HOUR\n"
                           "speaker        8.0 h   80 %    38 %       2   0.25  ########\n"
                           "dock,\"left\"    2.0 h   20 %               0   0.00  ##\n"
                           "(unknown)        2 s    0 %               0         #\n"));
    EXPECT_THAT(textBy(ReportBy::Format, layout),
                StartsWith("FORMAT          PLAYED  SHARE  VOLUME  FAULTS  /HOUR\n"
                           "S16LE/48000/2   10.0 h  100 %    38 %       2   0.20  ######\n"));
    EXPECT_THAT(textBy(ReportBy::Fault, layout),
                StartsWith("FAULT           FAULTS  SESSIONS\n"
                           "IssueDetector        2         1  ####################"));
    EXPECT_THAT(textBy(ReportBy::Volume, layout),
                AllOf(StartsWith("VOLUME        PLAYED  SHARE\n"
                                 "muted          2.0 h   20 %  ########\n"
                                 "to 6.25 %        0 s    0 %\n"),
                      HasSubstr("to 37.5 %      8.0 h   80 %  ##############################\n"),
                      HasSubstr("to 100 %         0 s    0 %\n"
                                "(unknown)        2 s    0 %  #\n")));
}

TEST(ReportAsText, IsCutToTheWidthOfTheTerminal)
{
    for (const std::size_t width : {40U, 55U, 61U, 62U, 80U, 200U}) {
        std::istringstream lines(textBy(ReportBy::Application, {.width = width, .isUTF8 = false}));
        constexpr std::size_t least = 50; // of a key and its figures
        for (std::string line; std::getline(lines, line) && !line.contains("of it");)
            EXPECT_LE(columnsOf(line), std::max(width, least)) << line;
    }
    EXPECT_THAT(textBy(ReportBy::Application, {.width = 55, .isUTF8 = true}), HasSubstr("org.example.pla…    8.0 h"));
    EXPECT_THAT(
        textBy(ReportBy::Application, {.width = std::string::npos, .isUTF8 = true}),
        HasSubstr("org.example.player    8.0 h   80 %    38 %       2   0.25  ██████████████████████████████\n"));
}

TEST(ReportAsText, MakesRoomForLongFigures)
{
    History history = historyForForms();
    history.stretches.resize(1);
    history.faults.resize(1);
    history.faults.insert(history.faults.end(), 99'999, history.faults[0]);
    history.stretches[0].seconds = 60;
    EXPECT_EQ(reportText(reportForForms(history), {ReportBy::Application}, {.width = 60, .isUTF8 = false}),
              "1 min played in 1 session; 100000 faults, 6000000.00 an hour\n"
              "APPLICATION        PLAYED  SHARE  VOLUME  FAULTS       /HOUR\n"
              "org.example.pla~    1 min  100 %    38 %  100000  6000000.00\n");
}

TEST(ReportAsText, HasShortTimesInShortUnits)
{
    const auto textOf = [](double seconds) {
        History history = historyForForms();
        history.stretches.resize(1);
        history.stretches[0].seconds = seconds;
        const std::string text = reportText(makeReport(history, {.from = dayBegins, .until = dayBegins + 9000 * hour},
                                                       false, {.afterMidnight = {}, .isUTC = true}),
                                            {}, {});
        return text.substr(0, text.find(" played"));
    };
    EXPECT_EQ(textOf(0.4), "0 s");
    EXPECT_EQ(textOf(59.4), "59 s");
    EXPECT_EQ(textOf(59.6), "1 min");
    EXPECT_EQ(textOf(3569), "59 min");
    EXPECT_EQ(textOf(3571), "1.0 h");
    EXPECT_EQ(textOf(999.9 * hour), "999.9 h");
    EXPECT_EQ(textOf(8000 * hour), "8000 h");
}

TEST(ReportAsText, HasNoLineForWhatDoesNotApply)
{
    History history = historyForForms();
    history.stretches.resize(1);
    history.faults.clear();
    const std::string text = reportText(reportForForms(history), {ReportBy::Day}, {});
    EXPECT_EQ(text,
              "8.0 h played in 1 session · no faults\n"
              "DAY           PLAYED\n"
              "Sun 8          8.0 h  ██████████████████████████████\n"
              "Mon 9            0 s\n");
}

TEST(ReportAsText, SaysThatStreamsPlayedAtOnce)
{
    History history = historyForForms();
    history.stretches[1].began = dayBegins;
    EXPECT_THAT(reportText(reportForForms(history), {ReportBy::Day}, {}),
                HasSubstr("streams at the same time each count"));
    history.stretches.resize(1);
    EXPECT_THAT(reportText(reportForForms(history), {ReportBy::Day}, {}), Not(HasSubstr("at the same time")));
}

TEST(ReportAsText, SaysWhatToDoWhereNothingWasPlayed)
{
    EXPECT_EQ(reportText(reportForForms({}), {ReportBy::Day}, {}),
              "Nothing that matches was played between 2026-11-08 00:00 and 2026-11-10 00:00.\n"
              "Look further back with --since 30d. If that is empty too: nothing may report to kestod (see kesto "
              "status), or\nstretches = false in analytics.toml turns playing times off.\n");
}

TEST(ReportAsText, NamesDaysOfALongSpanByTheirDatesFromTheFirstSoundOn)
{
    const Report report =
        makeReport(historyForForms(), {.from = dayBegins - 40 * 24 * hour, .until = dayBegins + 48 * hour}, false,
                   {.afterMidnight = {}, .isUTC = true});
    EXPECT_THAT(reportText(report, {ReportBy::Day}, {}), HasSubstr("DAY           PLAYED\n2026-11-08     8.0 h  █"));
}

TEST(ReportAsText, ShowsTheFirstLinesOfALongTable)
{
    History history;
    for (int id = 1; id <= 25; ++id) {
        history.stretches.push_back(
            {.session = id, .began = dayBegins + id * hour, .seconds = id * 60.0, .device = {}, .format = {}});
        HistorySession session;
        session.id = id;
        session.application = "org." + std::to_string(id);
        history.sessions.push_back(session);
    }
    const Report report = reportForForms(history);
    const std::string both = reportText(report, {ReportBy::Day, ReportBy::Application}, {});
    EXPECT_THAT(both,
                AllOf(HasSubstr("\norg.6 "), Not(HasSubstr("\norg.5 ")),
                      HasSubstr("and 5 more with 15 min: --by application shows all\n")));
    EXPECT_THAT(reportText(report, {ReportBy::Application}, {}),
                AllOf(HasSubstr("\norg.1 "), Not(HasSubstr("more with"))));
}

// --- CSV

TEST(ReportAsCsv, HasOneRowForEachDay)
{
    EXPECT_EQ(reportCsv(reportForForms(), ReportBy::Day),
              "day,seconds,sessions,faults,mean_volume\n"
              "2026-11-08,28800.0,1,2,0.375\n"
              "2026-11-09,7201.5,2,0,\n");
    EXPECT_EQ(reportCsv(reportForForms({}), ReportBy::Day),
              "day,seconds,sessions,faults,mean_volume\n"
              "2026-11-08,0.0,0,0,\n"
              "2026-11-09,0.0,0,0,\n");
}

TEST(ReportAsCsv, QuotesWhatWouldDivideARow)
{
    EXPECT_EQ(reportCsv(reportForForms(), ReportBy::Application),
              "application,seconds,sessions,faults,mean_volume\n"
              "org.example.player,28800.0,1,2,0.375\n"
              "\"a?[2Jb?c,?d\",7200.0,1,0,\n"
              ",1.5,1,0,\n");
    EXPECT_EQ(reportCsv(reportForForms(), ReportBy::Device),
              "device,seconds,sessions,faults,mean_volume\n"
              "speaker,28800.0,1,2,0.375\n"
              "\"dock,\"\"left\"\"\",7200.0,1,0,\n"
              ",1.5,1,0,\n");
    EXPECT_EQ(reportCsv(reportForForms(), ReportBy::Format),
              "format,seconds,sessions,faults,mean_volume\n"
              "S16LE/48000/2,36000.0,2,2,0.375\n"
              ",1.5,1,0,\n");
}

TEST(ReportAsCsv, HasVolumesAndFaults)
{
    EXPECT_EQ(reportCsv(reportForForms(), ReportBy::Volume),
              "volume,seconds\nmuted,7200.0\n0.0625,0.0\n0.125,0.0\n0.1875,0.0\n0.25,0.0\n0.3125,0.0\n0.375,28800.0\n"
              "0.4375,0.0\n0.5,0.0\n0.5625,0.0\n0.625,0.0\n0.6875,0.0\n0.75,0.0\n0.8125,0.0\n0.875,0.0\n0.9375,0.0\n"
              "1.0,0.0\n,1.5\n");
    EXPECT_EQ(reportCsv(reportForForms(), ReportBy::Fault), "fault,faults,sessions\nIssueDetector,2,1\n");
}

TEST(ReportAsCsv, QuotesQuotes)
{
    History history = historyForForms();
    history.stretches.resize(1);
    history.stretches[0].device = "the \"left\" one";
    EXPECT_EQ(reportCsv(reportForForms(history), ReportBy::Device),
              "device,seconds,sessions,faults,mean_volume\n"
              "\"the \"\"left\"\" one\",28800.0,1,0,0.375\n"
              "speaker,0.0,0,2,\n");
}

TEST(ReportAsCsv, HasNoFormulaForASpreadsheet)
{
    for (const std::string_view name : {"=cmd|calc", "+x", "-dev", "@SUM(1)"})
        EXPECT_EQ(csvField(name), "'" + std::string(name));
    EXPECT_EQ(csvField("a=b"), "a=b");
    EXPECT_EQ(csvField(""), "");
}

TEST(DecimalText, HasAPointAndNoIdleZeros)
{
    EXPECT_EQ(decimalText(0, 3), "0.0");
    EXPECT_EQ(decimalText(3600, 3), "3600.0");
    EXPECT_EQ(decimalText(0.12345, 3), "0.123");
    EXPECT_EQ(decimalText(1e15, 3), "1000000000000000.0");
    EXPECT_EQ(decimalText(100.100, 3), "100.1");
}

// --- JSON

TEST(ReportAsJson, HasAllFigures)
{
    const std::string json = reportJson(reportForForms());
    EXPECT_THAT(json, EndsWith("}\n"));
    const auto report = parseJson(json)->dictionary();
    ASSERT_TRUE(report);
    const auto at = [&report](const char* key) { return report->find(key)->text(); };
    EXPECT_EQ(at("from"), "1794096000");
    EXPECT_EQ(at("until"), "1794268800");
    EXPECT_EQ(at("recording"), "0");
    EXPECT_EQ(at("seconds"), "36001.5");
    EXPECT_EQ(at("muted_seconds"), "7200");
    EXPECT_EQ(at("no_volume_seconds"), "1.5");
    EXPECT_EQ(at("mean_volume"), "0.375");
    EXPECT_EQ(at("sessions"), "3");
    EXPECT_EQ(at("faults"), "2");
    EXPECT_EQ(at("running"), "1");
    EXPECT_EQ(at("vanished"), "1");
    EXPECT_EQ(at("sessions_with_faults"), "1");
    EXPECT_EQ(at("overlapping"), "1");
    EXPECT_THAT(
        at("days"),
        HasSubstr(R"({"day":"2026-11-08","from":1794096000,"until":1794182400,"seconds":28800,"muted_seconds":0,)"
                  R"("no_volume_seconds":0,"mean_volume":0.375,"sessions":1,"faults":2,"faults_an_hour":0.25})"));
    EXPECT_THAT(at("applications"), HasSubstr("\"application\":\"a\\u001B[2Jb\u202Ec,\\nd\",\"seconds\":7200,"));
    EXPECT_THAT(at("applications"), HasSubstr(R"("mean_volume":null)"));
    EXPECT_THAT(at("devices"), HasSubstr(R"("device":"dock,\"left\"")"));
    EXPECT_THAT(at("formats"), HasSubstr(R"({"format":"","seconds":1.5,)"));
    EXPECT_EQ(at("fault_kinds"), R"([{"fault":"IssueDetector","faults":2,"sessions":1}])");
    EXPECT_THAT(at("volumes"), HasSubstr(R"({"volume":0.375,"seconds":28800})"));
    EXPECT_THAT(
        at("worst_sessions"),
        HasSubstr(
            R"({"session":1,"application":"org.example.player","service":"","process":"","process_id":null,)"
            R"("user":null,"devices":"speaker","late_cycles":9,"running":false,"vanished":false,"seconds":28800,)"));
}

} // namespace
} // namespace kesto_tool
