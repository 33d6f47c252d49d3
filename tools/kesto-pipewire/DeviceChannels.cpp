// SPDX-License-Identifier: Apache-2.0
// The table of the channels, and the conversion from PipeWire's events to their values.
#include "kesto-pipewire/DeviceChannels.h"

#include "kesto-pipewire/DriverName.h"
#include "kesto-pipewire/ValidText.h"

#include <fmt/format.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cmath>
#include <filesystem>
#include <string_view>
#include <system_error>
#include <utility>
#include <vector>

namespace kesto_pipewire {

namespace {

// As `DeviceState` counts them.
const std::vector<const char*> stateNames{"Suspended", "Idle", "Running", "Error"};

// From a small fraction of the shortest cycle to beyond the longest.
const std::vector<std::int64_t> workBounds{0, 20, 50, 100, 200, 500, 1000, 2000, 5000, 10000, 20000, 50000, 100000};
// From delays that users do not notice to delays that all users notice.
const std::vector<std::int64_t> startBounds{0, 1, 2, 5, 10, 20, 50, 100, 200, 500, 1000, 2000, 5000, 10000};

const char* cycleGroup(Direction direction)
{
    return direction == Direction::Output ? "Tx" : "Rx";
}

// The part of a name that stays in a file's name and in a report's key: names with equal parts look alike.
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

// The text of a status; call it directly after the status was returned, because it reads `errno`. Empty on success.
std::string reasonOf(kesto::Status status)
{
    if (status == kesto::Status::Ok)
        return {};
    return status == kesto::Status::SystemError ? std::generic_category().message(errno) : kesto::errorText(status);
}

// The first failure of several calls.
template <typename... Create> kesto::Status createAll(Create... create)
{
    auto status = kesto::Status::Ok;
    static_cast<void>((((status = create()) == kesto::Status::Ok) && ...));
    return status;
}

} // namespace

DeviceChannels::DeviceChannels(std::string root, const Diagnostics& diagnostics)
    : diagnostics_(diagnostics),
      root_(std::move(root))
{
    publish();
}

void DeviceChannels::flush()
{
    publish();
    publisher_.flush();
}

void DeviceChannels::publish()
{
    auto reason = totals_ ? std::string() : publishTotals();
    for (auto& [serial, device] : devices_)
        if (totals_ && !device.channels)
            if (auto problem = publish(device); !problem.empty())
                reason = std::move(problem);
    auto problem = reason.empty() ? std::string() : describe(reason);
    if (problem != problem_)
        diagnostics_.say("statistics of devices {}", problem.empty() ? "are published in " + place() : problem);
    problem_ = std::move(problem);
}

std::string DeviceChannels::place() const
{
    return (std::filesystem::path(publisher_.root()) / driver_).string();
}

std::string DeviceChannels::describe(const std::string& reason) const
{
    constexpr auto hope = "It is tried again with each session.";
    if (!publisher_.isOpen())
        return fmt::format("cannot be published: {}. {}", reason, hope);
    return fmt::format("cannot be published in {}: {}. {} {}", place(), reason, adviceOn(publisher_.root(), driver_),
                       hope);
}

std::string DeviceChannels::publishTotals()
{
    kesto::PublisherOptions options;
    options.root = root_; // without a root, libkesto chooses one when it opens
    options.refreshInterval = std::chrono::milliseconds::max(); // `flush` writes the times of states
    if (auto reason = reasonOf(publisher_.open(options)); !reason.empty())
        return reason;
    auto [name, whyNotTheUsual] = driverNameIn(publisher_.root());
    driver_ = std::move(name);
    if (auto reason = reasonOf(create(totals_.emplace())); !reason.empty()) {
        totals_.reset();
        return reason;
    }
    if (!whyNotTheUsual.empty())
        diagnostics_.say("{}: statistics of devices are published in {} beside it", whyNotTheUsual, driver_);
    countRunning();
    return {};
}

std::string DeviceChannels::publish(Device& device)
{
    auto reason = reasonOf(create(device.channels.emplace(), device));
    if (reason.empty())
        device.channels->states.enter(static_cast<std::size_t>(device.state));
    else
        device.channels.reset();
    return reason;
}

kesto::Status DeviceChannels::create(TotalChannels& totals)
{
    return createAll(
        [&] { return create(totals.cycles[0], Direction::Output, ""); },
        [&] { return create(totals.cycles[1], Direction::Input, ""); },
        [&] { return totals.anyRuns.create(publisher_, {driver_, "Speaker", "", "any"}, {"Idle", "Running"}); },
        [&] {
            return totals.startTimes.create(publisher_, {driver_, "StateTransitionTimes_ms", "", "to Running"}, "ms",
                                            startBounds);
        });
}

kesto::Status DeviceChannels::create(DeviceOwnChannels& channels, const Device& device)
{
    const auto& name = device.subgroup;
    return createAll(
        [&] { return create(channels.cycles, device.direction, name); },
        [&] { return channels.states.create(publisher_, {driver_, "Speaker", name, "state"}, stateNames); },
        [&] {
            return channels.startTimes.create(publisher_, {driver_, "StateTransitionTimes_ms", name, "to Running"},
                                              "ms", startBounds);
        });
}

kesto::Status DeviceChannels::create(CycleChannels& channels, Direction direction, const std::string& subgroup)
{
    const auto* group = cycleGroup(direction);
    return createAll(
        [&] { return channels.cycles.create(publisher_, {driver_, group, subgroup, "cycles"}); },
        [&] { return channels.lateCycles.create(publisher_, {driver_, group, subgroup, "late cycles"}); },
        [&] { return channels.workTimes.create(publisher_, {driver_, group, subgroup, "work"}, "us", workBounds); });
}

// No subgroup would mean all devices together.
std::string DeviceChannels::freeSubgroup(const std::string& name) const
{
    const auto essence = essenceOf(name);
    const std::string_view wanted = essence.empty() || essence == "-" ? "unnamed" : std::string_view(name);
    for (std::size_t number = 1;; ++number) {
        const auto suffix = number == 1 ? std::string() : fmt::format("#{}", number);
        auto subgroup = tidyText(wanted, maximumNameBytes - suffix.size()) + suffix;
        const auto isTaken = [taken = essenceOf(subgroup)](const auto& each) {
            return essenceOf(each.second.subgroup) == taken;
        };
        if (std::ranges::none_of(devices_, isTaken))
            return subgroup;
    }
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
    devices_.emplace(serial, std::move(device));
    publish();
}

void DeviceChannels::deviceStateChanged(DeviceSerial serial, DeviceState state, Moment when)
{
    auto* device = find(serial);
    if (device == nullptr || device->state == state)
        return;
    device->state = state;
    if (device->channels)
        device->channels->states.enter(static_cast<std::size_t>(state));
    if (state == DeviceState::Running && device->wantedSince) {
        constexpr double millisecondsASecond = 1000;
        const auto wanted = std::exchange(device->wantedSince, std::nullopt);
        const auto milliseconds = std::llround((when.uptime - wanted->uptime) * millisecondsASecond);
        const bool isStart = milliseconds <= startBounds.back(); // longer waits mean that a user has paused
        if (isStart && device->channels)
            device->channels->startTimes.record(milliseconds);
        if (isStart && totals_)
            totals_->startTimes.record(milliseconds);
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
    if (device->channels)
        device->channels->cycles.count(cycle);
    if (totals_)
        totals_->cycles[static_cast<std::size_t>(device->direction)].count(cycle);
}

void DeviceChannels::deviceGone(DeviceSerial serial)
{
    devices_.erase(serial);
    countRunning();
}

void DeviceChannels::countRunning()
{
    if (!totals_)
        return;
    const bool anyRuns =
        std::ranges::any_of(devices_, [](const auto& each) { return each.second.state == DeviceState::Running; });
    totals_->anyRuns.enter(anyRuns ? 1 : 0);
}

} // namespace kesto_pipewire
