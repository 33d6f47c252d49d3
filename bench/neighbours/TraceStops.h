// A flood of traces that stop: each of a session for tests, with a million events that the processes emit themselves.
#pragma once

#include "neighbours/Floods.h"

#include <string_view>

namespace bench {

// The content of feature-flags.toml with which the service traces.
constexpr std::string_view tracingFlags = "[Sonalis]\nTracing = true\n";

// Writes the parameters of the traces to where the flood of this service finds them.
void writeTraceParameters(const ServiceProcess& service);
// The flood; throws if the service cannot trace.
void stopTraces(const FloodPart& part);

} // namespace bench
