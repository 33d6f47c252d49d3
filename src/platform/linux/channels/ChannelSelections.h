// SPDX-License-Identifier: Apache-2.0
// Which channels are meant, for the sources of channels that read several groups at once.
#pragma once

#include "platform/ReportingChannels.h"

#include <algorithm>
#include <optional>
#include <string>
#include <vector>

namespace platform {

// All on any thread.

// Whether the selection selects channels of that group, in some subgroup or in this one.
[[nodiscard]] inline bool selectsGroup(const ChannelSelection& selection, const std::optional<std::string>& group)
{
    return !selection.group || selection.group == group;
}
[[nodiscard]] inline bool selects(const ChannelSelection& selection, const std::optional<std::string>& group,
                                  const std::optional<std::string>& subgroup)
{
    return selectsGroup(selection, group) && (!selection.subgroup || selection.subgroup == subgroup);
}

// Whether any of the selections does.
[[nodiscard]] inline bool selectsGroup(const std::vector<ChannelSelection>& selections,
                                       const std::optional<std::string>& group)
{
    return std::ranges::any_of(selections, [&](const auto& selection) { return selectsGroup(selection, group); });
}
[[nodiscard]] inline bool selects(const std::vector<ChannelSelection>& selections,
                                  const std::optional<std::string>& group, const std::optional<std::string>& subgroup)
{
    return std::ranges::any_of(selections, [&](const auto& selection) { return selects(selection, group, subgroup); });
}

} // namespace platform
