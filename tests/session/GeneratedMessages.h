// Payloads that RapidCheck makes up, as players send them and as they should not: keys missing, values of every wrong
// type, booleans sent as numbers, times that stand still, fall, or are no times.
#pragma once

#include "session/StoredMessages.h"

#include <cstddef>
#include <rapidcheck.h>
#include <vector>

namespace generated {

// So many of them, each with the clock running over it: a property runs a hundred times, and thousands of stores are to
// be tried.
rc::Gen<std::vector<Messages>> manyPayloads(std::size_t count);

} // namespace generated
