// SPDX-License-Identifier: Apache-2.0
// Whether a service still works shows in its processor time.
#include "neighbours/FloodedServices.h"

#include <fmt/format.h>
#include <thread>

namespace bench {
namespace {

constexpr std::chrono::seconds timeToReturn{10};

// A service has as long to finish what a flood left behind as it has to return the memory.
bool comesToRest(pid_t process)
{
    constexpr std::chrono::milliseconds look(50);
    constexpr double almostNothing = 0.005; // seconds of processor time meanwhile
    for (const auto start = Clock::now(); Clock::now() - start < timeToReturn;) {
        const double before = processorSeconds(process);
        std::this_thread::sleep_for(look);
        if (processorSeconds(process) - before < almostNothing)
            return true;
    }
    return false;
}

} // namespace

void FloodedServices::add(std::string_view flood, std::unique_ptr<ServiceProcess> service, double megabytesBefore)
{
    if (comesToRest(service->identifier())) {
        resting_.push_back({std::string(flood), std::move(service), megabytesBefore});
        return;
    }
    note(fmt::format("{}, still at work", flood), residentMegabytes(service->identifier()) - megabytesBefore);
    service->kill();
}

void FloodedServices::reportTo(Report& report)
{
    showProgress("neighbours: memory after the floods");
    if (!resting_.empty())
        std::this_thread::sleep_for(timeToReturn);
    for (const Resting& each : resting_)
        note(each.flood, residentMegabytes(each.service->identifier()) - each.megabytesBefore);
    if (!largest_.flood.empty())
        report.add({fmt::format("resident {} s after, over before; most {}", timeToReturn.count(), largest_.flood),
                    "MB",
                    std::vector{largest_.megabytes},
                    {},
                    Target::figureAtMost(16)});
}

void FloodedServices::note(std::string_view flood, double megabytes)
{
    if (largest_.flood.empty() || megabytes > largest_.megabytes)
        largest_ = {std::string(flood), megabytes};
}

} // namespace bench
