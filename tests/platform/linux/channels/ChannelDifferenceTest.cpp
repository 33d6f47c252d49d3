// SPDX-License-Identifier: Apache-2.0
// Differences of channels: which values are subtracted, and when a channel was reset.
#include "platform/linux/channels/ChannelDifference.h"

#include <algorithm>
#include <gtest/gtest.h>
#include <rapidcheck/gtest.h>
#include <string>

namespace platform {
namespace {

ReportingChannel named(std::string name, ChannelFormat format)
{
    ReportingChannel channel;
    channel.format = static_cast<std::uint8_t>(format);
    channel.driver = "amp";
    channel.name = std::move(name);
    return channel;
}

ReportingChannel simple(std::int64_t value, std::string name = "a")
{
    ReportingChannel channel = named(std::move(name), ChannelFormat::Simple);
    channel.value = value;
    return channel;
}

ReportingChannel histogram(std::int64_t minimum, std::int64_t maximum, std::vector<HistogramBucket> buckets)
{
    ReportingChannel channel = named("a", ChannelFormat::Histogram);
    channel.minimum = minimum;
    channel.maximum = maximum;
    channel.buckets = std::move(buckets);
    return channel;
}

ReportingChannel states(std::vector<StateResidency> given)
{
    ReportingChannel channel = named("a", ChannelFormat::State);
    channel.states = std::move(given);
    return channel;
}

// The difference of two samples with one channel each.
ReportingChannel difference(const ReportingChannel& from, const ReportingChannel& to)
{
    return channelDifference({{from}}, {{to}}).channels.at(0);
}

TEST(ChannelDifference, SubtractsValues)
{
    EXPECT_EQ(difference(simple(5), simple(12)).value, 7);
    EXPECT_EQ(difference(simple(5), simple(5)).value, 0);
    EXPECT_EQ(difference(simple(-5), simple(2)).value, 7);
}

TEST(ChannelDifference, TakesAValueThatWentDownForOneThatBeganAnew)
{
    EXPECT_EQ(difference(simple(12), simple(5)).value, 5);
    EXPECT_EQ(difference(simple(INT64_MAX), simple(3)).value, 3) << "it wrapped";
}

TEST(ChannelDifference, OfAChannelThatWasNotThereIsAllThatItHolds)
{
    const auto all = channelDifference({{simple(5, "a")}}, {{simple(6, "a"), simple(7, "b")}});
    ASSERT_EQ(all.channels.size(), 2U);
    EXPECT_EQ(all.channels[1].value, 7);
    EXPECT_TRUE(all.isWhole);
}

TEST(ChannelDifference, IsNoneOfAChannelThatTheFirstSampleMayNotHaveSeen)
{
    const ReportingSample inPart{.channels = {simple(5, "a")}, .isWhole = false};
    const auto seenTwice = channelDifference(inPart, {{simple(6, "a"), simple(7, "b")}});
    ASSERT_EQ(seenTwice.channels.size(), 1U);
    EXPECT_EQ(seenTwice.channels[0].name, "a");
    EXPECT_EQ(seenTwice.channels[0].value, 1);
    EXPECT_FALSE(seenTwice.isWhole);
    EXPECT_EQ(channelDifference({{simple(5, "b")}}, inPart).channels.size(), 1U);
}

TEST(ChannelDifference, IsNoneOfAChannelWhoseUserTheFirstSampleDidNotSeeWhole)
{
    const auto of = [](std::uint32_t user, ReportingChannel channel) {
        channel.user = user;
        return channel;
    };
    const ReportingSample cut{.channels = {of(1001, simple(5, "a"))}, .cutUsers = {1001, 1003}};
    const auto now = channelDifference(
        cut,
        {{of(1001, simple(6, "a")), of(1001, simple(7, "b")), of(1002, simple(8, "c")), of(1003, simple(9, "d"))}});
    ASSERT_EQ(now.channels.size(), 2U);
    EXPECT_EQ(now.channels[0].value, 1);
    EXPECT_EQ(now.channels[1].value, 8) << "of another user, so it is new";
}

TEST(ChannelDifference, OfMoreThanANumberHoldsIsTheMostItHolds)
{
    EXPECT_EQ(difference(simple(INT64_MIN), simple(INT64_MAX)).value, INT64_MAX);
    EXPECT_EQ(difference(simple(-1), simple(INT64_MAX)).value, INT64_MAX);
    EXPECT_EQ(difference(simple(INT64_MIN), simple(-1)).value, INT64_MAX);
}

TEST(ChannelDifference, SubtractsHitsAndKeepsTheNewerExtremes)
{
    const auto channel =
        difference(histogram(3, 37, {{.lower = 0, .upper = 10, .hits = 5}, {.lower = 10, .upper = 20, .hits = 1}}),
                   histogram(2, 40, {{.lower = 0, .upper = 10, .hits = 9}, {.lower = 10, .upper = 20, .hits = 1}}));
    EXPECT_EQ(channel.minimum, 2);
    EXPECT_EQ(channel.maximum, 40);
    EXPECT_EQ(channel.buckets[0].hits, 4);
    EXPECT_EQ(channel.buckets[1].hits, 0);
}

TEST(ChannelDifference, TakesAHistogramOfWhichOneBucketWentDownForOneThatBeganAnew)
{
    const auto channel =
        difference(histogram(3, 37, {{.lower = 0, .upper = 10, .hits = 5}, {.lower = 10, .upper = 20, .hits = 1}}),
                   histogram(4, 11, {{.lower = 0, .upper = 10, .hits = 4}, {.lower = 10, .upper = 20, .hits = 3}}));
    EXPECT_EQ(channel.buckets[0].hits, 4);
    EXPECT_EQ(channel.buckets[1].hits, 3) << "if one counter was reset, the whole channel was";
}

TEST(ChannelDifference, TakesAHistogramWithOtherBucketsForANewOne)
{
    const auto before = histogram(3, 37, {{.lower = 0, .upper = 10, .hits = 5}, {.lower = 10, .upper = 20, .hits = 1}});
    EXPECT_EQ(difference(before, histogram(3, 37, {{.lower = 0, .upper = 10, .hits = 6}})).buckets[0].hits, 6)
        << "it shrank";
    auto grown = before;
    grown.buckets.push_back({.lower = 20, .upper = 30, .hits = 1});
    EXPECT_EQ(difference(before, grown).buckets[0].hits, 5);
    auto moved = before;
    moved.buckets[1].upper = 30;
    EXPECT_EQ(difference(before, moved).buckets[0].hits, 5);
}

TEST(ChannelDifference, SubtractsTransitionsAndResidenciesAndSharesTheDifferenceOut)
{
    const auto channel = difference(states({{.name = "On", .transitions = 3, .residency = 1000, .dutyCycle = 0.1},
                                            {.name = "Off", .transitions = 2, .residency = 9000, .dutyCycle = 0.9}}),
                                    states({{.name = "On", .transitions = 5, .residency = 1750, .dutyCycle = 0.16},
                                            {.name = "Off", .transitions = 4, .residency = 9250, .dutyCycle = 0.84}}));
    EXPECT_EQ(channel.states[0].transitions, 2U);
    EXPECT_EQ(channel.states[0].residency, 750U);
    EXPECT_DOUBLE_EQ(channel.states[0].dutyCycle, 0.75);
    EXPECT_EQ(channel.states[1].residency, 250U);
    EXPECT_DOUBLE_EQ(channel.states[1].dutyCycle, 0.25);
}

TEST(ChannelDifference, HasNoShareOfNothing)
{
    const auto same = states({{.name = "On", .transitions = 3, .residency = 1000, .dutyCycle = 1}});
    EXPECT_EQ(difference(same, same).states[0].residency, 0U);
    EXPECT_EQ(difference(same, same).states[0].dutyCycle, 0);
}

TEST(ChannelDifference, FindsAStateByItsNameWhereverItStands)
{
    const auto channel = difference(states({{.name = "On", .transitions = 3, .residency = 1000}}),
                                    states({{.name = "Off", .transitions = 1, .residency = 500},
                                            {.name = "On", .transitions = 4, .residency = 1500}}));
    EXPECT_EQ(channel.states[0].residency, 500U) << "a state that was not there before";
    EXPECT_EQ(channel.states[1].transitions, 1U);
    EXPECT_EQ(channel.states[1].residency, 500U);
    EXPECT_DOUBLE_EQ(channel.states[1].dutyCycle, 0.5);
}

TEST(ChannelDifference, TakesAStateChannelForANewOneWhenACounterWentDownOrAStateIsGone)
{
    const auto before = states(
        {{.name = "On", .transitions = 3, .residency = 1000}, {.name = "Off", .transitions = 3, .residency = 1000}});
    const auto less = states(
        {{.name = "On", .transitions = 4, .residency = 900}, {.name = "Off", .transitions = 4, .residency = 2000}});
    EXPECT_EQ(difference(before, less).states[0].residency, 900U);
    EXPECT_EQ(difference(before, less).states[1].residency, 2000U);
    const auto fewer = states(
        {{.name = "On", .transitions = 2, .residency = 2000}, {.name = "Off", .transitions = 4, .residency = 2000}});
    EXPECT_EQ(difference(before, fewer).states[0].transitions, 2U);
    const auto gone = states({{.name = "On", .transitions = 4, .residency = 2000}});
    EXPECT_EQ(difference(before, gone).states[0].residency, 2000U);
    EXPECT_EQ(difference(before, gone).states[0].dutyCycle, 1);
}

TEST(ChannelDifference, TakesAChannelOfAnotherKindForANewOne)
{
    auto before = states({{.name = "On", .transitions = 3, .residency = 1000}});
    EXPECT_EQ(difference(before, simple(7)).value, 7);
}

TEST(ChannelDifference, OfAChannelThatWasNotThereIsWhatItHolds)
{
    const auto channels = channelDifference({{simple(5, "b")}}, {{simple(9, "a"), simple(6, "b")}}).channels;
    ASSERT_EQ(channels.size(), 2U);
    EXPECT_EQ(channels[0].value, 9);
    EXPECT_EQ(channels[1].value, 1);
}

TEST(ChannelDifference, KnowsNothingOfAChannelThatIsGone)
{
    EXPECT_TRUE(channelDifference({{simple(5)}}, {}).channels.empty());
    EXPECT_TRUE(channelDifference({}, {}).channels.empty());
}

TEST(ChannelDifference, TellsChannelsApartByAllOfTheirNames)
{
    auto inGroup = simple(10);
    inGroup.group = "Tx";
    auto inSubgroup = simple(100);
    inSubgroup.subgroup = "Tx";
    auto ofOther = simple(1000);
    ofOther.driver = "codec";
    const auto channels =
        channelDifference({{simple(1), inGroup, inSubgroup, ofOther}}, {{ofOther, inSubgroup, inGroup, simple(2)}})
            .channels;
    EXPECT_EQ(channels[0].value, 0);
    EXPECT_EQ(channels[1].value, 0);
    EXPECT_EQ(channels[2].value, 0);
    EXPECT_EQ(channels[3].value, 1);
}

// For all changes of counters, a difference does not exceed the later value, and differences add up unless a channel
// was reset.
RC_GTEST_PROP(ChannelDifferenceProperty, NeverReportsMoreThanThereIs, ())
{
    const auto counts = *rc::gen::container<std::vector<std::pair<std::uint32_t, std::uint32_t>>>(
        rc::gen::arbitrary<std::pair<std::uint32_t, std::uint32_t>>());
    std::vector<StateResidency> before;
    std::vector<StateResidency> after;
    for (std::size_t index = 0; index < counts.size(); ++index) {
        before.push_back({.name = std::to_string(index), .residency = counts[index].first});
        after.push_back({.name = std::to_string(index), .residency = counts[index].second});
    }
    const bool wentOn = std::ranges::all_of(counts, [](const auto& count) { return count.first <= count.second; });
    const auto channel = difference(states(before), states(after));
    double shares = 0;
    for (std::size_t index = 0; index < counts.size(); ++index) {
        RC_ASSERT(channel.states[index].residency == counts[index].second - (wentOn ? counts[index].first : 0));
        shares += channel.states[index].dutyCycle;
    }
    RC_ASSERT(shares == 0 || std::abs(shares - 1) < 1e-9);
}

} // namespace
} // namespace platform
