// What PipeWire's devices do, published as reporting channels: the service tells at the end of every session how they
// changed over it.
//
// Some channels are about all devices together and there from the beginning: the service follows only groups in which
// there is a channel when it starts. The others are a device's, in a subgroup of its name, and come and go with it.
// Devices may share a name: the second one's subgroup is "name#2", and stays that though the first one goes.
//
// What cannot be published, for want of a folder or of room, is tried again with each session and each new device;
// reporting goes on without it.
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

    // Has the files show what is so now, and publishes what could not be published before.
    void flush();

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
        std::optional<Moment> wantedSince; // while it is wanted and has not run since
        std::optional<DeviceOwnChannels> channels; // while it is published
    };

    // Publish what is not published; all of the channels or none. The latter two answer why they could not, else
    // nothing.
    void publish();
    [[nodiscard]] std::string publishTotals();
    [[nodiscard]] std::string publish(Device& device);
    // Of the driver, and why it is not there.
    [[nodiscard]] std::string place() const;
    [[nodiscard]] std::string describe(const std::string& reason) const;

    [[nodiscard]] kesto::Status create(TotalChannels& totals);
    [[nodiscard]] kesto::Status create(DeviceOwnChannels& channels, const Device& device);
    [[nodiscard]] kesto::Status create(CycleChannels& channels, Direction direction, const std::string& subgroup);
    [[nodiscard]] std::string freeSubgroup(const std::string& name) const;
    [[nodiscard]] Device* find(DeviceSerial serial);
    void countRunning();

    const Diagnostics& diagnostics_;
    const std::string root_; // as it was given
    std::string problem_; // that was said last
    std::string driver_;
    kesto::Publisher publisher_;
    std::optional<TotalChannels> totals_; // while they are published
    std::unordered_map<DeviceSerial, Device> devices_;
};

} // namespace kesto_pipewire
