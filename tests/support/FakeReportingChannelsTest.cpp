// The channels of the tests select, sample and subtract as the ones of a device do.
#include "support/FakeReportingChannels.h"

#include <gmock/gmock.h>

namespace {

using platform::ReportingChannel;

ReportingChannel channel(std::string group, std::string subgroup, std::string name, std::int64_t value)
{
    ReportingChannel channel;
    channel.driver = "driver";
    channel.group = std::move(group);
    channel.subgroup = std::move(subgroup);
    channel.name = std::move(name);
    channel.value = value;
    return channel;
}

class FakeReportingChannelsTest : public testing::Test {
protected:
    platform::ReportingSample sample(std::optional<std::string_view> group, std::optional<std::string_view> subgroup)
    {
        const auto found = channels.copyChannelsInGroup(group, subgroup);
        const auto subscribed = channels.createSubscription(*found.channels);
        return channels.createSamples(*subscribed.subscription, *subscribed.channels).value();
    }

    support::FakeReportingChannels channels;
};

TEST_F(FakeReportingChannelsTest, AnAbsentGroupOrSubgroupMeansAny)
{
    channels.publish(channel("Haptics", "Stats", "a", 1));
    channels.publish(channel("Haptics", "MCA", "b", 2));
    channels.publish(channel("Speaker", "MCA", "c", 3));
    EXPECT_EQ(sample("Haptics", std::nullopt).channels.size(), 2U);
    EXPECT_EQ(sample(std::nullopt, "MCA").channels.size(), 2U);
    EXPECT_EQ(sample("Haptics", "MCA").channels.size(), 1U);
    EXPECT_EQ(sample("Rx", std::nullopt).channels.size(), 0U);
}

TEST_F(FakeReportingChannelsTest, ADifferenceIsWhatChangedSinceTheEarlierSample)
{
    auto published = channel("Haptics", "Stats", "a", 5);
    published.buckets = {{.lower = 0, .upper = 10, .hits = 3}};
    published.states = {{.name = "On", .transitions = 1, .residency = 10}, {.name = "Off", .residency = 10}};
    channels.publish(published);
    const auto before = sample("Haptics", std::nullopt);

    published.value = 12;
    published.buckets[0].hits = 7;
    published.states[0].transitions = 4;
    published.states[0].residency = 40;
    published.states[1].residency = 20;
    channels.publish(published);
    const auto difference = channels.createDifference(before, sample("Haptics", std::nullopt)).value().channels;

    ASSERT_EQ(difference.size(), 1U);
    EXPECT_EQ(difference[0].value, 7);
    EXPECT_EQ(difference[0].buckets[0].hits, 4);
    EXPECT_EQ(difference[0].states[0].transitions, 3U);
    EXPECT_EQ(difference[0].states[0].residency, 30U);
    EXPECT_DOUBLE_EQ(difference[0].states[0].dutyCycle, 0.75);
}

TEST_F(FakeReportingChannelsTest, EachStepFailsWhereTheTestWantsIt)
{
    auto& failures = channels.failures("Rx", std::nullopt);
    failures.copy = 1;
    EXPECT_EQ(channels.copyChannelsInGroup("Rx", std::nullopt).channels, nullptr);
    failures.copy.reset();
    failures.copiesNothing = true;
    const auto neither = channels.copyChannelsInGroup("Rx", std::nullopt);
    EXPECT_EQ(neither.error, std::nullopt);
    EXPECT_EQ(neither.channels, nullptr);
    failures.copiesNothing = false;
    failures.copy = 1;
    failures.copiesAnyway = true;
    const auto found = channels.copyChannelsInGroup("Rx", std::nullopt);
    EXPECT_EQ(found.error, 1);
    ASSERT_NE(found.channels, nullptr);
    failures.subscription = 2;
    const auto subscribed = channels.createSubscription(*found.channels);
    EXPECT_EQ(subscribed.error, 2);
    EXPECT_EQ(subscribed.channels, nullptr);
    failures.subscription.reset();
    failures.subscribesToNothing = true;
    EXPECT_EQ(channels.createSubscription(*found.channels).error, std::nullopt);
    EXPECT_EQ(channels.createSubscription(*found.channels).channels, nullptr);
    failures.sample = 3;
    EXPECT_EQ(channels.createSamples(*subscribed.subscription, *found.channels).error(), 3);
    channels.failDifferences(4);
    EXPECT_EQ(channels.createDifference({}, {}).error(), 4);
}

} // namespace
