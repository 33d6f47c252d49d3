// SPDX-License-Identifier: Apache-2.0
// `kesto report --html` from a shell: the file that it writes, and, in a real browser, its figures beside those that
// SQL finds in the same event store.
#include "platform/linux/store/SqliteConnection.h"
#include "support/TemporaryDirectory.h"
#include "support/weeks/WeeksFile.h"
#include "tools/kesto/Tool.h"
#include "tools/kesto/report/page/Browser.h"
#include "tools/kesto/report/weeks/Figures.h"

#include <filesystem>
#include <fmt/format.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <map>
#include <memory>
#include <regex>
#include <sstream>
#include <string>
#include <vector>

namespace kesto_tool {
namespace {

namespace fs = std::filesystem;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::StartsWith;

class ReportHtml : public testing::Test {
protected:
    ReportHtml() : days_(zonesWithDays()[0])
    {
        tool_.setVariable(std::string("TZ=") + days_.zone);
        weeks::writeWeeks(weeks::makeWeeks({.seed = 7, .sessions = 600, .midnights = days_.midnights}), store_);
    }

    [[nodiscard]] static Tool::Arguments report(const Tool::Arguments& further)
    {
        Tool::Arguments all{"report", "--since", "2025-10-20", "--until", "2025-11-03"};
        all.insert(all.end(), further.begin(), further.end());
        return all;
    }

