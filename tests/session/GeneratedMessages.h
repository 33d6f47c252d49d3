// SPDX-License-Identifier: Apache-2.0
// Payloads that RapidCheck makes, both as players send them and as they should not: missing keys, values of every wrong
// type, booleans sent as numbers, times that stand still, decrease, or are not times.
#pragma once

#include "session/StoredMessages.h"

#include <cstddef>
#include <rapidcheck.h>
#include <vector>

namespace generated {

// So many payloads, each with a time from the running clock. A property runs a hundred times, and thousands of stores
// are to be tried.
rc::Gen<std::vector<Messages>> manyPayloads(std::size_t count);

} // namespace generated
