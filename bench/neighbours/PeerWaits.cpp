// SPDX-License-Identifier: Apache-2.0
// Three rounds, because every flood is set against these figures.
#include "neighbours/PeerWaits.h"

#include "neighbours/FairClientOf.h"
#include "neighbours/FloodPipeline.h"
#include "neighbours/FloodProcesses.h"

#include <fmt/format.h>

namespace bench {
namespace {

using User = FloodProcesses::User;

Waits waitsOf(FairClient client)
{
    constexpr int rounds = 3;
    Waits waits;
    for (int round = 0; round < rounds; ++round)
        waits.add(client.latencies(PeerWaits::duration));
    return waits;
}

Waits waitsBesideBurners(const BenchOptions& options, int processes)
{
    const ServiceProcess service(options);
    FairClient client = fairClientOf(service);
    FloodProcesses burners(processes, User::Same, [](const auto& waitForStart) {
        waitForStart();
        for (std::uint64_t number = 0;; ++number)
            use(number);
    });
    burners.start();
    return waitsOf(std::move(client));
}

Waits waitsForDaemon(int processes, int connectionsEach)
{
    const DaemonPeer daemon;
    const Bus first = daemon.connect(); // waits until the daemon answers
    FairClient client = fairClientOf(daemon);
    FloodProcesses flood(processes, User::Same, [&](const auto& waitForStart) {
        FloodPipeline{connectionsEach, [&] { return daemon.connectSocket(); }, {busIdentityRequest()}}.run(
            waitForStart);
    });
    flood.start();
    Waits waits = waitsOf(std::move(client));
    flood.expectRunning();
    return waits;
}

template <typename Key, typename Measure>
const Waits& remembered(std::map<Key, Waits>& all, const Key& key, const std::string& what, Measure measure)
{
    const auto known = all.find(key);
    if (known != all.end())
        return known->second;
    showProgress(what);
    return all.emplace(key, measure()).first->second;
}

} // namespace

Waits PeerWaits::alone() const
{
    const ServiceProcess service(options_);
    return waitsOf(fairClientOf(service));
}

const Waits& PeerWaits::burners(int processes)
{
    return remembered(burners_, processes, fmt::format("neighbours: {} burning", processes),
                      [&] { return waitsBesideBurners(options_, processes); });
}

const Waits& PeerWaits::daemon(int processes, int connectionsEach)
{
    return remembered(daemons_, std::pair(processes, connectionsEach),
                      fmt::format("neighbours: dbus-daemon, {} connections flooding", processes * connectionsEach),
                      [&] { return waitsForDaemon(processes, connectionsEach); });
}

} // namespace bench
