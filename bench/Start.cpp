// SPDX-License-Identifier: Apache-2.0
// The time from the start of the process until a client has its first answer, in an empty state directory, as after
// installation.
#include "Groups.h"
#include "peers/DaemonPeer.h"
#include "support/ServiceProcess.h"

namespace bench {

void measureStart(const BenchOptions& options, Report& report)
{
    const std::string what = "start of the process to the first answer";
    std::vector<Contestant> contestants;
    contestants.emplace_back([&] {
        const auto start = Clock::now();
        const ServiceProcess service(options);
        const auto client = service.connectWithSession();
        return nanosecondsSince(start) / 1e6;
    });
    if (DaemonPeer::isInstalled())
        contestants.emplace_back([] {
            const auto start = Clock::now();
            const DaemonPeer daemon;
            const auto client = daemon.connect();
            return nanosecondsSince(start) / 1e6;
        });
    const auto times = compete(options, what, contestants);
    report.add({what, "ms", times[0],
                times.size() > 1 ? std::optional(PeerFigure{"dbus-daemon", times[1]}) : std::nullopt,
                Target::figureAtMost(50)});
}

} // namespace bench
