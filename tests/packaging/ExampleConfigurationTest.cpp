// SPDX-License-Identifier: Apache-2.0
// The example configuration files are correct, and hold only the defaults, with which the units agree.
#include "platform/linux/memory/MemoryConfiguration.h"
#include "platform/linux/settings/TomlFile.h"
#include "platform/linux/store/AnalyticsConfiguration.h"
#include "platform/linux/store/applications/ApplicationRules.h"

#include <fstream>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <iterator>
#include <regex>
#include <string>

namespace platform {
namespace {

using foundation::Dictionary;
using foundation::Value;
using testing::IsEmpty;

std::string textOf(const std::string& name)
{
    std::ifstream file(std::string(KESTO_EXAMPLES) + "/" + name);
    EXPECT_TRUE(file) << name;
    return {std::istreambuf_iterator(file), {}};
}

Dictionary parsed(const std::string& text)
{
    const auto values = parseToml(text);
    EXPECT_TRUE(values) << "line " << values.error().line << ": " << values.error().reason;
    return values.value_or(Dictionary());
}

TEST(ExampleConfiguration, AnalyticsShowsEveryDefault)
{
    const Dictionary values = parsed(textOf("analytics.toml"));
    const auto checked = readAnalyticsConfiguration(values);
    EXPECT_THAT(checked.problems, IsEmpty());
    EXPECT_EQ(checked.configuration, AnalyticsConfiguration());
    EXPECT_EQ(values.size(), 6U) << "a key that the example does not show";
}

TEST(ExampleConfiguration, ApplicationsShowEveryDefault)
{
    const Dictionary values = parsed(textOf("applications.toml"));
    const auto checked = readApplicationsConfiguration(values);
    EXPECT_THAT(checked.problems, IsEmpty());
    EXPECT_EQ(checked.configuration, ApplicationsConfiguration());
    EXPECT_EQ(values.size(), 2U) << "a key that the example does not show";
}

TEST(ExampleConfiguration, LimitsShowEveryDefaultAndTheMostMemory)
{
    constexpr std::size_t largeMachine = std::size_t{64} << 30;
    const std::string text = textOf("limits.toml");
    const Dictionary values = parsed(text);
    const auto defaults = readMemoryLimits({}, largeMachine);
    const auto checked = readMemoryLimits(values, largeMachine);
    EXPECT_THAT(checked.problems, IsEmpty());
    EXPECT_EQ(checked.limits, defaults.limits);
    EXPECT_EQ(values.size(), 2U);
    const Dictionary withMemory = parsed(std::regex_replace(text, std::regex("\n# memory_mb"), "\nmemory_mb"));
    EXPECT_EQ(withMemory.size(), 3U) << "a key that the example does not show";
    EXPECT_EQ(readMemoryLimits(withMemory, 0).limits, defaults.limits);
}

// --- the units

// The number of megabytes of a setting of the service's unit.
std::size_t megabytesIn(const std::string& unit, const std::string& setting)
{
    std::smatch found;
    const bool isThere = std::regex_search(unit, found, std::regex("\n" + setting + "=([0-9]+)M\n"));
    EXPECT_TRUE(isThere) << setting;
    return isThere ? std::stoul(found[1]) : 0;
}

TEST(ServiceUnits, LeaveTheLargestDefaultItsRoomAndAsMuchBeside)
{
    for (const char* manager : {"system", "user"}) {
        const std::string unit = textOf("../systemd/" + std::string(manager) + "/kestod.service.in");
        const std::size_t high = megabytesIn(unit, "MemoryHigh");
        EXPECT_EQ(high, 2 * (DefaultMemory::most >> 20)) << manager;
        EXPECT_EQ(megabytesIn(unit, "MemoryMax"), high + high / 2) << manager;
        EXPECT_NE(unit.find("\nLogRateLimitIntervalSec=60s\nLogRateLimitBurst=10000\n"), std::string::npos) << manager;
    }
}

// --- the other examples

TEST(ExampleConfiguration, DeviceAndFeaturesAreOffAsWithoutAFile)
{
    EXPECT_EQ(parsed(textOf("device.toml")), (Dictionary{{"InternalBuild", false}}));
    EXPECT_EQ(parsed(textOf("feature-flags.toml")), (Dictionary{{"Sonalis", Dictionary{{"Tracing", false}}}}));
}

TEST(ExampleConfiguration, PreferencesAreShownButNotSet)
{
    const std::pair<std::string, Dictionary> domains[] = {
        {"com.quarn.kesto", {{"device_name", "Kitchen radio"}, {"disable_reporting", true}}},
        {"com.quarn.halden", {{"spatial-audio-accessory-feature", true}}}};
    for (const auto& [domain, shown] : domains) {
        const std::string text = textOf("preferences/" + domain + ".toml");
        EXPECT_EQ(parsed(text), Dictionary());
        const std::regex commentedSetting("(^|\n)# ([a-z_-]+ = )");
        EXPECT_EQ(parsed(std::regex_replace(text, commentedSetting, "$1$2")), shown);
    }
}

} // namespace
} // namespace platform
