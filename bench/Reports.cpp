// SPDX-License-Identifier: Apache-2.0
// The report and the sessions of a week in which 100,000 sessions sent 1.4 million messages, beside the shell of
// SQLite, which answers the first question of the same file by SQL. All of it lies in the span of the report: the worst
// case.
#include "Groups.h"
#include "support/ChildProcess.h"
#include "support/Report.h"
#include "support/TemporaryDirectory.h"
#include "support/weeks/WeeksFile.h"

#include <chrono>
#include <filesystem>
#include <stdexcept>
#include <string>
#include <sys/wait.h>
#include <vector>

namespace bench {
namespace {

constexpr const char* byDayAndApplication =
    "SELECT date(began, 'unixepoch', 'localtime') AS day, sum(seconds), count(DISTINCT session) FROM stretches"
    " WHERE recording = 0 GROUP BY day;"
    "SELECT s.application, sum(x.seconds), count(DISTINCT x.session), sum(x.seconds * x.volume) / sum(x.seconds)"
    " FROM stretches x LEFT JOIN sessions s ON s.id = x.session WHERE x.recording = 0 GROUP BY s.application"
    " ORDER BY 2 DESC;"
    "SELECT s.application, count(*), sum(e.payload ->> 'late_cycles') FROM events e LEFT JOIN sessions s"
    " ON s.id = e.session WHERE e.name GLOB 'com.quarn.kesto.Error.*' GROUP BY s.application";

// They end at the present, and begin behind the beginning of the report, which is a midnight.
weeks::Weeks makeBusyWeek()
{
    constexpr std::size_t idleMessages = 5; // with these it is 1.4 million messages
    const double present = std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count();
    return weeks::makeWeeks(
        {.sessions = 100'000, .midnights = weeks::midnightsBefore(present, 6), .idleMessages = idleMessages});
}

double millisecondsOf(const std::vector<std::string>& command, const std::filesystem::path& output)
{
    std::filesystem::remove(output);
    const auto start = Clock::now();
    const auto process =
        ChildProcess::execute(command, {"PATH=/usr/bin:/bin", "TZ=Europe/Berlin", "LANG=C.UTF-8"}, output);
    siginfo_t ended = {};
    ::waitid(P_PID, static_cast<id_t>(process.identifier()), &ended, WEXITED | WNOWAIT);
    const double milliseconds = nanosecondsSince(start) / 1e6;
    if (ended.si_code != CLD_EXITED || ended.si_status != 0 || std::filesystem::file_size(output) == 0)
        throw std::runtime_error("the program failed: " + command.front());
    return milliseconds;
}

} // namespace

void measureReports(const BenchOptions& options, Report& report)
{
    constexpr double longest = 1000; // milliseconds
    const support::TemporaryDirectory directory;
    const std::filesystem::path database = directory / "analytics.sqlite3";
    const std::filesystem::path output = directory / "output";
    const std::string shell = "/usr/bin/sqlite3";
    if (!std::filesystem::exists(shell))
        return report.skip("reports of 100,000 sessions", "there is no sqlite3: install it");
    showProgress("filling a store with 100,000 sessions");
    weeks::writeWeeks(makeBusyWeek(), database);
    const std::string tool = KESTO_BENCH_TOOL;
    const auto measure = [&](std::vector<std::string> command) {
        if (command.front() == tool)
            command.insert(command.end(), {"--database", database.native()});
        return [&output, command] { return millisecondsOf(command, output); };
    };
    const auto times =
        compete(options, "reports of 100,000 sessions", measure({tool, "report"}), measure({tool, "report", "--json"}),
                measure({tool, "report", "--html", "-"}), measure({tool, "sessions", "--count", "1000000", "--csv"}),
                measure({shell, database.native(), byDayAndApplication}));
    const PeerFigure peer{"sqlite3", times.back()};
    const auto target = Target::figureAtMost(longest);
    report.add({"a week of 100,000 sessions, by day and application", "ms", times[0], peer, target});
    report.add({"the same with all tables, as JSON", "ms", times[1], peer, target});
    report.add({"the same as a page", "ms", times[2], peer, target});
    report.add({"all its sessions, a line each", "ms", times[3], {}, target});
}

} // namespace bench
