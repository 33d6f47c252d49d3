// SPDX-License-Identifier: Apache-2.0
// Devices and cycles as plain data, and the interface that reports changes of devices.
//
// Devices are PipeWire's sinks and sources. The server works in cycles: a driver, most often a device, wakes all nodes
// that depend on it, and each has until the next cycle to finish.
#pragma once

#include "kesto-pipewire/Stream.h"

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace kesto_pipewire {

using ObjectID = std::uint32_t;
using DeviceSerial = StreamSerial;

enum class DeviceState : std::uint8_t { Suspended, Idle, Running, Error };

struct DeviceDescription {
    Direction direction = Direction::Output; // of the sound: a sink's is output
    std::string name{}; // PipeWire's `node.name`
};

// A node's part in one cycle.
struct NodeCycle {
    ObjectID node = 0;
    std::optional<std::int64_t> workNanoseconds{}; // from waking up to its finish, if both are known
    bool isLate = false; // it had not finished when the cycle was over
};

struct Cycle {
    std::int64_t began = 0; // nanoseconds of CLOCK_MONOTONIC
    std::optional<NodeCycle> driver{}; // without lateness of its own
    std::vector<NodeCycle> followers{};
};

// Gets the events of devices: `deviceAppeared`, any number of others, `deviceGone`. An event may repeat a known state.
class DeviceListener {
public:
    virtual ~DeviceListener() = default;

    virtual void deviceAppeared(DeviceSerial device, const DeviceDescription& description) = 0;
    virtual void deviceStateChanged(DeviceSerial device, DeviceState state, Moment when) = 0;
    // Whether a stream is linked with the device, which must then run.
    virtual void deviceWanted(DeviceSerial device, bool wanted, Moment when) = 0;
    virtual void deviceCycle(DeviceSerial device, const NodeCycle& cycle) = 0;
    virtual void deviceGone(DeviceSerial device) = 0;
};

} // namespace kesto_pipewire
