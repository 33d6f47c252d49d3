// SPDX-License-Identifier: Apache-2.0
// `kesto report --csv` of made-up weeks: the tables that other programs read hold against the truth.
#include "support/TemporaryDirectory.h"
#include "support/weeks/WeeksFile.h"
#include "tools/kesto/Tool.h"
#include "tools/kesto/report/weeks/Figures.h"

#include <chrono>
#include <fmt/format.h>
#include <gtest/gtest.h>
#include <regex>
#include <sstream>
#include <string>
#include <vector>

namespace kesto_tool {
namespace {

// The cells of a line; commas in quotes are text.
std::vector<std::string> cellsOf(const std::string& line)
{
    std::vector<std::string> cells(1);
    bool isQuoted = false;
    for (const char character : line)
        if (character == '"')
            isQuoted = !isQuoted;
        else if (character == ',' && !isQuoted)
            cells.emplace_back();
        else
            cells.back() += character;
    return cells;
}

Figures figuresOfCsv(const std::string& csv, const std::string& table)
{
    Figures figures;
    std::istringstream lines(csv);
    std::string line;
    std::getline(lines, line);
    EXPECT_EQ(line, table + ",seconds,sessions,faults,mean_volume");
    while (std::getline(lines, line)) {
        const auto cells = cellsOf(line);
        if (cells.size() != 5) {
            ADD_FAILURE() << line;
            continue;
        }
        const std::string name = table + " " + (cells[0].empty() ? "?" : cells[0]) + " ";
        figures[name + "seconds"] = std::stod(cells[1]);
        figures[name + "sessions"] = std::stod(cells[2]);
        figures[name + "faults"] = std::stod(cells[3]);
        if (!cells[4].empty())
            figures[name + "mean volume"] = std::stod(cells[4]);
    }
    return figures;
}

// Those of the table that CSV has, too.
Figures chosen(const Figures& figures, const std::string& table)
{
    Figures found;
    const std::regex wanted(table + " [^ ]* (seconds|sessions|faults|mean volume)");
    for (const auto& [name, value] : figures)
        if (std::regex_match(name, wanted))
            found[name] = value;
    return found;
}

std::string dateText(std::chrono::sys_days day)
{
    const std::chrono::year_month_day date(day);
    return fmt::format("{}-{:02}-{:02}", static_cast<int>(date.year()), static_cast<unsigned>(date.month()),
                       static_cast<unsigned>(date.day()));
}

class WeeksTool : public testing::TestWithParam<std::size_t> { };

TEST_P(WeeksTool, WritesTablesThatAreTrue)
{
    const ZoneDays& days = zonesWithDays()[GetParam()];
    const support::TemporaryDirectory directory;
    Tool tool(directory.path());
    tool.setVariable(std::string("TZ=") + days.zone);
    const weeks::Weeks made = weeks::makeWeeks({.seed = 5, .sessions = 300, .midnights = days.midnights});
    weeks::writeWeeks(made, directory.path() / "state/analytics.sqlite3");
    const TimeSpan span{days.midnights.front(), days.midnights.back()};
    for (const bool isRecording : {false, true}) {
        const Figures truth = figuresOf(made, days, span, isRecording);
        for (const std::string table : {"day", "application", "device", "format"}) {
            Tool::Arguments arguments{"report",  "--csv",
                                      "--by",    table,
                                      "--since", dateText(days.first),
                                      "--until", dateText(std::chrono::sys_days(days.first) + std::chrono::days(14))};
            if (isRecording)
                arguments.emplace_back("--recording");
            EXPECT_EQ(differences(chosen(truth, table), figuresOfCsv(tool.print(arguments), table)), "");
            EXPECT_GE(chosen(truth, table).size(), 3U);
        }
    }
}

INSTANTIATE_TEST_SUITE_P(Zones, WeeksTool, testing::Range<std::size_t>(0, zonesWithDays().size()));

} // namespace
} // namespace kesto_tool
