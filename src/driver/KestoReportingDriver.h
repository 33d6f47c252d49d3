// SPDX-License-Identifier: Apache-2.0
// One group of driver channels to subscribe to.
#pragma once

#include "platform/ReportingChannels.h"

#include <optional>
#include <string>
#include <string_view>

struct KestoReportingDriver {
    std::optional<std::string> groupName;
    std::optional<std::string> subGroupName;

    // The text for an absent name, in keys and in the log.
    static constexpr std::string_view absentName = "(null)";

    [[nodiscard]] platform::ChannelSelection selection() const { return {groupName, subGroupName}; }
    // "group-subgroup"; the key of this driver in snapshots.
    [[nodiscard]] std::string description() const
    {
        std::string text(groupName ? *groupName : absentName);
        text += '-';
        text += subGroupName ? *subGroupName : absentName;
        return text;
    }
};
