// SPDX-License-Identifier: Apache-2.0
// A device-wide setting changes, and every session of every client gets it.
#include "Groups.h"
#include "support/CrowdedService.h"
#include "support/InProcessPlatform.h"

#include <fmt/format.h>

namespace bench {

void measureNotification(const BenchOptions& options, Report& report)
{
    constexpr std::int64_t clients = 1'000;
    constexpr std::string_view ringerSwitch = "com.quarn.halden.ringerstate";
    InProcessPlatform platform;
    showProgress(fmt::format("connecting {} clients", clients));
    const CrowdedService service(clients, CrowdedService::Sessions::Started);
    std::uint64_t state = 0;
    const std::string what =
        fmt::format("a notification to {} clients of {} sessions", clients, CrowdedService::sessionsEach);
    const auto times = compete(options, what, [&] {
        state ^= 1; // so that sessions do not drop it as a repetition
        return nanosecondsEach(1, [&](std::size_t) { platform.post(ringerSwitch, state); }) / 1e6;
    });
    report.add({what, "ms", times[0], {}, Target::figureAtMost(20)});
}

} // namespace bench
