// SPDX-License-Identifier: Apache-2.0
// The cost of the service while its clients are silent. All rounds run at the same time, because idle services do not
// disturb each other.
#include "Groups.h"
#include "peers/DaemonPeer.h"
#include "support/ServiceProcess.h"

#include <deque>
#include <fmt/format.h>
#include <thread>

namespace bench {
namespace {

constexpr int clientCount = 10;
constexpr std::chrono::seconds settling(1);
constexpr std::chrono::seconds duration(10);

class IdleService {
public:
    explicit IdleService(const BenchOptions& options) : service_(options)
    {
        for (int client = 0; client < clientCount; ++client)
            clients_.push_back(service_.connectWithSession());
    }
    [[nodiscard]] pid_t identifier() const { return service_.identifier(); }

private:
    ServiceProcess service_;
    std::vector<platform::FileDescriptor> clients_;
};

class IdleDaemon {
public:
    IdleDaemon()
    {
        for (int client = 0; client < clientCount; ++client)
            clients_.push_back(daemon_.connect());
    }
    [[nodiscard]] pid_t identifier() const { return daemon_.identifier(); }

private:
    DaemonPeer daemon_;
    std::vector<Bus> clients_;
};

struct Idleness {
    std::vector<double> wakeUps;
    std::vector<double> megabytes;
};

template <typename Processes> void begin(const Processes& processes, Idleness& idleness)
{
    for (const auto& process : processes)
        idleness.wakeUps.push_back(-contextSwitches(process.identifier()));
}

template <typename Processes> void end(const Processes& processes, Idleness& idleness)
{
    for (std::size_t each = 0; each < processes.size(); ++each) {
        idleness.wakeUps[each] += contextSwitches(processes[each].identifier());
        idleness.megabytes.push_back(residentMegabytes(processes[each].identifier()));
    }
}

} // namespace

void measureIdle(const BenchOptions& options, Report& report)
{
    showProgress(
        fmt::format("idle: {} services, {} clients each, {} s", options.rounds, clientCount, duration.count()));
    std::deque<IdleService> services;
    std::deque<IdleDaemon> daemons;
    for (int round = 0; round < options.rounds; ++round) {
        services.emplace_back(options);
        if (DaemonPeer::isInstalled())
            daemons.emplace_back();
    }
    std::this_thread::sleep_for(settling);
    Idleness ours;
    Idleness theirs;
    begin(services, ours);
    begin(daemons, theirs);
    std::this_thread::sleep_for(duration);
    end(services, ours);
    end(daemons, theirs);
    clearProgress();

    const auto peer = [&](const std::vector<double>& figures) {
        return daemons.empty() ? std::nullopt : std::optional(PeerFigure{"dbus-daemon", figures});
    };
    const std::string what = fmt::format("idle with {} connected clients", clientCount);
    report.add({what + fmt::format(", wake-ups in {} s", duration.count()), "", ours.wakeUps, peer(theirs.wakeUps),
                Target::figureAtMost(0)});
    report.add({what + ", resident", "MB", ours.megabytes, peer(theirs.megabytes), Target::figureAtMost(12)});
}

} // namespace bench
