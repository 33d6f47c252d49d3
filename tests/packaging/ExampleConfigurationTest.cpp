// SPDX-License-Identifier: Apache-2.0
// The example configuration files are correct, and hold only the defaults, with which the units agree. The manual pages
// have every key, table and operation.
#include "client/ServiceOperations.h"
#include "platform/linux/memory/MemoryConfiguration.h"
#include "platform/linux/settings/TomlFile.h"
#include "platform/linux/store/AnalyticsConfiguration.h"
#include "platform/linux/store/SqliteConnection.h"
#include "platform/linux/store/applications/ApplicationRules.h"
#include "platform/linux/store/tables/StoreSchema.h"
#include "support/ManualPage.h"

#include <filesystem>
#include <fstream>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <iterator>
#include <regex>
#include <string>
#include <vector>

namespace platform {
namespace {

using foundation::Dictionary;
using foundation::Value;
using support::findAll;
using support::keysOnPage;
using testing::ElementsAre;
using testing::ElementsAreArray;
using testing::IsEmpty;
using testing::IsSupersetOf;
using testing::Not;
using testing::UnorderedElementsAreArray;

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

// --- the manual pages

std::filesystem::path page(const std::string& name)
{
    return std::filesystem::path(KESTO_EXAMPLES) / "../man" / name;
}

// The keys that the service knows, as it names them when it meets another one.
std::vector<std::string> keysIn(const std::vector<std::string>& problems)
{
    EXPECT_EQ(problems.size(), 1U);
    return support::keysIn(problems.at(0));
}

TEST(ManualPages, DescribeEveryKey)
{
    const Dictionary unknown = {{"no-such-key", true}};
    EXPECT_THAT(keysOnPage(page("kesto-analytics.toml.5")),
                UnorderedElementsAreArray(keysIn(readAnalyticsConfiguration(unknown).problems)));
    EXPECT_THAT(keysOnPage(page("kesto-applications.toml.5")),
                UnorderedElementsAreArray(keysIn(readApplicationsConfiguration(unknown).problems)));
    EXPECT_THAT(keysOnPage(page("kesto-limits.toml.5")),
                UnorderedElementsAreArray(keysIn(readMemoryLimits(unknown, 0).problems)));
    // Of these files the service reads single keys: the examples are tested to have the same ones.
    EXPECT_THAT(keysOnPage(page("kesto-device.toml.5")), ElementsAre("InternalBuild"));
    EXPECT_THAT(keysOnPage(page("kesto-feature-flags.toml.5")), ElementsAre("Tracing"));
    EXPECT_THAT(keysOnPage(page("kesto-preferences.5")),
                ElementsAre("device_name", "disable_reporting", "spatial-audio-accessory-feature"));
}

std::vector<std::string> namesIn(SqliteConnection& database, const std::string& query)
{
    std::vector<std::string> names;
    if (const auto statement = database.prepare(query))
        while (statement->step().value_or(false))
            names.emplace_back(statement->text(0));
    EXPECT_THAT(names, Not(IsEmpty())) << query;
    return names;
}

TEST(ManualPages, NameEveryTableAndTheColumnsThatProgramsRead)
{
    const auto database = SqliteConnection::open(":memory:");
    ASSERT_TRUE(database && StoreSchema::make(**database));
    const std::string text = textOf("../man/kesto-store.7");
    EXPECT_THAT(findAll(text, "\\b([a-z_]+)\\b"),
                IsSupersetOf(namesIn(**database,
                                     "SELECT name FROM sqlite_schema WHERE name NOT LIKE 'sqlite_%'"
                                     " AND type IN ('table', 'view')")));
    for (const std::string table : {"events", "sessions", "sources", "stretches"}) {
        const std::size_t begin = text.find("\n.It Ic " + table + "\n");
        ASSERT_NE(begin, std::string::npos) << table;
        const std::string item = text.substr(begin + 1, text.find("\n.It", begin + 1) - begin);
        EXPECT_THAT(
            findAll(item, "\n\\.Ic ([a-z_]+)"),
            UnorderedElementsAreArray(namesIn(**database, "SELECT name FROM pragma_table_info('" + table + "')")));
    }
}

TEST(ManualPages, NumberTheOperationsOfTheProtocol)
{
    const std::string text = textOf("../man/kesto-protocol.7");
    std::vector<std::string> names;
    for (const client::ServiceOperation& operation : client::serviceOperations)
        names.emplace_back(operation.name());
    EXPECT_THAT(findAll(text, "\n\\.It [0-9]+\n([A-Za-z]+):"), ElementsAreArray(names));
    EXPECT_EQ(findAll(text, "\n\\.It ([0-9]+)\n").back(), std::to_string(names.size()));
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
