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
    EXPECT_THAT(support::namesIn(directory_.path()), testing::Not(testing::Contains(testing::EndsWith(".new"))));
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
        if (!Browser::isInstalled())
            GTEST_SKIP() << "there is no chromium: apt-get install chromium";
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
                    " faults AS (SELECT session, happened, payload ->> 'active_devices' AS device FROM events"
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

// The texts of the cells of each row of the table with that summary. The browser closes and quotes everything.
std::vector<std::vector<std::string>> rowsOf(const std::string& document, const std::string& summary)
{
    const auto from = document.find("<summary>" + summary + "</summary>");
    EXPECT_NE(from, std::string::npos) << summary;
    const std::string table = document.substr(from, document.find("</table>", from) - from);
    std::vector<std::vector<std::string>> rows;
    const std::regex row("<tr>(.*?)</tr>");
    const std::regex cell("<t[hd][^>]*>(.*?)</t[hd]>");
    for (std::sregex_iterator found(table.begin(), table.end(), row), end; found != end; ++found) {
        const std::string cells = (*found)[1];
        rows.emplace_back();
        for (std::sregex_iterator each(cells.begin(), cells.end(), cell); each != end; ++each)
            rows.back().push_back(std::regex_replace(std::string((*each)[1]), std::regex("</?bdi>"), ""));
    }
    return rows;
}

TEST_F(ReportHtmlInBrowser, ShowsTheFiguresThatSQLFinds)
{
    const Browser::Opened opened = browser_.open(page_);
    EXPECT_THAT(opened.messages, IsEmpty());
    const auto days = rowsOf(opened.document, "Hours as a table");
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

TEST_F(ReportHtmlInBrowser, ShowsTheFiguresOfDevicesAndVolumesThatSQLFinds)
{
    const Browser::Opened opened = browser_.open(page_);
    const auto devices = rowsOf(opened.document, "Devices as a table");
    ASSERT_GE(devices.size(), 6U);
    for (std::size_t row = 1; row < devices.size(); ++row) {
        const std::string isIt =
            devices[row][0] == "not told" ? "device IS NULL" : "device = '" + devices[row][0] + "'";
        EXPECT_EQ(devices[row][1], ask("SELECT printf('%.2f', sum(ended - began) / 3600) FROM played WHERE " + isIt));
        EXPECT_EQ(devices[row][3], ask("SELECT count(DISTINCT session) FROM played WHERE " + isIt));
        EXPECT_EQ(devices[row][4], ask("SELECT count(*) FROM faults WHERE " + isIt)) << devices[row][0];
    }
    const auto volumes = rowsOf(opened.document, "Volume as a table");
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
