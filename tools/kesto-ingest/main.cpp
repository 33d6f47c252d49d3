// SPDX-License-Identifier: Apache-2.0
// kesto-ingest: takes the batches of a fleet from the stream and puts their rows into the database.
//
// This file connects the parts and handles signals. The program keeps nothing itself, so any number of copies may run,
// and each may end at any time.
#include "kesto-ingest/Configuration.h"
#include "kesto-ingest/Ingest.h"
#include "kesto-ingest/MetricsServer.h"
#include "kesto-ingest/database/ClickHouse.h"
#include "kesto-ingest/database/Tables.h"
#include "kesto-ingest/stream/JetStream.h"

#include <CLI/CLI.hpp>
#include <curl/curl.h>
#include <fmt/format.h>
#include <nats/nats.h>

#include <malloc.h>
#include <sysexits.h>

#include <algorithm>
#include <chrono>
#include <csignal>
#include <cstdio>
#include <memory>
#include <stdexcept>
#include <string>
#include <system_error>
#include <thread>

namespace kesto_ingest {

namespace {

using Milliseconds = std::chrono::milliseconds;

volatile std::sig_atomic_t shallEnd = 0;

// What devices sent may be in a line.
void log(std::string_view line)
{
    std::string text(line);
    std::ranges::replace_if(text, [](unsigned char each) { return each < 0x20 || each == 0x7f; }, '?');
    fmt::print(stderr, "kesto-ingest: {}\n", text);
}

void rest(Milliseconds time)
{
    constexpr Milliseconds piece{100};
    const auto end = std::chrono::steady_clock::now() + time;
    while (shallEnd == 0 && std::chrono::steady_clock::now() < end)
        std::this_thread::sleep_for(piece);
}

// The blocks of a load are as large as those of the load before it. Without this, each would take its memory from the
// kernel anew, page by page, in as much time as it takes to read the rows.
void keepFreedMemory()
{
    constexpr int megabyte = 1024 * 1024;
    mallopt(M_MMAP_THRESHOLD, 16 * megabyte); // as a block
    mallopt(M_TRIM_THRESHOLD, 32 * megabyte); // as a load
}

void handleSignals()
{
    struct sigaction action{};
    action.sa_handler = [](int) { shallEnd = 1; };
    for (const int signal : {SIGTERM, SIGINT})
        ::sigaction(signal, &action, nullptr);
}

// The libraries' own state, for their users.
class Libraries {
public:
    Libraries() { curl_global_init(CURL_GLOBAL_DEFAULT); }
    ~Libraries()
    {
        static_cast<void>(nats_CloseAndWait(2000));
        curl_global_cleanup();
    }
    Libraries(const Libraries&) = delete;
    Libraries& operator=(const Libraries&) = delete;
};

// Null if a signal came first.
std::unique_ptr<JetStream> connect(const JetStreamConfiguration& configuration)
{
    constexpr Milliseconds pause{2000};
    while (shallEnd == 0) {
        try {
            return std::make_unique<JetStream>(configuration);
        } catch (const std::runtime_error& error) {
            log(error.what());
            rest(pause);
        }
    }
    return nullptr;
}

// EX_OK if the tables are there, or if a signal came first.
int checkTables(ClickHouse& database, const std::string& name)
{
    constexpr Milliseconds pause{2000};
    while (shallEnd == 0) {
        const auto edition = database.edition();
        if (edition && *edition == tablesEdition)
            return EX_OK;
        if (edition && *edition == 0) {
            log(fmt::format("the database {} has no tables: make them by `kesto-ingest tables | clickhouse-client "
                            "--multiquery`",
                            name));
            return EX_CONFIG;
        }
        if (edition) {
            log(fmt::format("the tables in the database {} are of edition {}, and this program writes edition {}: "
                            "update the older of the two",
                            name, *edition, tablesEdition));
            return EX_CONFIG;
        }
        log(edition.error());
        rest(pause);
    }
    return EX_OK;
}

int run(const Configuration& configuration)
{
    keepFreedMemory();
    handleSignals();
    const Libraries libraries;
    Metrics metrics;
    const MetricsServer server(metrics, configuration.metricsPort);
    ClickHouse database(configuration.database);
    if (const int status = checkTables(database, configuration.database.database); status != EX_OK)
        return status;
    const auto stream = connect(configuration.stream);
    if (!stream)
        return EX_OK;
    Ingest ingest(*stream, database, metrics,
                  {.rows = configuration.rowsInABlock, .joining = configuration.longestJoining},
                  {.now = std::chrono::steady_clock::now,
                   .rest = rest,
                   .log = log,
                   .start = [](const std::function<Outcome()>& work) { return std::async(std::launch::async, work); }});
    metrics.isDatabaseUp = metrics.isStreamUp = true;
    log(fmt::format("ready; metrics on http://127.0.0.1:{}/metrics", server.port()));
    while (shallEnd == 0)
        ingest.turn();
    ingest.finish();
    return EX_OK;
}

int setUp(const Configuration& configuration, const StreamSizes& sizes)
{
    const Libraries libraries;
    JetStream stream(configuration.stream);
    if (const auto done = stream.setUp(sizes); !done) {
        log(done.error());
        return EX_UNAVAILABLE;
    }
    fmt::print("the streams KESTO, KESTO_OWNER, KESTO_STORED and KESTO_DEAD, and the consumer ingest, are there\n");
    return EX_OK;
}

} // namespace

} // namespace kesto_ingest

