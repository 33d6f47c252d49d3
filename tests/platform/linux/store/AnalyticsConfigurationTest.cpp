// SPDX-License-Identifier: Apache-2.0
// Which events the service keeps, and how many: the settings that an owner may write, and the effect of wrong ones.
#include "platform/linux/store/AnalyticsConfiguration.h"

#include "platform/linux/settings/TomlFile.h"
#include "platform/linux/store/UsedEventNames.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <thread>

namespace platform {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

CheckedAnalyticsConfiguration read(std::string_view text)
{
    const auto values = parseToml(text);
    EXPECT_TRUE(values);
    return readAnalyticsConfiguration(values.value_or(foundation::Dictionary()));
}

TEST(AnalyticsConfigurationTest, NothingSaidIsTheDefault)
{
    const auto [configuration, problems] = read("");
    EXPECT_EQ(configuration, AnalyticsConfiguration());
    EXPECT_THAT(configuration.used, ElementsAre("com.quarn.*"));
    EXPECT_EQ(configuration.maximumAgeDays, 90);
    EXPECT_EQ(configuration.maximumSizeMegabytes, 256U);
    EXPECT_EQ(configuration.synchronization, StoreSynchronization::Normal);
    EXPECT_TRUE(configuration.stretches);
    EXPECT_THAT(problems, IsEmpty());
}

TEST(AnalyticsConfigurationTest, EverythingCanBeSaid)
{
    const auto [configuration, problems] = read("used = [\"a.*\", \"b\"]\nmaximum_age_days = 0.5\nmaximum_size_mb = 1\n"
                                                "synchronous = \"full\"\nstretches = false\n");
    EXPECT_THAT(configuration.used, ElementsAre("a.*", "b"));
    EXPECT_EQ(configuration.maximumAgeDays, 0.5);
    EXPECT_EQ(configuration.maximumSizeMegabytes, 1U);
    EXPECT_EQ(configuration.synchronization, StoreSynchronization::Full);
    EXPECT_FALSE(configuration.stretches);
    EXPECT_THAT(problems, IsEmpty());
    EXPECT_THAT(read("used = []").configuration.used, IsEmpty());
    EXPECT_EQ(read("synchronous = \"normal\"").configuration.synchronization, StoreSynchronization::Normal);
}

TEST(AnalyticsConfigurationTest, WhatIsWrongHasItsDefaultAndALine)
{
    const auto [configuration, problems] = read("maximum_age_days = 0\nmaximum_size_mb = 0.5\nused = [1]\n"
                                                "synchronous = \"off\"\nmaximum_sizemb = 3\n");
    EXPECT_EQ(configuration, AnalyticsConfiguration());
    EXPECT_THAT(
        problems,
        ElementsAre(
            "maximum_age_days = 0 should be a number of days above 0; the default counts until this is corrected",
            "maximum_size_mb = 0.5 should be a number of megabytes from 1 to 1048576; the default counts until "
            "this is corrected",
            "unknown key maximum_sizemb, ignored; the keys are enabled, used, maximum_age_days, maximum_size_mb, "
            "synchronous, stretches",
            "synchronous = off should be \"normal\" or \"full\"; the default counts until this is corrected",
            "used = [1] should be a list of patterns such as [\"com.quarn.*\"]; the default counts until this "
            "is corrected"));
}

TEST(AnalyticsConfigurationTest, NumbersOutOfRangeAreWrong)
{
    for (const char* text :
         {"maximum_size_mb = -1", "maximum_size_mb = inf", "maximum_size_mb = nan", "maximum_size_mb = 1048577",
          "maximum_size_mb = true", "maximum_size_mb = \"1\"", "maximum_age_days = -1", "maximum_age_days = nan",
          "maximum_age_days = true", "used = 1", "used = \"com.*\"", "used = {a = 1}", "synchronous = 1",
          "synchronous = true", "stretches = 0", "stretches = \"false\""}) {
        EXPECT_EQ(read(text).problems.size(), 1U) << text;
        EXPECT_EQ(read(text).configuration, AnalyticsConfiguration()) << text;
    }
}

TEST(AnalyticsConfigurationTest, OneWrongValueLeavesTheOthersAsTheyAre)
{
    EXPECT_EQ(read("maximum_age_days = 7\nmaximum_size_mb = 0").configuration.maximumAgeDays, 7);
}

// --- Patterns

struct PatternCase {
    const char* pattern;
    const char* name;
    bool matches;
};

class PatternTest : public testing::TestWithParam<PatternCase> { };

TEST_P(PatternTest, Matches)
{
    const auto& [pattern, name, matches] = GetParam();
    EXPECT_EQ(matchesAny({pattern}, name), matches) << pattern << " and " << name;
}

INSTANTIATE_TEST_SUITE_P(
    Patterns, PatternTest,
    testing::Values(PatternCase{"com.quarn.*", "com.quarn.kesto.Playback.Start", true},
                    PatternCase{"com.quarn.*", "com.quarn.", true}, PatternCase{"com.quarn.*", "com.quarn", false},
                    PatternCase{"com.quarn.*", "com-quarn-x", false}, PatternCase{"com.quarn.*", "xcom.quarn.a", false},
                    PatternCase{"*", "", true}, PatternCase{"*", "anything/at all", true}, PatternCase{"", "", true},
                    PatternCase{"", "a", false}, PatternCase{"a", "", false}, PatternCase{"a", "A", false},
                    PatternCase{"*.Start", "com.quarn.kesto.Playback.Start", true},
                    PatternCase{"*.Start", "com.quarn.kesto.Playback.Started", false},
                    PatternCase{"*Playback*", "com.quarn.kesto.DSP_Playback.Stop", true},
                    PatternCase{"a*b*c", "aXbYbZc", true}, PatternCase{"a*b*c", "aXbYbZ", false},
                    PatternCase{"a**b", "ab", true}, PatternCase{"a?c", "abc", true}, PatternCase{"a?c", "ac", false},
                    PatternCase{"a?c", "aéc", true}, PatternCase{"a?c", "abbc", false},
                    PatternCase{"a[bc]d", "acd", true}, PatternCase{"a[bc]d", "aed", false},
                    PatternCase{"a[^bc]d", "aed", true}, PatternCase{"a[^bc]d", "abd", false},
                    PatternCase{"a[b-d]", "ac", true}, PatternCase{"a[b-d]", "ae", false},
                    PatternCase{"a[]]", "a]", true}, PatternCase{"a[*]", "a*", true}, PatternCase{"a[*]", "ab", false},
                    PatternCase{"a[b", "ab", false}, PatternCase{"a[", "a[", false}, PatternCase{"%", "abc", false},
                    PatternCase{"a\\*", "a*", false}));

TEST(UsedEventNamesTest, NothingIsUsedWithoutPatterns)
{
    UsedEventNames names;
    EXPECT_FALSE(names.contains("com.quarn.kesto.Playback.Start"));
}

TEST(UsedEventNamesTest, OneOfThePatternsIsEnough)
{
    UsedEventNames names;
    names.setPatterns({"a.*", "b.*"});
    EXPECT_TRUE(names.contains("a.x"));
    EXPECT_TRUE(names.contains("b.x"));
    EXPECT_FALSE(names.contains("c.x"));
}

TEST(UsedEventNamesTest, NewPatternsCountForNamesThatWereAskedForBefore)
{
    UsedEventNames names;
    names.setPatterns({"a.*"});
    EXPECT_TRUE(names.contains("a.x"));
    EXPECT_FALSE(names.contains("b.x"));
    names.setPatterns({"b.*"});
    EXPECT_FALSE(names.contains("a.x"));
    EXPECT_TRUE(names.contains("b.x"));
}

TEST(UsedEventNamesTest, WhatOneWasToldDoesNotCountForAnother)
{
    UsedEventNames first;
    UsedEventNames second;
    first.setPatterns({"a.*"});
    for (int round = 0; round < 2; ++round) {
        EXPECT_TRUE(first.contains("a.x"));
        EXPECT_FALSE(second.contains("a.x"));
    }
}

TEST(UsedEventNamesTest, MoreNamesThanAreRememberedStillGetTheRightAnswer)
{
    UsedEventNames names;
    names.setPatterns({"*7"});
    for (std::size_t round = 0; round < 2; ++round)
        for (std::size_t number = 0; number < 2 * UsedEventNames::answersRemembered; ++number)
            ASSERT_EQ(names.contains("name" + std::to_string(number)), number % 10 == 7);
}

TEST(UsedEventNamesTest, PatternsMayChangeWhileOthersAsk)
{
    UsedEventNames names;
    std::jthread changer([&names](const std::stop_token& stop) {
        while (!stop.stop_requested()) {
            names.setPatterns({"a.*", "b.*"});
            names.setPatterns({"a.*"});
        }
    });
    names.setPatterns({"a.*"});
    for (int round = 0; round < 20'000; ++round)
        ASSERT_TRUE(names.contains("a.x"));
}

} // namespace
} // namespace platform
