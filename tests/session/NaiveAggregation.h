// SPDX-License-Identifier: Apache-2.0
// What a session derives from its messages, written a second time: step by step on plain lists of dictionaries, however
// slow, and without any code of the service's version.
#pragma once

#include "session/StoredMessages.h"

#include <optional>
#include <string>
#include <vector>

namespace naive {

[[nodiscard]] Messages combineRapidMessages(const Messages& messages, const std::vector<std::string>& keysToCombine,
                                            double maximumPausetime);

struct VolumeMessages {
    Messages events;
    std::vector<std::string> logLines;
};
[[nodiscard]] VolumeMessages
createVolumeMessages(const Messages& messages, const std::optional<foundation::Value>& process, double minimumPlaytime);

// Nothing without messages.
[[nodiscard]] std::optional<foundation::Dictionary> createSummaryEvent(const Messages& messages, int serviceType);

} // namespace naive
