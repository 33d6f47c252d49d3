// SPDX-License-Identifier: Apache-2.0
// Finding a session among those of all clients, in a service with ten thousand clients and in one with a single client.
//
// Three cases: the same sessions again and again, as for a sending client; after a pause in which other data filled the
// processor's caches; and all sessions in random order, the worst case for memory.
#include "Groups.h"
#include "support/CrowdedService.h"
#include "support/InProcessPlatform.h"

#include <algorithm>
#include <fmt/format.h>
#include <numeric>
#include <random>
#include <span>

namespace bench {
namespace {

constexpr auto sessionsEach = CrowdedService::sessionsEach;

using ReporterIDs = std::vector<std::int64_t>;

// The sessions of a client, repeated so many times.
ReporterIDs sessionsOf(std::int64_t client, std::size_t times)
{
    ReporterIDs reporterIDs;
    for (std::size_t time = 0; time < times; ++time)
        for (std::int64_t session = 1; session <= sessionsEach; ++session)
            reporterIDs.push_back(client * sessionsEach + session);
    return reporterIDs;
}

void displaceCaches()
{
    constexpr std::size_t size = std::size_t{16} << 20;
    constexpr std::size_t line = 64;
    static std::vector<char> memory(size);
    for (std::size_t at = 0; at < size; at += line)
        ++memory[at];
}

// Nanoseconds to find one of these sessions.
double costOf(CrowdedService& service, std::span<const std::int64_t> reporterIDs)
{
    return nanosecondsEach(reporterIDs.size(), [&](std::size_t each) { service.find(reporterIDs[each]); });
}

// The cost of finding a client's sessions after a pause, for clients chosen at random among so many.
double costAfterPause(CrowdedService& service, std::int64_t clients)
{
    constexpr int pauses = 200;
    static std::minstd_rand random(1);
    std::vector<double> costs;
    for (int pause = 0; pause < pauses; ++pause) {
        const auto reporterIDs = sessionsOf(std::uniform_int_distribution<std::int64_t>(0, clients - 1)(random), 1);
        displaceCaches();
        const auto start = Clock::now();
        std::ranges::for_each(reporterIDs, [&](std::int64_t reporterID) { service.find(reporterID); });
        costs.push_back(nanosecondsSince(start) / sessionsEach);
    }
    return median(std::move(costs));
}

} // namespace

void measureLookup(const BenchOptions& options, Report& report)
{
    constexpr std::int64_t clients = 10'000;
    constexpr std::size_t count = clients * sessionsEach;
    const InProcessPlatform platform;
    showProgress(fmt::format("connecting {} clients", clients));
    CrowdedService crowd(clients);
    CrowdedService single(1);

    ReporterIDs everySession(count);
    std::iota(everySession.begin(), everySession.end(), 1);
    std::ranges::shuffle(everySession, std::minstd_rand(1));
    const auto oneOfMany = sessionsOf(clients / 2, clients);
    const auto theOnly = sessionsOf(0, clients);

    const std::string what = fmt::format("finding a session among {} clients", clients);
    const auto costs = compete(
        options, what, [&] { return costOf(crowd, oneOfMany); }, [&] { return costOf(single, theOnly); },
        [&] { return costAfterPause(crowd, clients); }, [&] { return costAfterPause(single, 1); },
        [&] { return costOf(crowd, everySession); });
    const std::string peer = "with one client";
    report.add({what + ", again and again", "ns", costs[0], PeerFigure{peer, costs[1]}, Target::ratioAtMost(2)});
    report.add({what + ", after a pause", "ns", costs[2], PeerFigure{peer, costs[3]}, Target::ratioAtMost(2)});
    report.add({what + ", all in no order", "ns", costs[4], PeerFigure{peer + ", again and again", costs[1]}});
}

} // namespace bench
