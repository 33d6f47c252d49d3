// SPDX-License-Identifier: Apache-2.0
// What a well-behaved client waits beside floods, from one process and from ten. Peers are processes that only burn
// processor time, as many as the flood has, and dbus-daemon beside clients that flood it with calls.
//
// A flood is measured once, and not in rounds: there are so many of them, each with a service of its own, that the
// usual rounds would take half an hour. The peers are measured three times, because every flood is set against them.
// The flood of dbus-daemon has as many connections as that of the service, and is always of the same user: it admits no
// other.
#include "Groups.h"
#include "neighbours/ChannelCrowd.h"
#include "neighbours/FairClientOf.h"
#include "neighbours/FloodProcesses.h"
#include "neighbours/FloodedServices.h"
#include "neighbours/Floods.h"
#include "neighbours/PeerWaits.h"
#include "neighbours/TraceStops.h"
#include "peers/DaemonPeer.h"
#include "support/ServiceProcess.h"
#include "support/Waits.h"

#include <array>
#include <fmt/format.h>
#include <memory>
#include <unistd.h>

namespace bench {
namespace {

using User = FloodProcesses::User;

// Who floods.
struct Crowd {
    int processes;
    User user;

    [[nodiscard]] std::string inWords() const
    {
        return fmt::format("{} process{}{}", processes, processes == 1 ? "" : "es",
                           user == User::Other ? " of another user" : "");
    }
};
constexpr std::array crowds{Crowd{1, User::Same}, Crowd{10, User::Same}, Crowd{1, User::Other}, Crowd{10, User::Other}};

class Neighbours {
public:
    Neighbours(const BenchOptions& options, Report& report) : options_(options), report_(report), peers_(options) { }

    void measureAlone()
    {
        showProgress("neighbours: alone");
        const Waits alone = peers_.alone();
        report_.add({"a client alone, median", "us", alone.median});
        report_.add({"a client alone, 99th percentile", "us", alone.percentile99});
    }

    void measure(const Flood& flood, const Crowd& crowd)
    {
        const std::string what = fmt::format("beside {}, {}", flood.name, crowd.inWords());
        if (const std::string_view missing = missingFor(flood, crowd); !missing.empty())
            return report_.skip(what, std::string(missing));
        showProgress("neighbours: " + what);
        try {
            const Waits waits = waitsBeside(flood, crowd, what);
            add(what, waits, "beside burning processes", peers_.burners(crowd.processes), 2);
            if (DaemonPeer::isInstalled())
                add(what, waits, "dbus-daemon, flooded",
                    peers_.daemon(crowd.processes, shareOf(flood.connections, crowd.processes)), 1);
        } catch (const std::exception& problem) {
            report_.skip(what, problem.what());
        }
    }

    void reportMemory() { flooded_.reportTo(report_); }

private:
    // What this machine lacks; empty if it lacks nothing.
    static std::string_view missingFor(const Flood& flood, const Crowd& crowd)
    {
        if (crowd.user == User::Other && ::geteuid() != 0)
            return "only root can flood as another user";
        if (flood.needs == Flood::Needs::Tracing && !traceInstances())
            return "tracefs is not mounted";
        return {};
    }

    Waits waitsBeside(const Flood& flood, const Crowd& crowd, std::string_view what)
    {
        auto service = makeService(flood);
        FairClient client = fairClientOf(*service);
        const double megabytesBefore = residentMegabytes(service->identifier());
        Waits waits;
        {
            FloodProcesses processes(crowd.processes, crowd.user, [&](const auto& waitForStart) {
                flood.run({*service, crowd.processes, waitForStart});
            });
            if (flood.needs == Flood::Needs::CrowdedChannels)
                channels().showMany();
            processes.start();
            waits.add(client.latencies(PeerWaits::duration));
            processes.expectRunning();
        }
        flooded_.add(what, std::move(service), megabytesBefore);
        return waits;
    }

    std::unique_ptr<ServiceProcess> makeService(const Flood& flood)
    {
        using enum ServiceProcess::Build;
        ServiceProcess::Extras extras;
        if (flood.needs == Flood::Needs::CrowdedChannels) {
            channels().showFew();
            extras.channelRoot = channels().root();
        }
        if (flood.needs == Flood::Needs::Tracing)
            extras.featureFlags = tracingFlags;
        const auto build = flood.needs == Flood::Needs::InternalBuild ? Internal : Customer;
        auto service = std::make_unique<ServiceProcess>(options_, "used = []", build, extras);
        service->admitOtherUsers();
        writeTraceParameters(*service);
        return service;
    }

    const ChannelCrowd& channels()
    {
        if (!channels_)
            channels_ = std::make_unique<ChannelCrowd>();
        return *channels_;
    }

    void add(std::string_view what, const Waits& waits, const std::string& peer, const Waits& peersWaits, double limit)
    {
        report_.add({fmt::format("{}, median", what), "us", waits.median, PeerFigure{peer, peersWaits.median},
                     Target::ratioAtMost(limit)});
        report_.add({fmt::format("{}, 99th percentile", what), "us", waits.percentile99,
                     PeerFigure{peer, peersWaits.percentile99}, Target::ratioAtMost(limit)});
    }

    const BenchOptions& options_;
    Report& report_;
    const TracesLeft tracesLeft_; // outlives the services
    PeerWaits peers_;
    FloodedServices flooded_;
    std::unique_ptr<ChannelCrowd> channels_;
};

} // namespace

void measureNeighbours(const BenchOptions& options, Report& report)
{
    Neighbours neighbours(options, report);
    neighbours.measureAlone();
    for (const Flood& flood : floods())
        if (flood.name.find(options.part) != std::string_view::npos)
            for (const Crowd& crowd : crowds)
                neighbours.measure(flood, crowd);
    neighbours.reportMemory();
    clearProgress();
}

} // namespace bench
