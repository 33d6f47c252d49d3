// The table of the channels, and the arithmetic between what PipeWire tells and what they count.
#include "kesto-pipewire/DeviceChannels.h"

#include "kesto-pipewire/Text.h"

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cmath>
#include <string_view>
#include <system_error>
#include <utility>
#include <vector>

namespace kesto_pipewire {

namespace {

constexpr auto driver = "pipewire";

// As `DeviceState` counts them.
const std::vector<const char*> stateNames{"Suspended", "Idle", "Running", "Error"};

// From a small fraction of the shortest cycle to beyond the longest.
const std::vector<std::int64_t> workBounds{0, 20, 50, 100, 200, 500, 1000, 2000, 5000, 10000, 20000, 50000, 100000};
// What nobody notices, up to what everybody does.
const std::vector<std::int64_t> startBounds{0, 1, 2, 5, 10, 20, 50, 100, 200, 500, 1000, 2000, 5000, 10000};

const char* cycleGroup(Direction direction)
{
    return direction == Direction::Output ? "Tx" : "Rx";
}

// What is left of a name in a file's name and in a report's key: names that differ in nothing else are one.
std::string essenceOf(std::string_view name)
{
    constexpr unsigned char firstPrintable = 0x20;
    constexpr char deleted = 0x7F;
    const auto isLost = [](char character) {
        return character == '_' || character == ' ' || character == '/' || character == deleted
            || static_cast<unsigned char>(character) < firstPrintable;
    };
    std::string essence(name.substr(name.starts_with('.') ? 1 : 0));
    std::erase_if(essence, isLost);
    return essence;
}

// Right after it was returned.
std::string reasonOf(kesto::Status status)
{
    return status == kesto::Status::SystemError ? std::generic_category().message(errno) : kesto::errorText(status);
}

// The first of several that failed.
template <typename... Create> kesto::Status createAll(Create... create)
{
    auto status = kesto::Status::Ok;
    static_cast<void>((((status = create()) == kesto::Status::Ok) && ...));
    return status;
}

} // namespace

DeviceChannels::DeviceChannels(std::string root, const Diagnostics& diagnostics) : diagnostics_(diagnostics)
{
    kesto::PublisherOptions options;
    options.root = std::move(root);
    options.refreshInterval = std::chrono::milliseconds::max(); // `flush` tells how long states have lasted
    auto status = publisher_.open(options);
    if (status == kesto::Status::Ok)
        status = createTotals();
    if (status != kesto::Status::Ok)
        diagnostics_.say("statistics of devices cannot be published: {}", reasonOf(status));
}

kesto::Status DeviceChannels::createTotals()
{
    return createAll([&] { return totals_[0].create(publisher_, Direction::Output, ""); },
                     [&] { return totals_[1].create(publisher_, Direction::Input, ""); },
                     [&] { return anyRuns_.create(publisher_, {driver, "Speaker", "", "any"}, {"Idle", "Running"}); },
                     [&] {
                         return startTimes_.create(publisher_, {driver, "StateTransitionTimes_ms", "", "to Running"},
                                                   "ms", startBounds);
                     });
}

kesto::Status DeviceChannels::CycleChannels::create(const kesto::Publisher& publisher, Direction direction,
                                                    const std::string& subgroup)
{
    const auto* group = cycleGroup(direction);
    return createAll([&] { return cycles.create(publisher, {driver, group, subgroup, "cycles"}); },
                     [&] { return lateCycles.create(publisher, {driver, group, subgroup, "late cycles"}); },
                     [&] { return workTimes.create(publisher, {driver, group, subgroup, "work"}, "us", workBounds); });
}

// No subgroup would mean all devices together.
std::string DeviceChannels::freeSubgroup(const std::string& name) const
{
    const auto essence = essenceOf(name);
    const std::string_view wanted = essence.empty() || essence == "-" ? "unnamed" : std::string_view(name);
    for (std::size_t number = 1;; ++number) {
        const auto suffix = number == 1 ? "" : "#" + std::to_string(number);
        auto subgroup = tidyText(wanted, maximumNameBytes - suffix.size()) + suffix;
        const auto isTaken = [taken = essenceOf(subgroup)](const auto& each) {
            return essenceOf(each.second.subgroup) == taken;
        };
        if (std::ranges::none_of(devices_, isTaken))
            return subgroup;
    }
}

kesto::Status DeviceChannels::create(Device& device)
{
    const auto& name = device.subgroup;
    return createAll([&] { return device.cycles.create(publisher_, device.direction, name); },
                     [&] { return device.states.create(publisher_, {driver, "Speaker", name, "state"}, stateNames); },
                     [&] {
                         return device.startTimes.create(
                             publisher_, {driver, "StateTransitionTimes_ms", name, "to Running"}, "ms", startBounds);
                     });
}

void DeviceChannels::CycleChannels::count(const NodeCycle& cycle)
{
    constexpr std::int64_t nanosecondsAMicrosecond = 1000;
    cycles.add(1);
    if (cycle.isLate)
        lateCycles.add(1);
    if (cycle.workNanoseconds)
        workTimes.record(*cycle.workNanoseconds / nanosecondsAMicrosecond);
}

DeviceChannels::Device* DeviceChannels::find(DeviceSerial serial)
{
    const auto found = devices_.find(serial);
    return found == devices_.end() ? nullptr : &found->second;
}

void DeviceChannels::deviceAppeared(DeviceSerial serial, const DeviceDescription& description)
{
    devices_.erase(serial);
    Device device;
    device.direction = description.direction;
    device.subgroup = freeSubgroup(description.name);
    if (const auto status = create(device); status != kesto::Status::Ok)
        diagnostics_.detail("no statistics of {}: {}", description.name, reasonOf(status));
    devices_.emplace(serial, std::move(device));
}

void DeviceChannels::deviceStateChanged(DeviceSerial serial, DeviceState state, Moment when)
{
    auto* device = find(serial);
    if (device == nullptr || device->state == state)
        return;
    device->state = state;
    device->states.enter(static_cast<std::size_t>(state));
    if (state == DeviceState::Running && device->wantedSince) {
        constexpr double millisecondsASecond = 1000;
        const auto wanted = std::exchange(device->wantedSince, std::nullopt);
        const auto milliseconds = std::llround((when.uptime - wanted->uptime) * millisecondsASecond);
        if (milliseconds <= startBounds.back()) { // longer waits are those of somebody who has paused
            device->startTimes.record(milliseconds);
            startTimes_.record(milliseconds);
        }
    }
    countRunning();
}

void DeviceChannels::deviceWanted(DeviceSerial serial, bool wanted, Moment when)
{
    auto* device = find(serial);
    if (device == nullptr)
        return;
    if (!wanted)
        device->wantedSince.reset();
    else if (!device->wantedSince && device->state != DeviceState::Running)
        device->wantedSince = when;
}

void DeviceChannels::deviceCycle(DeviceSerial serial, const NodeCycle& cycle)
{
    auto* device = find(serial);
    if (device == nullptr)
        return;
    device->cycles.count(cycle);
    totals_[static_cast<std::size_t>(device->direction)].count(cycle);
}

void DeviceChannels::deviceGone(DeviceSerial serial)
{
    devices_.erase(serial);
    countRunning();
}

void DeviceChannels::countRunning()
{
    const bool anyRuns =
        std::ranges::any_of(devices_, [](const auto& each) { return each.second.state == DeviceState::Running; });
    anyRuns_.enter(anyRuns ? 1 : 0);
}

} // namespace kesto_pipewire
