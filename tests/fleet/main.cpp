// SPDX-License-Identifier: Apache-2.0
// The trial of a whole fleet: ./dev fleet runs it, and the suite runs its small edition.
#include "fleet/Measures.h"
#include "fleet/Scenarios.h"
#include "support/TemporaryDirectory.h"

#include <CLI/CLI.hpp>

#include <chrono>
#include <csignal>
#include <cstdlib>
#include <exception>
#include <filesystem>
#include <fmt/format.h>
#include <string>
#include <thread>

namespace fleet {
namespace {

using Clock = std::chrono::steady_clock;

void print(const std::string& line)
{
    fmt::print("{}\n", line);
    std::fflush(stdout);
}

double secondsSince(Clock::time_point begin)
{
    return std::chrono::duration<double>(Clock::now() - begin).count();
}

std::string description(const Edition& edition)
{
    return fmt::format(
        "{} devices, {} real; nats-servers: {}; shards of the database: {}, replicas of each: {}; copies "
        "of kesto-ingest: {}; {} processors for all",
        edition.devices, edition.realDevices, edition.brokers, edition.shards, edition.replicas, edition.ingests,
        std::thread::hardware_concurrency());
}

// What a process that does not come any further may have said.
void printLogs(const Fleet& fleet)
{
    for (const auto& copy : fleet.ingests)
        print("--- log of kesto-ingest:\n" + copy->log());
    for (const auto& device : fleet.realDevices)
        print("--- log of kesto-uplink:\n" + device->uplink().log());
}

// Whether the equation holds behind the scenario.
bool play(const Scenario& scenario, Fleet& fleet)
{
    const auto begin = Clock::now();
    try {
        scenario.happen(fleet);
        const Equality equality = fleet.settle();
        print(fmt::format("{:7.1f} s {:9} rows  {}", secondsSince(begin), equality.rows, scenario.what));
        for (const std::string& difference : equality.differences)
            print(difference);
        if (!equality.differences.empty())
            print("THE EQUATION DOES NOT HOLD: rows in the database, once each = rows that the devices allow");
        return equality.differences.empty();
    } catch (const std::exception& error) {
        print(fmt::format("{:7.1f} s                 {}: {}", secondsSince(begin), scenario.what, error.what()));
        printLogs(fleet);
        return false;
    }
}

// The trial writes everything to the folder.
int run(const Edition& edition, const std::string& only, const std::filesystem::path& directory)
{
    const auto begin = Clock::now();
    ::setenv("TMPDIR", directory.c_str(), 1); // also of what makes a directory of its own
    print(description(edition));
    Fleet fleet(edition, directory);
    print(fmt::format("{:7.1f} s                 servers run, and devices have their weeks", secondsSince(begin)));
    for (const Scenario& scenario : allScenarios()) {
        const bool isFirst = &scenario == &allScenarios().front(); // which starts the ingests
        if (scenario.brokers > edition.brokers || !(isFirst || scenario.what.contains(only)))
            continue;
        if (!play(scenario, fleet))
            return 1;
    }
    fleet.endIngests();
    measureRoom(fleet);
    print(textOf(fleet.figures));
    print(fmt::format("the equation held after each scenario: rows in the database, once each = rows that the devices "
                      "allow; {:.0f} s in all",
                      secondsSince(begin)));
    return 0;
}

} // namespace
} // namespace fleet

int main(int argc, char** argv)
{
    bool isSmall = false;
    CLI::App app("A fleet with its servers, what can happen to it, and after each of it the equation: rows in the "
                 "database, once each = rows that the devices allow. Ends with 1 if it does not hold.");
    app.add_flag("--small", isSmall, "one server of each kind and few devices, in about a minute");
    std::string only;
    app.add_option("--only", only, "of the scenarios, the first and those with this text in their line");
    std::size_t devices = 0;
    app.add_option("--devices", devices, "so many made-up devices, in place of the edition's")
        ->check(CLI::Range(10, 100'000));
    std::filesystem::path kept;
    app.add_option("--keep", kept, "a folder for all stores and logs, which stays, in place of one that goes");
    CLI11_PARSE(app, argc, argv);
    fleet::Edition edition = isSmall ? fleet::smallEdition : fleet::wholeEdition;
    if (devices > 0)
        edition.devices = devices;
    std::signal(SIGPIPE, SIG_IGN);
    try {
        if (kept.empty())
            return fleet::run(edition, only, support::TemporaryDirectory().path());
        std::filesystem::create_directories(kept);
        return fleet::run(edition, only, std::filesystem::canonical(kept));
    } catch (const std::exception& error) {
        fmt::print(stderr, "kesto_fleet: {}\n", error.what());
        return 2;
    }
}
