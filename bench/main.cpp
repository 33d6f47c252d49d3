// SPDX-License-Identifier: Apache-2.0
// kesto_bench: measures the service and its library, each figure with that of a peer in the same run, and prints a
// table. It is not a test: it reports a missed target, and the exit status is still 0.
#include "Groups.h"

#include "foundation/values/Json.h"

#include <array>
#include <cstdlib>
#include <fmt/format.h>
#include <fstream>
#include <getopt.h>
#include <optional>

namespace bench {
namespace {

struct MeasurementGroup {
    std::string_view name;
    std::string_view what;
    void (*measure)(const BenchOptions&, Report&);
};

constexpr std::array groups{
    MeasurementGroup{"roundtrip", "waiting for the answer to a message", measureRoundTrip},
    MeasurementGroup{"pipeline", "messages a second, none stored", measurePipeline},
    MeasurementGroup{"stored", "messages a second that become stored events", measureStored},
    MeasurementGroup{"query", "queries of ten million stored events", measureStoredQueries},
    MeasurementGroup{"report", "the report and the list of 100,000 sessions", measureReports},
    MeasurementGroup{"ingest", "rows of a fleet from the stream into the database", measureIngest},
    MeasurementGroup{"session", "recording a million messages: time and memory", measureGrowingSession},
    MeasurementGroup{"end", "the end of a session of a million messages", measureSessionEnd},
    MeasurementGroup{"ended", "the memory that stays of sessions that ended", measureEndedSessions},
    MeasurementGroup{"starving", "what others wait while a long session ends", measureLongStop},
    MeasurementGroup{"neighbours", "what a well-behaved client waits beside floods", measureNeighbours},
    MeasurementGroup{"status", "what a client waits for the status of a busy service", measureStatusRequest},
    MeasurementGroup{"lookup", "finding a session among 10,000 clients", measureLookup},
    MeasurementGroup{"notification", "telling all sessions that a setting changed", measureNotification},
    MeasurementGroup{"idle", "wake-ups and memory with nothing to do", measureIdle},
    MeasurementGroup{"start", "from starting the process to its first answer", measureStart},
    MeasurementGroup{"log", "a log statement below the threshold", measureLogStatement},
    MeasurementGroup{"library", "sending with libkesto, as its caller sees it", measureClientLibrary},
    MeasurementGroup{"channels", "driver channels: sampled, compared, published", measureChannels},
    MeasurementGroup{"decoding", "CBOR, and keeping a payload", measureDecoding},
    MeasurementGroup{"record", "the diagnostics record to bytes and back", measureDiagnosticsRecord},
    MeasurementGroup{"trace", "pairing the events of a trace, and its stop", measureTraceEnd},
    MeasurementGroup{"tracing", "emitting trace events, and taking the kernel's pages apart", measureTraceEventCost},
};

void printHelp()
{
    fmt::print("Usage: kesto_bench [--filter TEXT[/PART]] [--rounds N] [--json FILE] [--service PROGRAM]\n\n"
               "Measures Kesto reporting beside its peers and prints a table: the figure, the peer's figure from the\n"
               "same run, their ratio, the target. Every figure is the median of the rounds.\n\n"
               "  --filter TEXT      only the groups with TEXT in their name; neighbours/PART: of this group only the\n"
               "                     floods with PART in their name\n"
               "  --rounds N         rounds of each measurement, {} at least; {} by default\n"
               "  --json FILE        write all figures, round by round, to the file, too\n"
               "  --service PROGRAM  the service to measure; {} by default\n"
               "  --help             this text\n\nGroups:\n",
               BenchOptions::fewestRounds, BenchOptions().rounds, KESTO_BENCH_SERVICE);
    for (const MeasurementGroup& group : groups)
        fmt::print("  {:<12} {}\n", group.name, group.what);
}

void takeFilter(std::string_view text, BenchOptions& options)
{
    const std::size_t slash = text.find('/');
    options.filter = text.substr(0, slash);
    options.part = slash == std::string_view::npos ? "" : text.substr(slash + 1);
}

// Nothing if the program must end now; `exitStatus` is then its exit status.
std::optional<BenchOptions> parse(int argumentCount, char** arguments, int& status)
{
    constexpr std::array<option, 6> known{{{"filter", required_argument, nullptr, 'f'},
                                           {"rounds", required_argument, nullptr, 'r'},
                                           {"json", required_argument, nullptr, 'j'},
                                           {"service", required_argument, nullptr, 's'},
                                           {"help", no_argument, nullptr, 'h'},
                                           {}}};
    constexpr int wrongUsage = 2;
    BenchOptions options;
    options.service = KESTO_BENCH_SERVICE;
    for (int given = 0; (given = ::getopt_long(argumentCount, arguments, "", known.data(), nullptr)) != -1;) {
        switch (given) {
        case 'f': takeFilter(optarg, options); break;
        case 'r': options.rounds = std::max(std::atoi(optarg), BenchOptions::fewestRounds); break;
        case 'j': options.json = optarg; break;
        case 's': options.service = std::filesystem::absolute(optarg); break;
        case 'h': printHelp(); return std::nullopt;
        default: status = wrongUsage; return std::nullopt;
        }
    }
    return options;
}

bool writeJson(const Report& report, const std::filesystem::path& path)
{
    std::string text;
    std::ofstream file(path);
    if (foundation::appendJson(report.json(), text) && file << text << '\n' << std::flush)
        return true;
    fmt::print(stderr, "kesto_bench: {} cannot be written\n", path.native());
    return false;
}

int run(const BenchOptions& options)
{
    Report report;
    bool isComplete = true;
    for (const MeasurementGroup& group : groups) {
        if (group.name.find(options.filter) == std::string_view::npos)
            continue;
        try {
            group.measure(options, report);
        } catch (const std::exception& problem) {
            clearProgress();
            fmt::print(stderr, "kesto_bench: {}: {}\n", group.name, problem.what());
            isComplete = false;
        }
    }
    fmt::print("{}", report.table());
    if (!options.json.empty())
        isComplete &= writeJson(report, options.json);
    return isComplete ? EXIT_SUCCESS : EXIT_FAILURE;
}

} // namespace
} // namespace bench

int main(int argumentCount, char** arguments)
{
    int status = EXIT_SUCCESS;
    const auto options = bench::parse(argumentCount, arguments, status);
    return options ? bench::run(*options) : status;
}
