// The report of a week in which 100,000 sessions sent 1.3 million messages, beside the shell of SQLite, which answers
// the same question of the same file by SQL. All of it lies in the span of the report, which is the worst case.
#include "Groups.h"
#include "platform/linux/store/SqliteConnection.h"
#include "platform/linux/store/tables/StoreSchema.h"
#include "support/ChildProcess.h"
#include "support/Report.h"
#include "support/TemporaryDirectory.h"

#include <filesystem>
#include <fmt/format.h>
#include <stdexcept>
#include <string>
#include <sys/wait.h>
#include <vector>

namespace bench {
namespace {

constexpr const char* fill =
    "PRAGMA synchronous = OFF; BEGIN;"
    "INSERT INTO kinds VALUES (1, 'com.quarn.kesto.Playback.Start', 'com.quarn.longformaudio.Playback.Start'),"
    " (2, 'com.quarn.kesto.Volume.State', 'com.quarn.longformaudio.Volume.State'),"
    " (3, 'com.quarn.kesto.Error.IssueDetector', 'com.quarn.longformaudio.Error.IssueDetector');"
    "CREATE TEMP TABLE numbers AS WITH RECURSIVE n(i) AS (SELECT 0 UNION ALL SELECT i + 1 FROM n WHERE i < 1299999)"
    " SELECT i FROM n;"
    "CREATE TEMP TABLE week AS SELECT strftime('%s', 'now') - 6 * 86400.0 AS began;"
    "INSERT INTO sources(id, boot, user, process, name, began) SELECT i + 1, 'boot', 1000, i + 1000, 'player', began"
    " FROM numbers, week WHERE i < 1000;"
    "INSERT INTO sessions(id, source, reporter, service, application, began, ended)"
    " SELECT i + 1, 1 + i % 1000, i, 'longformaudio', 'org.example.player' || i % 40, began + i * 5.1,"
    " began + i * 5.1 + 600 FROM numbers, week WHERE i < 100000;"
    "INSERT INTO stretches(holder, session, recording, began, seconds, device, format, channels, volume, ending)"
    " SELECT 1, 1 + i / 2, 0, began + (i / 2) * 5.1 + (i % 2) * 300, 300, 'alsa_output.device' || i % 6,"
    " 'S16LE/48000/2', 2, (i % 16) / 15.0, iif(i % 2, 'stopped', 'change') FROM numbers, week WHERE i < 200000;"
    "INSERT INTO messages(id, time, kind, session, source, happened, holder, payload)"
    " SELECT 2 * i + 1, began + i * 0.39, iif(i % 13, 1 + i % 2, 3), 1 + i / 13, 1 + (i / 13) % 1000,"
    " began + i * 0.39, 1, iif(i % 13, '{\"PomoSessionVolume\":0.5,\"session_output_running\":true,"
    "\"active_devices\":\"alsa_output.device1\",\"kestoreporting_timestamp\":1795264500.65}',"
    " '{\"issue\":\"late_cycles\",\"late_cycles\":3,\"issue_duration\":0.2,\"active_devices\":\"alsa_output.device1\"}'"
    ")"
    " FROM numbers, week; COMMIT";

constexpr const char* byDayAndApplication =
    "SELECT date(began, 'unixepoch', 'localtime') AS day, sum(seconds), count(DISTINCT session) FROM stretches"
    " WHERE recording = 0 GROUP BY day;"
    "SELECT s.application, sum(x.seconds), count(DISTINCT x.session), sum(x.seconds * x.volume) / sum(x.seconds)"
    " FROM stretches x LEFT JOIN sessions s ON s.id = x.session WHERE x.recording = 0 GROUP BY s.application"
    " ORDER BY 2 DESC;"
    "SELECT s.application, count(*), sum(e.payload ->> 'late_cycles') FROM events e LEFT JOIN sessions s"
    " ON s.id = e.session WHERE e.name GLOB 'com.quarn.kesto.Error.*' GROUP BY s.application";

void require(bool isDone)
{
    if (!isDone)
        throw std::runtime_error("SQLite failed");
}

void makeStore(const std::filesystem::path& path)
{
    const auto writer = platform::SqliteConnection::open(path);
    require(writer.has_value() && platform::StoreSchema::make(**writer).has_value());
    showProgress("filling a store with 100,000 sessions");
    require((*writer)->execute(fill).has_value());
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
    makeStore(database);
    const auto measure = [&](const std::vector<std::string>& command) {
        return [&output, command] { return millisecondsOf(command, output); };
    };
    const std::string tool = KESTO_BENCH_TOOL;
    const auto times =
        compete(options, "reports of 100,000 sessions", measure({tool, "report", "--database", database.native()}),
                measure({tool, "report", "--json", "--database", database.native()}),
                measure({shell, database.native(), byDayAndApplication}));
    const PeerFigure peer{"sqlite3", times[2]};
    report.add(
        {"a week of 100,000 sessions, by day and application", "ms", times[0], peer, Target::figureAtMost(longest)});
    report.add({"the same with all tables, as JSON", "ms", times[1], peer, Target::figureAtMost(longest)});
}

} // namespace bench