    const ZoneDays& days_;
    support::TemporaryDirectory directory_;
    Tool tool_{directory_.path()};
    fs::path store_ = directory_.path() / "state/analytics.sqlite3";
    fs::path page_ = directory_.path() / "page.html";
};

// --- the file

TEST_F(ReportHtml, WritesAPage)
{
    EXPECT_EQ(tool_.print(report({"--html", page_})), "");
    const std::string page = support::readFile(page_);
    EXPECT_THAT(page, StartsWith("<!doctype html>"));
    EXPECT_THAT(page, HasSubstr("<title>Audio report, 20 October to 2 November 2025, "));
    EXPECT_THAT(page, HasSubstr("days as in <bdi>Europe/Berlin</bdi>"));
    EXPECT_THAT(page, HasSubstr("from <bdi>" + store_.native() + "</bdi>"));
    EXPECT_THAT(page, HasSubstr("Sun 26 Oct had 25 h 0 min."));
    EXPECT_LT(page.size(), 100'000U);
}

TEST_F(ReportHtml, WritesToStandardOutput)
{
    EXPECT_THAT(tool_.print(report({"--html", "-"})), StartsWith("<!doctype html>"));
    EXPECT_FALSE(fs::exists("-"));
}

TEST_F(ReportHtml, ReplacesAFileAtOnce)
{
    support::writeFile(page_, "old");
    fs::create_hard_link(page_, directory_ / "link");
    EXPECT_EQ(tool_.print(report({"--html", page_})), "");
    EXPECT_EQ(support::readFile(directory_ / "link"), "old") << "written beside it, and renamed";
    EXPECT_THAT(support::readFile(page_), StartsWith("<!doctype html>"));
    EXPECT_THAT(support::namesIn(directory_.path()), testing::Not(testing::Contains(StartsWith(".kesto"))));
}

TEST_F(ReportHtml, SaysThatItCannotWrite)
{
    const Finished finished = tool_.run(report({"--html", directory_ / "nowhere/page.html"}));
    EXPECT_EQ(finished.status, 1);
    EXPECT_EQ(finished.errors,
              "kesto: cannot write " + (directory_ / "nowhere/page.html").native() + ": No such file or directory\n");
}

TEST_F(ReportHtml, ExcludesOtherForms)
{
    for (const Tool::Arguments& other : {Tool::Arguments{"--json"}, {"--csv"}, {"--by", "day"}}) {
        Tool::Arguments both = other;
        both.insert(both.end(), {"--html", page_});
        EXPECT_EQ(tool_.run(report(both)).status, 2) << other.front();
    }
    EXPECT_FALSE(fs::exists(page_));
}

TEST_F(ReportHtml, TellsRecordingsAndDaysOfUTC)
{
    EXPECT_THAT(tool_.print(report({"--recording", "--html", "-"})), HasSubstr("<h1>Report of recordings</h1>"));
    EXPECT_THAT(tool_.print(report({"--utc", "--html", "-"})), HasSubstr("days as in <bdi>UTC</bdi>"));
}

// --- in a browser

class ReportHtmlInBrowser : public ReportHtml {
protected:
    void SetUp() override
    {
        if (!Browser::missing().empty())
            GTEST_SKIP() << Browser::missing();
        ASSERT_EQ(tool_.print(report({"--html", page_})), "");
    }

    // The first column of the first row.
    [[nodiscard]] std::string ask(const std::string& question) const
    {
        auto connection = platform::SqliteConnection::open(store_);
        const auto statement =
            (*connection)
                ->prepare(
                    "WITH played AS (SELECT s.session, s.began, s.began + s.seconds AS ended, s.device, s.volume, "
                    "e.application"
                    " FROM (SELECT session, recording, began, seconds, device, volume FROM stretches UNION ALL"
                    " SELECT session, recording, began, (SELECT wall_time FROM store) - began, device, volume FROM "
                    "open_stretches)"
                    " s JOIN sessions e ON e.id = s.session WHERE s.recording = 0),"
                    " faults AS (SELECT session, happened, payload ->> 'active_devices' AS device,"
                    " payload ->> 'late_cycles' AS cycles FROM events"
                    " WHERE name = 'com.quarn.kesto.Error.IssueDetector' AND session IN (SELECT session FROM played)) "
                    + question);
        EXPECT_TRUE(statement.has_value() && statement->step().value_or(false)) << question;
        return std::string(statement->text(0));
    }

    // Two decimals, of what lies in that day.
    [[nodiscard]] std::string hours(std::size_t day, const std::string& condition) const
    {
        const std::string hours =
            ask(fmt::format("SELECT printf('%.2f', total(min(ended, {1}) - max(began, {0})) / 3600) FROM played WHERE"
                            " began < {1} AND ended > {0} AND {2}",
                            days_.midnights[day], days_.midnights[day + 1], condition));
        return hours == "0.00" ? "0" : hours;
    }

    Browser browser_;
};

// What stands between the two at each place. The browser closes everything.
std::vector<std::string> partsBetween(const std::string& text, const std::string& before, const std::string& behind)
{
    std::vector<std::string> parts;
    for (auto at = text.find(before); at != std::string::npos; at = text.find(before, at + 1)) {
        const auto from = at + before.size();
        parts.push_back(text.substr(from, text.find(behind, from) - from));
    }
    return parts;
}

// The texts of the cells of each row of the table that begins behind this.
std::vector<std::vector<std::string>> rowsOf(const std::string& document, const std::string& beginning)
{
    const auto from = document.find(beginning);
    EXPECT_NE(from, std::string::npos) << beginning;
    std::vector<std::vector<std::string>> rows;
    for (const std::string& row :
         partsBetween(document.substr(from, document.find("</table>", from) - from), "<tr>", "</tr>")) {
        rows.emplace_back();
        for (const std::string& cell : partsBetween(std::regex_replace(row, std::regex("<th"), "<td"), "<td", "</t")) {
            const std::string text = cell.substr(cell.find('>') + 1);
            rows.back().push_back(std::regex_replace(text, std::regex("</?bdi>"), ""));
        }
    }
    return rows;
}

std::string conditionOf(const std::string& device)
{
    return device == "not told" ? "device IS NULL" : "device = '" + device + "'";
}

TEST_F(ReportHtmlInBrowser, ShowsTheFiguresThatSQLFinds)
{
    const Browser::Opened opened = browser_.open(page_);
    EXPECT_THAT(opened.messages, IsEmpty());
    const auto days = rowsOf(opened.document, "<summary>Hours as a table");
    ASSERT_EQ(days.size(), 15U); // the head and 14 days
    ASSERT_EQ(days[0].size(), 7U); // the day, five applications, all
    const auto expectHours = [](const std::string& shown, const std::string& found, const std::string& what) {
        if (shown == "&lt;0.01")
            EXPECT_EQ(found, "0") << what;
        else
            EXPECT_EQ(shown, found) << what;
    };
    for (std::size_t day = 0; day < 14; ++day) {
        const auto& row = days[day + 1];
        ASSERT_EQ(row.size(), 7U);
        for (std::size_t column = 1; column < 6; ++column)
            expectHours(row[column], hours(day, "application = '" + days[0][column] + "'"),
                        row[0] + " " + days[0][column]);
        expectHours(row[6], hours(day, "1"), row[0]);
    }
    EXPECT_THAT(opened.document, HasSubstr("<dd>" + ask("SELECT count(DISTINCT session) FROM played") + "</dd>"));
    EXPECT_THAT(opened.document, HasSubstr("<dd>" + ask("SELECT count(*) FROM faults") + "</dd>"));
}

// By time; neither muted times nor those without a volume count.
const std::string meanVolume = "SELECT printf('%.0f %%', 100 * sum((ended - began) * volume) / sum(ended - began))"
                               " FROM played WHERE volume > 0";

TEST_F(ReportHtmlInBrowser, ShowsTheFiguresOfDevicesAndVolumesThatSQLFinds)
{
    const Browser::Opened opened = browser_.open(page_);
    const auto devices = rowsOf(opened.document, "<summary>Devices as a table");
    ASSERT_GE(devices.size(), 6U);
    for (std::size_t row = 1; row < devices.size(); ++row) {
        const std::string isIt = conditionOf(devices[row][0]);
        EXPECT_EQ(devices[row][1], ask("SELECT printf('%.2f', sum(ended - began) / 3600) FROM played WHERE " + isIt));
        EXPECT_EQ(devices[row][3], ask("SELECT count(DISTINCT session) FROM played WHERE " + isIt));
        EXPECT_EQ(devices[row][4], ask("SELECT count(*) FROM faults WHERE " + isIt)) << devices[row][0];
        EXPECT_EQ(devices[row][5],
                  ask("SELECT printf('%.2f', (SELECT count(*) FROM faults WHERE " + isIt
                      + ") * 3600.0 / sum(ended - began)) FROM played WHERE " + isIt));
        EXPECT_EQ(devices[row][6], ask(meanVolume + " AND " + isIt)) << devices[row][0];
    }
    EXPECT_THAT(opened.document, HasSubstr(">mean " + ask(meanVolume) + "<"));
    const auto volumes = rowsOf(opened.document, "<summary>Volume as a table");
    ASSERT_EQ(volumes.size(), 19U); // the head, muted, sixteen steps, not told
    const auto hoursAt = [&](const std::string& condition) {
        return ask("SELECT iif(total(ended - began) = 0, '0', printf('%.2f', total(ended - began) / 3600))"
                   " FROM played WHERE "
                   + condition);
    };
    EXPECT_EQ(volumes[1][1], hoursAt("volume = 0"));
    for (int step = 0; step < 16; ++step)
        EXPECT_EQ(volumes[static_cast<std::size_t>(step) + 2][1],
                  hoursAt(fmt::format("volume > {} / 16.0 AND volume <= {} / 16.0", step, step + 1)));
    EXPECT_EQ(volumes[18][1], hoursAt("volume IS NULL"));
}

TEST_F(ReportHtmlInBrowser, ShowsTheFaultsOfEachDeviceAndDayThatSQLFinds)
{
    const Browser::Opened opened = browser_.open(page_);
    const auto devices = rowsOf(opened.document, "<summary>Devices as a table"); // with whole names, in the same order
    const auto faults = rowsOf(opened.document, "<table class=\"heat");
    ASSERT_EQ(faults.size(), devices.size());
    ASSERT_GE(faults.size(), 6U);
    ASSERT_EQ(faults[0].size(), 17U); // the device, 14 days, all, and for each hour
    std::size_t withoutFault = 0;
    std::size_t unused = 0;
    for (std::size_t row = 1; row < faults.size(); ++row) {
        const std::string isIt = conditionOf(devices[row][0]);
        ASSERT_EQ(faults[row].size(), 17U);
        for (std::size_t day = 0; day < 14; ++day) {
            const std::string found =
                ask(fmt::format("SELECT iif((SELECT count(*) FROM played WHERE began < {1} AND ended > {0} AND {2}), "
                                "count(*), '–') FROM faults WHERE happened >= {0} AND happened < {1} AND {2}",
                                days_.midnights[day], days_.midnights[day + 1], isIt));
            EXPECT_EQ(faults[row][day + 1], found) << devices[row][0] << ", day " << day;
            withoutFault += found == "0" ? 1 : 0;
            unused += found == "–" ? 1 : 0;
        }
        EXPECT_EQ(faults[row][15], devices[row][4]);
        EXPECT_EQ(faults[row][16], devices[row][5]);
    }
    EXPECT_TRUE(withoutFault > 0 && unused > 0) << "both must be in the weeks, or nothing tells them apart";
}

// "1 h 30 min" as minutes.
double minutesIn(const std::string& text)
{
    double minutes = 0;
    double number = 0;
    std::string unit;
    for (std::istringstream words(text); words >> number >> unit;)
        minutes += unit == "h" ? number * 60 : unit == "min" ? number : number / 60;
    return minutes;
}

TEST_F(ReportHtmlInBrowser, ShowsTheWorstSessionsThatSQLFinds)
{
    const std::string bySession = ", worst AS (SELECT session, sum(cycles) AS cycles, count(*) AS faults FROM faults"
                                  " GROUP BY session) ";
    const auto rows = rowsOf(browser_.open(page_).document, "<table class=\"worst");
    ASSERT_EQ(rows.size(), 11U); // the head and ten sessions
    std::string shown;
    for (std::size_t row = 1; row < rows.size(); ++row) {
        const auto& cells = rows[row];
        ASSERT_EQ(cells.size(), 10U);
        const std::string isIt = "session = " + cells[0];
        EXPECT_EQ(cells[5] + " " + cells[6], ask(bySession + "SELECT faults || ' ' || cycles FROM worst WHERE " + isIt))
            << cells[0];
        EXPECT_NEAR(minutesIn(cells[4]), std::stod(ask("SELECT sum(ended - began) / 60 FROM played WHERE " + isIt)),
                    0.5)
            << cells[0];
        shown += (row == 1 ? "" : " ") + cells[6];
    }
    EXPECT_EQ(shown,
              ask(bySession
                  + "SELECT group_concat(cycles, ' ') FROM (SELECT cycles FROM worst ORDER BY cycles DESC"
                    " LIMIT 10)"));
}

// The build keeps these, for people who want to see it.
TEST_F(ReportHtmlInBrowser, IsPhotographedInBothSchemes)
{
    const fs::path folder = KESTO_PHOTOGRAPHS;
    fs::create_directories(folder);
    fs::copy_file(page_, folder / "report.html", fs::copy_options::overwrite_existing);
    std::map<Browser::Screen, std::string> images;
    for (const auto& [screen, name] :
         {std::pair{Browser::Screen::Light, "light.png"}, std::pair{Browser::Screen::Dark, "dark.png"}}) {
        fs::remove(folder / name);
        browser_.photograph(page_, folder / name, screen, 2300);
        images[screen] = support::readFile(folder / name);
        EXPECT_THAT(images[screen], StartsWith("\x89PNG"));
    }
    EXPECT_NE(images[Browser::Screen::Light], images[Browser::Screen::Dark]);
}

} // namespace
} // namespace kesto_tool
