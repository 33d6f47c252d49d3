// SPDX-License-Identifier: Apache-2.0
// What hostile or broken programs do to the service while a well-behaved client uses it.
#pragma once

#include "support/ServiceProcess.h"

#include <cstdint>
#include <functional>
#include <span>
#include <string_view>

namespace bench {

// The part of a number that one process of several has, rounded up.
[[nodiscard]] constexpr int shareOf(int whole, int processes)
{
    return (whole + processes - 1) / processes;
}

// The part of a flood that one process does.
struct FloodPart {
    const ServiceProcess& service;
    int processes; // that do the flood together
    std::function<void()> waitForStart; // says that this process is prepared

    [[nodiscard]] int of(int whole) const { return shareOf(whole, processes); }
};

struct Flood {
    enum class Needs : std::uint8_t { Nothing, InternalBuild, CrowdedChannels, Tracing };

    std::string_view name;
    Needs needs;
    int connections; // of all processes together; of each process if it is 1
    // Prepares, waits for the start, and floods without end.
    void (*run)(const FloodPart& part);
};

[[nodiscard]] std::span<const Flood> floods();

} // namespace bench