int main(int argumentCount, char** arguments)
{
    using namespace kesto_ingest;
    constexpr double gigabyte = 1 << 30;
    std::string file = "/etc/kesto/ingest.toml";
    std::string cluster;
    std::string databaseName = "kesto";
    StreamSizes sizes;
    double eventsGigabytes = 8;
    double deadGigabytes = 1;
    int redeliverSeconds = 60;

    CLI::App app("Takes the batches of a fleet from the stream and puts their rows into the database.", "kesto-ingest");
    app.set_version_flag("--version", "kesto-ingest " KESTO_VERSION);
    app.require_subcommand(1);
    auto* const runCommand = app.add_subcommand("run", "Work until a signal ends it");
    auto* const setUpCommand = app.add_subcommand("setup", "Make the streams and the consumer");
    auto* const tablesCommand = app.add_subcommand("tables", "Print the SQL that makes the tables");
    for (auto* const command : {runCommand, setUpCommand})
        command->add_option("--configuration", file, "The configuration")->type_name("FILE")->capture_default_str();
    setUpCommand->add_option("--replicas", sizes.replicas, "Servers that keep each message")
        ->check(CLI::Range(1, 5))
        ->capture_default_str();
    setUpCommand->add_option("--gigabytes", eventsGigabytes, "Room for batches that wait")
        ->check(CLI::Range(0.001, 1e6))
        ->capture_default_str();
    setUpCommand->add_option("--dead-gigabytes", deadGigabytes, "Room for what cannot be stored")
        ->check(CLI::Range(0.001, 1e6))
        ->capture_default_str();
    setUpCommand
        ->add_option("--redeliver-seconds", redeliverSeconds,
                     "After this time another copy gets what one has not acknowledged; below 20 for trials only")
        ->check(CLI::Range(1, 3600))
        ->capture_default_str();
    const CLI::Validator isName(
        [](const std::string& text) {
            const bool holds = !text.empty()
                && text.find_first_not_of("abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ0123456789_")
                    == std::string::npos;
            return holds ? std::string() : text + " is no name: letters, digits and _ only";
        },
        "NAME");
    tablesCommand->add_option("--cluster", cluster, "Replicated tables on this cluster")->check(isName);
    tablesCommand->add_option("--database", databaseName, "The database")->check(isName)->capture_default_str();
    try {
        app.parse(argumentCount, arguments);
        if (tablesCommand->parsed()) {
            fmt::print("{}", tablesSql(databaseName, cluster));
            if (std::fflush(stdout) == 0)
                return EX_OK;
            log("the output could not be written");
            return EX_IOERR;
        }
        const auto configuration = readConfiguration(file);
        if (!configuration) {
            log(configuration.error());
            return EX_CONFIG;
        }
        sizes.eventsBytes = static_cast<std::int64_t>(eventsGigabytes * gigabyte);
        sizes.deadBytes = static_cast<std::int64_t>(deadGigabytes * gigabyte);
        sizes.redeliverAfter = std::chrono::seconds(redeliverSeconds);
        return setUpCommand->parsed() ? setUp(*configuration, sizes) : run(*configuration);
    } catch (const CLI::ParseError& error) {
        return app.exit(error) == 0 ? EX_OK : EX_USAGE;
    } catch (const std::system_error& error) {
        log(error.what());
        return EX_OSERR;
    } catch (const std::runtime_error& error) {
        log(error.what());
        return EX_UNAVAILABLE;
    }
}
