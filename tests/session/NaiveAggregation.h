// What a session derives from its messages, written down a second time: step by step on plain lists of dictionaries,
// as slow as it comes, and with nothing in common with how the service does it.
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
