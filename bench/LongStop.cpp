// SPDX-License-Identifier: Apache-2.0
// How long other clients wait at most while a session with a million messages ends. The end is on a thread of its own,
// with which they share the processors and the service's memory.
#include "Groups.h"
#include "support/ServiceProcess.h"

#include <algorithm>
#include <fmt/format.h>
#include <optional>

namespace bench {
namespace {

constexpr std::size_t messageCount = 1'000'000;
constexpr std::size_t tripsMeanwhile = 2000;

double millisecondsOfRoundTrip(RawClient& client)
{
    const auto start = Clock::now();
    client.roundTrip();
    return nanosecondsSince(start) / 1e6;
}

} // namespace

void measureLongStop(const BenchOptions& options, Report& report)
{
    const ServiceProcess service(options, "used = []", ServiceProcess::Build::Internal);
    RawClient other = service.makeClient();
    std::vector<double> longest;
    std::vector<double> usual;
    for (int round = 0; round < options.rounds; ++round) {
        showProgress(fmt::format("a long stop: round {} of {}", round + 1, options.rounds));
        std::optional<RawClient> client(service.makeClient());
        client->pipeline(messageCount);
        usual.push_back(millisecondsOfRoundTrip(other));
        client.reset(); // which stops its session
        double worst = 0;
        for (std::size_t trip = 0; trip < tripsMeanwhile; ++trip)
            worst = std::max(worst, millisecondsOfRoundTrip(other));
        longest.push_back(worst);
    }
    clearProgress();
    report.add({fmt::format("longest wait of another client, {} messages being stopped", messageCount), "ms", longest,
                PeerFigure{"without it", usual}});
}

} // namespace bench
