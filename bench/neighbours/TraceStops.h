// SPDX-License-Identifier: Apache-2.0
// A flood of traces that stop: each of a session for tests, with a million events that the processes emit themselves.
#pragma once

#include "neighbours/Floods.h"

#include <filesystem>
#include <optional>
#include <set>
#include <string_view>

namespace bench {

// The content of feature-flags.toml with which the service traces.
constexpr std::string_view tracingFlags = "[Sonalis]\nTracing = true\n";

// Where the kernel's traces are; nothing if tracefs is not mounted.
[[nodiscard]] std::optional<std::filesystem::path> traceInstances();

// Services leave their traces in the kernel, for their next run. This removes those that were made during its life; the
// services must have ended.
class TracesLeft {
public:
    TracesLeft();
    ~TracesLeft();
    TracesLeft(const TracesLeft&) = delete;
    TracesLeft& operator=(const TracesLeft&) = delete;

private:
    std::set<std::filesystem::path> others_;
};

// Writes the parameters of the traces to where the flood of this service finds them.
void writeTraceParameters(const ServiceProcess& service);
// The flood; throws if the service cannot trace.
void stopTraces(const FloodPart& part);

} // namespace bench
