// SPDX-License-Identifier: Apache-2.0
// What happens to the fleet, one thing after the other. After each, the equation must hold.
#pragma once

#include "fleet/Fleet.h"

#include <functional>
#include <string_view>
#include <vector>

namespace fleet {

struct Scenario {
    std::string_view what; // for a person
    std::function<void(Fleet&)> happen; // throws if something but the equation does not hold
    int brokers = 1; // with fewer servers it would be the same as another
};

[[nodiscard]] const std::vector<Scenario>& allScenarios();

} // namespace fleet
