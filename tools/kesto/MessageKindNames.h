// SPDX-License-Identifier: Apache-2.0
// Categories, event types and service types by their names, as people write them.
#pragma once

#include "utility/MessageKinds.h"

#include <optional>
#include <string_view>

// The number of exactly that name, or nothing. A category may have a group: "DSP_Playback".
[[nodiscard]] std::optional<AudioEventCategory> categoryNamed(std::string_view name);
[[nodiscard]] std::optional<AudioEventType> eventTypeNamed(std::string_view name);
[[nodiscard]] std::optional<AudioServiceType> serviceTypeNamed(std::string_view name);
