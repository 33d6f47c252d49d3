// SPDX-License-Identifier: Apache-2.0
// Lines of uplink.toml that are probably mistakes: they are right by themselves, but nothing in the event store matches
// them.
#pragma once

#include "kesto-uplink/Places.h"
#include "kesto-uplink/rules/UplinkConfiguration.h"

#include <string>
#include <vector>

namespace kesto_uplink {

// Sentences for a person, in the order of the file, about the newest rows of the store. None if the store is empty.
// Throws EventStoreError.
[[nodiscard]] std::vector<std::string> suspects(const Places& places, const UplinkConfiguration& configuration);

} // namespace kesto_uplink
