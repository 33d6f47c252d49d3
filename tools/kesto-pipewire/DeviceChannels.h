// What PipeWire's devices do, published as reporting channels: the service tells at the end of every session how they
// changed over it.
//
// Some channels are about all devices together and there from the beginning: the service follows only groups in which
// there is a channel when it starts. The others are a device's, in a subgroup of its name, and come and go with it.
// Devices may share a name: the second one's subgroup is "name#2", and stays that though the first one goes.
//
// A device that cannot be published, for want of a folder or of room, is left aside: reporting goes on without it.
#pragma once

#include "kesto-pipewire/Device.h"
#include "kesto-pipewire/Diagnostics.h"

#include <kesto/channels.hpp>

#include <array>
#include <optional>
#include <string>
#include <unordered_map>

namespace kesto_pipewire {

// All of it on one thread. The diagnostics outlive it.
class DeviceChannels final : public DeviceListener {
public:
    // `root` is the channel tree; empty means where libkesto looks by default.
    DeviceChannels(std::string root, const Diagnostics& diagnostics);

    // Has the files show what is so now.
    void flush() { publisher_.flush(); }

    void deviceAppeared(DeviceSerial serial, const DeviceDescription& description) override;
    void deviceStateChanged(DeviceSerial serial, DeviceState state, Moment when) override;
    void deviceWanted(DeviceSerial serial, bool wanted, Moment when) override;
    void deviceCycle(DeviceSerial serial, const NodeCycle& cycle) override;
    void deviceGone(DeviceSerial serial) override;

private:
    // What is counted of cycles, for a device and for all devices of a direction.
    struct CycleChannels {
        kesto::SimpleChannel cycles;
        kesto::SimpleChannel lateCycles;
        kesto::HistogramChannel workTimes;

        [[nodiscard]] kesto::Status create(const kesto::Publisher& publisher, Direction direction,
                                           const std::string& subgroup);
        void count(const NodeCycle& cycle);
    };
    struct Device {
        Direction direction = Direction::Output;
        std::string subgroup;
        DeviceState state = DeviceState::Suspended;
        std::optional<Moment> wantedSince; // while it is wanted and has not run since
        CycleChannels cycles;
        kesto::StateChannel states;
        kesto::HistogramChannel startTimes;
    };

    [[nodiscard]] kesto::Status createTotals();
    [[nodiscard]] kesto::Status create(Device& device);
    [[nodiscard]] std::string freeSubgroup(const std::string& name) const;
    [[nodiscard]] Device* find(DeviceSerial serial);
    void countRunning();

    const Diagnostics& diagnostics_;
    kesto::Publisher publisher_;
    std::array<CycleChannels, 2> totals_; // by direction
    kesto::StateChannel anyRuns_;
    kesto::HistogramChannel startTimes_;
    std::unordered_map<DeviceSerial, Device> devices_;
};

} // namespace kesto_pipewire
