// SPDX-License-Identifier: Apache-2.0
// A listener that records the events of devices as lines of text, and their cycles unchanged.
#pragma once

#include "kesto-pipewire/Device.h"

#include <fmt/format.h>

#include <array>
#include <functional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace kesto_pipewire {

class RecordingDeviceListener : public DeviceListener {
public:
    explicit RecordingDeviceListener(std::function<void()> changed = [] { }) : changed_(std::move(changed)) { }

    void deviceAppeared(DeviceSerial device, const DeviceDescription& description) override
    {
        hear(device, (description.direction == Direction::Output ? "output " : "input ") + description.name);
    }
    void deviceStateChanged(DeviceSerial device, DeviceState state, Moment) override
    {
        constexpr std::array<std::string_view, 4> names{"suspended", "idle", "running", "error"};
        hear(device, names[static_cast<std::size_t>(state)]);
    }
    void deviceWanted(DeviceSerial device, bool wanted, Moment) override
    {
        hear(device, wanted ? "wanted" : "unwanted");
    }
    void deviceCycle(DeviceSerial device, const NodeCycle& cycle) override
    {
        cycles_.push_back(cycle);
        hear(device, cycle.isLate ? "late cycle" : "cycle");
    }
    void deviceGone(DeviceSerial device) override { hear(device, "gone"); }

    // The events since the last call, such as "30 running".
    std::vector<std::string> news() { return std::exchange(heard_, {}); }
    [[nodiscard]] const std::vector<NodeCycle>& cycles() const { return cycles_; }

private:
    void hear(DeviceSerial device, std::string_view what)
    {
        heard_.push_back(fmt::format("{} {}", device, what));
        changed_();
    }

    std::function<void()> changed_;
    std::vector<std::string> heard_;
    std::vector<NodeCycle> cycles_;
};

} // namespace kesto_pipewire
