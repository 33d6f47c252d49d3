// SPDX-License-Identifier: Apache-2.0
// The list is read item by item; the error quotes the first wrong item.
#include "platform/linux/log/LogThresholds.h"

#include <algorithm>
#include <array>
#include <fmt/format.h>
#include <optional>

namespace platform {
namespace {

std::string_view withoutBlanks(std::string_view text)
{
    const auto first = text.find_first_not_of(' ');
    if (first == std::string_view::npos)
        return {};
    return text.substr(first, text.find_last_not_of(' ') - first + 1);
}

std::optional<LogLevel> levelNamed(std::string_view text)
{
    constexpr std::array levels = {LogLevel::Error, LogLevel::Default, LogLevel::Info, LogLevel::Debug};
    const auto found = std::ranges::find(levels, text, [](LogLevel level) { return name(level); });
    return found == levels.end() ? std::nullopt : std::optional(*found);
}

} // namespace

std::expected<LogThresholds, std::string> LogThresholds::parse(std::string_view text)
{
    LogThresholds thresholds;
    for (bool more = !withoutBlanks(text).empty(); more;) {
        const auto comma = text.find(',');
        more = comma != std::string_view::npos;
        const std::string_view item = withoutBlanks(text.substr(0, comma));
        if (more)
            text.remove_prefix(comma + 1);

        const auto equals = item.find('=');
        const bool hasTag = equals != std::string_view::npos;
        const std::string_view tag = hasTag ? withoutBlanks(item.substr(0, equals)) : std::string_view();
        const auto level = levelNamed(hasTag ? withoutBlanks(item.substr(equals + 1)) : item);
        if (!level || (hasTag && tag.empty()))
            return std::unexpected(fmt::format(
                "\"{}\" is neither a level (error, default, info or debug) nor of the form tag=level", item));
        if (hasTag)
            thresholds.byTag_.insert_or_assign(std::string(tag), *level);
        else
            thresholds.general_ = *level;
    }
    return thresholds;
}

LogLevel LogThresholds::threshold(std::string_view tag) const
{
    const auto found = byTag_.find(tag);
    return found == byTag_.end() ? general_ : found->second;
}

} // namespace platform
