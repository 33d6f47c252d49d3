// SPDX-License-Identifier: Apache-2.0
// A client is one of its user's, so it never gets a larger part than its user.
#include "platform/linux/memory/MemoryConfiguration.h"

#include "platform/linux/settings/CheckedSettings.h"

#include <algorithm>
#include <limits>

namespace platform {

using foundation::Value;

namespace {

constexpr double mostMegabytes = 1024.0 * 1024;
constexpr double bytesOfAMegabyte = 1024.0 * 1024;
// The other half is for the service's own work.
constexpr double addressableBytes = static_cast<double>(std::numeric_limits<std::size_t>::max()) / 2;

struct Settings {
    double bytes;
    double partOfAUser = DefaultMemory::partOfAUser;
    double partOfAClient = DefaultMemory::partOfAClient;
};

bool readPart(const Value& value, double& part)
{
    const auto number = positiveNumberOf(value);
    if (!number || *number > 1)
        return false;
    part = *number;
    return true;
}

constexpr std::string_view part = "a part above 0, up to 1";

constexpr Setting<Settings> table[] = {
    {"memory_mb", "a number of megabytes from 1 to 1048576",
     [](const Value& value, Settings& settings) {
         const auto megabytes = positiveNumberOf(value);
         if (!megabytes || *megabytes < 1 || *megabytes > mostMegabytes)
             return false;
         settings.bytes = std::min(*megabytes * bytesOfAMegabyte, addressableBytes);
         return true;
     }},
    {"memory_part_of_user", part,
     [](const Value& value, Settings& settings) { return readPart(value, settings.partOfAUser); }},
    {"memory_part_of_client", part,
     [](const Value& value, Settings& settings) { return readPart(value, settings.partOfAClient); }}};

} // namespace

CheckedMemoryLimits readMemoryLimits(const foundation::Dictionary& values, std::uint64_t bytesOfTheMachine)
{
    Settings settings{
        .bytes = static_cast<double>(std::clamp<std::uint64_t>(bytesOfTheMachine / DefaultMemory::partOfTheMachine,
                                                               DefaultMemory::least, DefaultMemory::most))};
    CheckedMemoryLimits checked;
    checked.problems = readSettings<Settings>(values, table, settings);
    const double ofAUser = settings.bytes * settings.partOfAUser;
    checked.limits = {.ofTheService = static_cast<std::size_t>(settings.bytes),
                      .ofAUser = static_cast<std::size_t>(ofAUser),
                      .ofAClient =
                          static_cast<std::size_t>(std::min(settings.bytes * settings.partOfAClient, ofAUser))};
    return checked;
}

} // namespace platform
