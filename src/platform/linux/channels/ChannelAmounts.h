// SPDX-License-Identifier: Apache-2.0
// What the users' folders have taken of the limits of one reading, and whose turn it is.
//
// The next to be read is the user who has taken the least: of the limits of which a user has taken a part, the greatest
// part counts (dominant resource fairness: A. Ghodsi et al., 2011). So a user with few folders is read whole while one
// with many is under way, and the user with many gets what the others leave.
#pragma once

#include "platform/linux/channels/ChannelTree.h"

#include <algorithm>
#include <array>
#include <cstddef>

namespace platform {

// What a user can use up.
enum class ChannelResource : std::uint8_t { Folders, Names, Channels, Bytes };

// One number for each of them. One thread.
class ChannelAmounts {
public:
    ChannelAmounts() = default;
    explicit ChannelAmounts(const ChannelTreeLimits& limits)
        : amounts_{limits.folders, limits.names, limits.channels, limits.bytes}
    {
    }

    [[nodiscard]] std::size_t& operator[](ChannelResource resource)
    {
        return amounts_.at(static_cast<std::size_t>(resource));
    }
    // The greatest part that this is of one of the limits, 0 to 1.
    [[nodiscard]] double greatestPartOf(const ChannelAmounts& limits) const
    {
        double greatest = 0;
        for (std::size_t each = 0; each < amounts_.size(); ++each)
            greatest = std::max(greatest,
                                static_cast<double>(amounts_[each])
                                    / static_cast<double>(std::max<std::size_t>(limits.amounts_[each], 1)));
        return greatest;
    }

private:
    std::array<std::size_t, 4> amounts_{};
};

} // namespace platform
