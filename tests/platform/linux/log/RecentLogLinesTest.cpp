// SPDX-License-Identifier: Apache-2.0
// The kept lines of the log.
#include "platform/linux/log/RecentLogLines.h"

#include "foundation/text/LocalTime.h"
#include "platform/linux/log/LinuxLog.h"

#include <algorithm>
#include <fmt/format.h>
#include <gmock/gmock.h>
#include <thread>
#include <vector>

namespace platform {
namespace {

using testing::AllOf;
using testing::EndsWith;
using testing::HasSubstr;
using testing::Not;

constexpr double noon = 1'800'000'000.9990234375; // of the last millisecond before the next second

std::string timeText()
{
    return foundation::localTimeText(noon, "{:%Y-%m-%d %H:%M:%S}") + ".999";
}

auto lineCount(const RecentLogLines& lines)
{
    return static_cast<std::size_t>(std::ranges::count(lines.text(), '\n'));
}

TEST(RecentLogLines, TellsTimeLevelAndTagOfEachLineTheOldestFirst)
{
    RecentLogLines lines;
    EXPECT_EQ(lines.text(), "");
    lines.add(noon, LogLevel::Error, "kerr", "first");
    lines.add(noon, LogLevel::Default, "kerb", "second");
    EXPECT_EQ(lines.text(), timeText() + " error   kerr first\n" + timeText() + " default kerb second\n");
}

TEST(RecentLogLines, KeepsTheLastLinesOnly)
{
    RecentLogLines lines;
    for (std::size_t line = 0; line <= RecentLogLines::mostLines; ++line)
        lines.add(noon, LogLevel::Info, "kerr", fmt::format("line {}", line));
    EXPECT_EQ(lineCount(lines), RecentLogLines::mostLines);
    EXPECT_THAT(lines.text(),
                AllOf(Not(HasSubstr("line 0\n")), HasSubstr("line 1\n"),
                      EndsWith(fmt::format("line {}\n", RecentLogLines::mostLines))));
}

TEST(RecentLogLines, KeepsNoMoreBytesThanAllowed)
{
    RecentLogLines lines;
    for (int line = 0; line < 100; ++line)
        lines.add(noon, LogLevel::Info, "kerr", std::string(RecentLogLines::longestLine, 'x'));
    EXPECT_EQ(lineCount(lines), RecentLogLines::mostBytes / RecentLogLines::longestLine);
}

TEST(RecentLogLines, CutsALongLineBetweenCharacters)
{
    RecentLogLines lines;
    lines.add(noon, LogLevel::Info, "kerr", std::string(RecentLogLines::longestLine - 1, 'x') + "é and more");
    EXPECT_THAT(lines.text(), EndsWith(" " + std::string(RecentLogLines::longestLine - 1, 'x') + "\n"));
}

TEST(RecentLogLines, ManyThreadsWriteWhileOneReads)
{
    RecentLogLines lines;
    {
        std::vector<std::jthread> threads;
        for (int thread = 0; thread < 3; ++thread)
            threads.emplace_back([&lines] {
                for (int line = 0; line < 1000; ++line)
                    lines.add(noon, LogLevel::Info, "kerr", "line");
            });
        for (int read = 0; read < 5; ++read)
            EXPECT_LE(lineCount(lines), RecentLogLines::mostLines);
    }
    EXPECT_EQ(lineCount(lines), RecentLogLines::mostLines);
}

TEST(RecentLogLines, TheLogKeepsWhatItWroteWherever)
{
    static LogCategory category{"com.quarn.kesto", "kerr"};
    LinuxLog log(LogThresholds(), {.journalSocket = {}, .descriptor = -1});
    log.write({category, LogLevel::Error, {"KestoReportingSession", 42}, "one\nline"});
    EXPECT_THAT(log.recentLines().text(), EndsWith(" error   kerr     KestoReportingSession:42    one\\nline\n"));
}

} // namespace
} // namespace platform
