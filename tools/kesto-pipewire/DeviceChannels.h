// SPDX-License-Identifier: Apache-2.0
// Statistics of PipeWire's devices, published as reporting channels: the service reports at the end of every session
// how they changed.
//
// Some channels are about all devices together and exist from the beginning, because the service subscribes only to
// groups that have a channel when it starts. The others belong to one device, in a subgroup of its name, and come and
// go with it. Devices may share a name: the second device's subgroup is "name#2", even after the first has gone.
//
// If publishing fails, because a folder is missing or a limit is reached, it is tried again with each session and each
// new device; reporting goes on without it.
#pragma once

#include "kesto-pipewire/Device.h"
#include "kesto-pipewire/Diagnostics.h"

#include <kesto/channels.hpp>

#include <array>
#include <optional>
#include <string>
#include <unordered_map>

namespace kesto_pipewire {

// All functions run on one thread. The diagnostics must outlive it.
class DeviceChannels final : public DeviceListener {
public:
    // `root` is the channel tree; empty means libkesto's default.
    DeviceChannels(std::string root, const Diagnostics& diagnostics);

    // Brings the files up to date, and tries again to publish channels that failed before.
    void flush();

    void deviceAppeared(DeviceSerial serial, const DeviceDescription& description) override;
    void deviceStateChanged(DeviceSerial serial, DeviceState state, Moment when) override;
    void deviceWanted(DeviceSerial serial, bool wanted, Moment when) override;
    void deviceCycle(DeviceSerial serial, const NodeCycle& cycle) override;
    void deviceGone(DeviceSerial serial) override;

private:
    // The channels of cycles, for a device and for all devices of a direction.
    struct CycleChannels {
        kesto::SimpleChannel cycles;
        kesto::SimpleChannel lateCycles;
        kesto::HistogramChannel workTimes;

        void count(const NodeCycle& cycle);
    };
    struct TotalChannels {
        std::array<CycleChannels, 2> cycles; // by direction
        kesto::StateChannel anyRuns;
        kesto::HistogramChannel startTimes;
    };
    struct DeviceOwnChannels {
        CycleChannels cycles;
        kesto::StateChannel states;
        kesto::HistogramChannel startTimes;
    };
    struct Device {
        Direction direction = Direction::Output;
        std::string subgroup;
        DeviceState state = DeviceState::Suspended;
        std::optional<Moment> wantedSince; // since when it is wanted without running
        std::optional<DeviceOwnChannels> channels; // while it is published
    };

    // Publish missing channels; all of a set or none. The latter two return the reason of a failure, or an empty text.
    void publish();
    [[nodiscard]] std::string publishTotals();
    [[nodiscard]] std::string publish(Device& device);
    // The text of the driver's place, and of the reason why it is not the usual one.
    [[nodiscard]] std::string place() const;
    [[nodiscard]] std::string describe(const std::string& reason) const;

    [[nodiscard]] kesto::Status create(TotalChannels& totals);
    [[nodiscard]] kesto::Status create(DeviceOwnChannels& channels, const Device& device);
    [[nodiscard]] kesto::Status create(CycleChannels& channels, Direction direction, const std::string& subgroup);
    [[nodiscard]] std::string freeSubgroup(const std::string& name) const;
    [[nodiscard]] Device* find(DeviceSerial serial);
    void countRunning();

    const Diagnostics& diagnostics_;
    const std::string root_; // the constructor's argument
    std::string problem_; // the last reported one
    std::string driver_;
    kesto::Publisher publisher_;
    std::optional<TotalChannels> totals_; // while they are published
    std::unordered_map<DeviceSerial, Device> devices_;
};

} // namespace kesto_pipewire
