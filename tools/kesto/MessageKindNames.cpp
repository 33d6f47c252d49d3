// SPDX-License-Identifier: Apache-2.0
// The vocabulary only maps numbers to names, so these functions try every number that has a name.
#include "kesto/MessageKindNames.h"

#include <algorithm>
#include <array>
#include <ranges>

namespace {

constexpr std::array<AudioEventCategory, 7> groups{0,          0x04000000, 0x08000000, 0x10000000,
                                                   0x20000000, 0x40000000, 0x80000000};
constexpr AudioEventCategory lastCategory = 15;
constexpr AudioEventType lastType = 18;

} // namespace

std::optional<AudioEventCategory> categoryNamed(std::string_view name)
{
    for (const AudioEventCategory group : groups)
        for (AudioEventCategory base = 0; base <= lastCategory; ++base)
            if (KestoReportingUtilityCategoryString(group | base) == name)
                return group | base;
    return std::nullopt;
}

std::optional<AudioEventType> eventTypeNamed(std::string_view name)
{
    for (AudioEventType type = 0; type <= lastType; ++type)
        if (KestoReportingUtilityTypeString(type) == name)
            return type;
    if (KestoReportingUtilityTypeString(AudioEventTypeUnknown) == name)
        return AudioEventTypeUnknown;
    return std::nullopt;
}

std::optional<AudioServiceType> serviceTypeNamed(std::string_view name)
{
    const AudioServiceType type = KestoReportingUtilityGenerateServiceTypeFromServiceName(name);
    if (KestoReportingUtilityGenerateServiceNameFromServiceType(type) != name)
        return std::nullopt;
    return type;
}
