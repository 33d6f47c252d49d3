// SPDX-License-Identifier: Apache-2.0
// The faults: each does one thing to the service, to its store or to the system around them, while clients are at work.
#pragma once

#include "end_to_end/Disks.h"
#include "end_to_end/Kestod.h"

#include <functional>
#include <random>
#include <string_view>
#include <vector>

namespace soak {

using Random = std::mt19937; // makes the same numbers with every standard library

// What happens to one service; the faults share it.
struct Scene {
    end_to_end::Kestod& kestod;
    const end_to_end::SmallDisk& disk; // at the state directory, if the system allowed it
    Random random;
    int kills = 0; // by SIGKILL, so far
    bool isDamaged = false; // the store, since this was last set to false
};

// Of the store, in the configuration: with several that were set aside, it must fit on the disk.
inline constexpr unsigned mostMegabytes = 16;

struct Fault {
    std::string_view name;
    unsigned weight; // how often it comes, beside the others
    // Afterwards the service runs.
    std::function<void(Scene&)> happen;
};

// Those that this system and this user can cause, and the names of the others.
struct Faults {
    std::vector<Fault> possible;
    std::vector<std::string_view> impossible;
};
[[nodiscard]] Faults allFaults(const Scene& scene);

} // namespace soak
