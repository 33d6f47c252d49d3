// What there is to know of a device and of a cycle, as plain data, and the way changes of devices are told.
//
// A device is what sound comes out of or goes into: PipeWire's sinks and sources. The server works in cycles: a driver,
// most often a device, wakes all nodes that depend on it, and each has until the next cycle to finish.
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
    std::optional<std::int64_t> workNanoseconds{}; // from its waking up to its finish, if both are known
    bool isLate = false; // it had not finished when the cycle was over
};

struct Cycle {
    std::int64_t began = 0; // nanoseconds of CLOCK_MONOTONIC
    std::optional<NodeCycle> driver{}; // which has not been late by itself
    std::vector<NodeCycle> followers{};
};

// Hears of devices: `deviceAppeared`, any number of others, `deviceGone`. What is told may repeat what is known.
class DeviceListener {
public:
    virtual ~DeviceListener() = default;

    virtual void deviceAppeared(DeviceSerial device, const DeviceDescription& description) = 0;
    virtual void deviceStateChanged(DeviceSerial device, DeviceState state, Moment when) = 0;
    // Whether anything is linked with it, so that it is to run.
    virtual void deviceWanted(DeviceSerial device, bool wanted, Moment when) = 0;
    virtual void deviceCycle(DeviceSerial device, const NodeCycle& cycle) = 0;
    virtual void deviceGone(DeviceSerial device) = 0;
};

} // namespace kesto_pipewire
