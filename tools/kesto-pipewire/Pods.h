// SPDX-License-Identifier: Apache-2.0
// Reads PipeWire's binary values ("pods"): volumes, formats and cycles.
#pragma once

#include "kesto-pipewire/Device.h"
#include "kesto-pipewire/Stream.h"

#include <cstdint>
#include <functional>
#include <optional>

struct spa_pod;

namespace kesto_pipewire {

// A stream's volume on the user's scale from the linear amplitudes of its channels. The user's slider is the
// cube root of the amplitude and shows the loudest channel; more than 1, which some mixers allow, counts as
// 1. Four decimals, so that equal positions of a slider make equal numbers. Any thread.
[[nodiscard]] double userVolume(double amplitude);

// The volume in a node's properties, 0 when muted; nothing if they hold none. Any thread.
[[nodiscard]] std::optional<double> readVolume(const spa_pod& properties);

// The audio format, or nothing if the value holds none, as for a suspended stream. Any thread.
[[nodiscard]] std::optional<StreamFormat> readFormat(const spa_pod& format);

// An audio format's rate in frames a second, or nothing if it has none. Any thread.
[[nodiscard]] std::optional<std::int32_t> readRate(const spa_pod& format);

// Calls back for every cycle that the profiler reports. A record without a new signal for the driver, which comes when
// a driver starts after a pause or a cycle was missed, is not a cycle. Any thread.
void readCycles(const spa_pod& profile, const std::function<void(const Cycle&)>& handle);

} // namespace kesto_pipewire
