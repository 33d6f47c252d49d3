// SPDX-License-Identifier: Apache-2.0
// The contract of platform/ReportingChannels.h: finding channels, samples, and differences of two samples.
#include "platform/contract/Contract.h"
#include "platform/linux/channels/LinuxReportingChannels.h"
#include "support/TemporaryDirectory.h"
#include "support/fakes/FakeLog.h"
#include "support/fakes/FakeReportingChannels.h"

#include <fmt/format.h>
#include <gmock/gmock.h>
#include <map>

namespace contract {
namespace {

using platform::ChannelFormat;
using platform::ReportingChannel;
using platform::ReportingChannels;
using platform::ReportingSample;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Pair;
using testing::UnorderedElementsAre;
using Name = std::optional<std::string_view>;

class ReportingChannelsSubject {
public:
    virtual ~ReportingChannelsSubject() = default;
    [[nodiscard]] virtual ReportingChannels& channels() = 0;
    // A driver publishes the channel, or its new values.
    virtual void publish(const ReportingChannel& channel) = 0;
    virtual void withdraw(const ReportingChannel& channel) = 0;
    // Whether channels of any group can be sampled.
    virtual void breakDown(bool isBroken) = 0;
};

class FakeReportingChannelsSubject final : public ReportingChannelsSubject {
public:
    [[nodiscard]] ReportingChannels& channels() override { return channels_; }
    void publish(const ReportingChannel& channel) override { channels_.publish(channel); }
    void withdraw(const ReportingChannel& channel) override { channels_.withdraw(channel); }
    void breakDown(bool isBroken) override
    {
        constexpr platform::ReportingChannelError error = 5;
        auto& failures = channels_.failures(std::nullopt, std::nullopt);
        failures.copy = failures.sample = isBroken ? std::optional(error) : std::nullopt;
    }

private:
    support::FakeReportingChannels channels_;
};

class LinuxReportingChannelsSubject final : public ReportingChannelsSubject {
public:
    [[nodiscard]] ReportingChannels& channels() override { return channels_; }
    void publish(const ReportingChannel& channel) override
    {
        std::filesystem::create_directories(pathOf(channel).parent_path());
        support::writeFile(pathOf(channel), textOf(channel));
    }
    void withdraw(const ReportingChannel& channel) override { std::filesystem::remove(pathOf(channel)); }
    void breakDown(bool isBroken) override
    {
        const std::filesystem::path aside = directory_ / "aside";
        if (isBroken) {
            std::filesystem::rename(root_, aside);
            support::writeFile(root_, "a file in its place");
        } else {
            std::filesystem::remove(root_);
            std::filesystem::rename(aside, root_);
        }
    }

private:
    [[nodiscard]] std::filesystem::path pathOf(const ReportingChannel& channel) const
    {
        return root_ / *channel.driver / channel.group.value_or("-") / channel.subgroup.value_or("-") / *channel.name;
    }
    static std::string textOf(const ReportingChannel& channel)
    {
        std::string text;
        switch (static_cast<ChannelFormat>(channel.format)) {
        case ChannelFormat::Histogram:
            text = fmt::format("histogram {}\n{} {}\n", *channel.unit, channel.minimum, channel.maximum);
            for (const auto& bucket : channel.buckets)
                text += fmt::format("{} {} {}\n", bucket.lower, bucket.upper, bucket.hits);
            break;
        case ChannelFormat::State:
            text = "state\n";
            for (const auto& state : channel.states)
                text += fmt::format("{} {} {} {}\n", state.name, state.transitions, state.residency, state.dutyCycle);
            break;
        default: text = fmt::format("simple\n{}\n", channel.value);
        }
        return text;
    }

    const support::TemporaryDirectory directory_;
    const std::filesystem::path root_ = directory_ / "channels";
    support::FakeLog log_;
    ledger::Ledger ledger_;
    platform::LinuxReportingChannels channels_{root_, directory_ / "asound", ledger_, platform::ProviderLog(log_)};
};

ReportingChannel channel(ChannelFormat format, std::string name)
{
    ReportingChannel channel;
    channel.format = static_cast<std::uint8_t>(format);
    channel.driver = "amp";
    channel.group = "Speaker";
    channel.name = std::move(name);
    return channel;
}

ReportingChannel simple(std::string name, std::int64_t value)
{
    ReportingChannel made = channel(ChannelFormat::Simple, std::move(name));
    made.value = value;
    return made;
}

ReportingChannel in(std::optional<std::string> group, std::optional<std::string> subgroup, ReportingChannel channel)
{
    channel.group = std::move(group);
    channel.subgroup = std::move(subgroup);
    return channel;
}

ReportingChannel histogram(std::vector<platform::HistogramBucket> buckets)
{
    ReportingChannel made = channel(ChannelFormat::Histogram, "histogram");
    made.unit = "ms";
    made.minimum = 3;
    made.maximum = 37;
    made.buckets = std::move(buckets);
    return made;
}

ReportingChannel states(std::vector<platform::StateResidency> given)
{
    ReportingChannel made = channel(ChannelFormat::State, "states");
    made.states = std::move(given);
    return made;
}

class ReportingChannelsContract : public Suite<ReportingChannelsSubject> {
protected:
    std::shared_ptr<const ReportingChannels::Moment> moment() { return subject->channels().readChannels({{}}); }
    ReportingChannels::FoundChannels find(Name group, Name subgroup)
    {
        return subject->channels().copyChannelsInGroup(group, subgroup, *moment());
    }
    ReportingChannels::Subscribed subscribe(Name group, Name subgroup)
    {
        const auto found = find(group, subgroup);
        EXPECT_EQ(found.error, std::nullopt);
        auto subscribed = subject->channels().createSubscription(*found.channels);
        EXPECT_EQ(subscribed.error, std::nullopt);
        EXPECT_NE(subscribed.subscription, nullptr);
        EXPECT_NE(subscribed.channels, nullptr);
        return subscribed;
    }
    ReportingSample sample(const ReportingChannels::Subscribed& subscribed)
    {
        return subject->channels().createSamples(*subscribed.subscription, *subscribed.channels, *moment()).value();
    }
    // The only channel of the difference between two states of it.
    ReportingChannel difference(const ReportingChannel& before, const ReportingChannel& now)
    {
        subject->publish(before);
        const auto subscribed = subscribe("Speaker", std::nullopt);
        const auto from = sample(subscribed);
        subject->publish(now);
        return subject->channels().createDifference(from, sample(subscribed)).value().channels.at(0);
    }
    static std::map<std::string, std::int64_t> valuesOf(const ReportingSample& sample)
    {
        std::map<std::string, std::int64_t> values;
        for (const ReportingChannel& each : sample.channels)
            EXPECT_TRUE(values.emplace(*each.name, each.value).second) << *each.name << " is there twice";
        return values;
    }
};
KESTO_CONTRACT(ReportingChannelsContract, (provider<ReportingChannelsSubject, FakeReportingChannelsSubject>("Fake")),
               (provider<ReportingChannelsSubject, LinuxReportingChannelsSubject>("Linux")));

TEST_P(ReportingChannelsContract, AreFoundByGroupAndSubgroupAndAnAbsentOneMeansAny)
{
    subject->publish(in("Speaker", "MCA", simple("a", 1)));
    subject->publish(in("Speaker", std::nullopt, simple("b", 2)));
    subject->publish(in(std::nullopt, "MCA", simple("c", 3)));
    const auto namesOf = [&](Name group, Name subgroup) {
        const auto found = find(group, subgroup);
        const auto values = valuesOf(sample(subscribe(group, subgroup)));
        EXPECT_EQ(subject->channels().channelCount(*found.channels), values.size());
        std::string names;
        for (const auto& [name, value] : values)
            names += name;
        return names;
    };
    EXPECT_EQ(namesOf("Speaker", std::nullopt), "ab");
    EXPECT_EQ(namesOf(std::nullopt, "MCA"), "ac");
    EXPECT_EQ(namesOf("Speaker", "MCA"), "a");
    EXPECT_EQ(namesOf(std::nullopt, std::nullopt), "abc");
}

TEST_P(ReportingChannelsContract, AreASetWithoutChannelsOrNoneWithoutPublishers)
{
    subject->publish(simple("a", 1));
    const auto found = find("Rx", std::nullopt);
    EXPECT_EQ(found.error, std::nullopt);
    EXPECT_TRUE(found.channels == nullptr || subject->channels().channelCount(*found.channels) == 0);
}

TEST_P(ReportingChannelsContract, AreCountedAsTheyWereWhenTheSetWasFound)
{
    subject->publish(simple("a", 1));
    const auto found = find("Speaker", std::nullopt);
    const auto subscribed = subject->channels().createSubscription(*found.channels);
    subject->publish(simple("b", 1));
    EXPECT_EQ(subject->channels().channelCount(*found.channels), 1U);
    EXPECT_EQ(subject->channels().channelCount(*subscribed.channels), 1U);
    const auto again = find("Speaker", std::nullopt);
    EXPECT_EQ(subject->channels().channelCount(*again.channels), 2U);
}

TEST_P(ReportingChannelsContract, AreSampledAsTheyAreAtThatMoment)
{
    subject->publish(simple("changed", 1));
    subject->publish(simple("gone", 1));
    const auto subscribed = subscribe("Speaker", std::nullopt); // the found set is already destroyed
    const auto before = sample(subscribed);
    subject->publish(simple("changed", 5));
    subject->publish(simple("new", 7));
    subject->publish(in("Rx", std::nullopt, simple("of another group", 1)));
    subject->withdraw(simple("gone", 1));
    EXPECT_THAT(valuesOf(sample(subscribed)), ElementsAre(Pair("changed", 5), Pair("new", 7)));
    EXPECT_THAT(valuesOf(before), ElementsAre(Pair("changed", 1), Pair("gone", 1))) << "a sample stays as it is";
}

TEST_P(ReportingChannelsContract, StayInAMomentAsTheyWereForTheSamplesOfAllGroups)
{
    subject->publish(simple("a", 1));
    subject->publish(in("Rx", std::nullopt, simple("b", 2)));
    subject->publish(in("Tx", std::nullopt, simple("c", 3)));
    const auto speaker = subscribe("Speaker", std::nullopt);
    const auto rx = subscribe("Rx", std::nullopt);
    const auto then = subject->channels().readChannels({{"Speaker", {}}, {"Rx", {}}});
    subject->publish(simple("a", 10));
    subject->withdraw(in("Rx", std::nullopt, simple("b", 2)));
    const auto sampleThen = [&](const ReportingChannels::Subscribed& of) {
        return valuesOf(subject->channels().createSamples(*of.subscription, *of.channels, *then).value());
    };
    EXPECT_THAT(sampleThen(speaker), ElementsAre(Pair("a", 1)));
    EXPECT_THAT(sampleThen(rx), ElementsAre(Pair("b", 2)));
    EXPECT_THAT(valuesOf(sample(speaker)), ElementsAre(Pair("a", 10)));
}

TEST_P(ReportingChannelsContract, AreSampledWithAllThatTheyHave)
{
    subject->publish(in("Speaker", "MCA", simple("simple", -7)));
    subject->publish(histogram({{.lower = 0, .upper = 10, .hits = 5}, {.lower = 10, .upper = 20, .hits = 0}}));
    subject->publish(states({{.name = "On the way", .transitions = 12, .residency = 88'000, .dutyCycle = 0.75},
                             {.name = "Off", .transitions = 11, .residency = 12'000, .dutyCycle = 0.25}}));
    std::map<std::string, ReportingChannel> channels;
    for (const ReportingChannel& each : sample(subscribe("Speaker", std::nullopt)).channels) {
        EXPECT_EQ(each.driver, "amp");
        EXPECT_EQ(each.group, "Speaker");
        channels.emplace(*each.name, each);
    }
    ASSERT_EQ(channels.size(), 3U);

    const ReportingChannel& counter = channels.at("simple");
    EXPECT_EQ(counter.format, 1);
    EXPECT_EQ(counter.subgroup, "MCA");
    EXPECT_EQ(counter.value, -7);
    EXPECT_THAT(counter.buckets, IsEmpty());
    EXPECT_THAT(counter.states, IsEmpty());

    const ReportingChannel& residencies = channels.at("states");
    EXPECT_EQ(residencies.format, 2);
    EXPECT_EQ(residencies.subgroup, std::nullopt);
    ASSERT_EQ(residencies.states.size(), 2U);
    EXPECT_EQ(residencies.states[0].name, "On the way");
    EXPECT_EQ(residencies.states[0].transitions, 12U);
    EXPECT_EQ(residencies.states[1].residency, 12'000U);
    EXPECT_EQ(residencies.states[1].dutyCycle, 0.25);

    const ReportingChannel& buckets = channels.at("histogram");
    EXPECT_EQ(buckets.format, 3);
    EXPECT_EQ(buckets.unit, "ms");
    EXPECT_EQ(buckets.minimum, 3);
    EXPECT_EQ(buckets.maximum, 37);
    ASSERT_EQ(buckets.buckets.size(), 2U);
    EXPECT_EQ(buckets.buckets[0].lower, 0);
    EXPECT_EQ(buckets.buckets[0].upper, 10);
    EXPECT_EQ(buckets.buckets[0].hits, 5);
    EXPECT_EQ(buckets.buckets[0].boundsError, 0);
}

TEST_P(ReportingChannelsContract, AnswerWithAnErrorWhileTheyCannotBeRead)
{
    subject->publish(simple("a", 1));
    const auto subscribed = subscribe(std::nullopt, std::nullopt);
    subject->breakDown(true);
    const auto found = find(std::nullopt, std::nullopt);
    EXPECT_TRUE(found.error && *found.error != 0);
    const auto failed = subject->channels().createSamples(*subscribed.subscription, *subscribed.channels, *moment());
    ASSERT_FALSE(failed);
    EXPECT_NE(failed.error(), 0);
    subject->breakDown(false);
    EXPECT_THAT(valuesOf(sample(subscribed)), ElementsAre(Pair("a", 1))) << "the subscription holds";
}

// --- differences

TEST_P(ReportingChannelsContract, DifferByWhatWasAddedAndTellOfNewChannelsAllAndOfThoseGoneNothing)
{
    for (const char* name : {"kept", "still", "gone", "begun anew"})
        subject->publish(simple(name, 10));
    const auto subscribed = subscribe("Speaker", std::nullopt);
    const auto before = sample(subscribed);
    subject->publish(simple("kept", 15));
    subject->withdraw(simple("gone", 10));
    subject->publish(simple("begun anew", 4));
    subject->publish(simple("new", 7));
    const auto difference = subject->channels().createDifference(before, sample(subscribed)).value();
    EXPECT_THAT(valuesOf(difference),
                UnorderedElementsAre(Pair("kept", 5), Pair("still", 0), Pair("begun anew", 4), Pair("new", 7)));
}

TEST_P(ReportingChannelsContract, TellApartChannelsOfOneNameInSeveralPlaces)
{
    subject->publish(in("Speaker", "MCA", simple("a", 1)));
    subject->publish(in("Speaker", "Stats", simple("a", 100)));
    const auto subscribed = subscribe("Speaker", std::nullopt);
    const auto before = sample(subscribed);
    subject->publish(in("Speaker", "Stats", simple("a", 103)));
    std::map<std::string, std::int64_t> values;
    const auto difference = subject->channels().createDifference(before, sample(subscribed)).value();
    for (const auto& each : difference.channels)
        values[each.subgroup.value()] = each.value;
    EXPECT_THAT(values, ElementsAre(Pair("MCA", 0), Pair("Stats", 3)));
}

TEST_P(ReportingChannelsContract, DifferInHitsAndKeepTheNewerExtremes)
{
    ReportingChannel now = histogram({{.lower = 0, .upper = 10, .hits = 9}, {.lower = 10, .upper = 20, .hits = 1}});
    now.maximum = 40;
    const auto changed =
        difference(histogram({{.lower = 0, .upper = 10, .hits = 5}, {.lower = 10, .upper = 20, .hits = 1}}), now);
    EXPECT_EQ(changed.maximum, 40);
    EXPECT_EQ(changed.buckets.at(0).hits, 4);
    EXPECT_EQ(changed.buckets.at(1).hits, 0);
}

TEST_P(ReportingChannelsContract, CountAChannelWholeOfWhichOneCounterBeganAnew)
{
    const auto changed =
        difference(histogram({{.lower = 0, .upper = 10, .hits = 5}, {.lower = 10, .upper = 20, .hits = 1}}),
                   histogram({{.lower = 0, .upper = 10, .hits = 4}, {.lower = 10, .upper = 20, .hits = 3}}));
    EXPECT_EQ(changed.buckets.at(0).hits, 4);
    EXPECT_EQ(changed.buckets.at(1).hits, 3);
}

TEST_P(ReportingChannelsContract, DifferInStatesByTheirNamesAndShareTheDifferenceOut)
{
    const auto changed = difference(states({{.name = "On", .transitions = 3, .residency = 1000, .dutyCycle = 1}}),
                                    states({{.name = "Off", .transitions = 1, .residency = 500, .dutyCycle = 0.2},
                                            {.name = "On", .transitions = 4, .residency = 2500, .dutyCycle = 0.8}}));
    ASSERT_EQ(changed.states.size(), 2U);
    EXPECT_EQ(changed.states[0].residency, 500U) << "a state that was not there before";
    EXPECT_EQ(changed.states[1].transitions, 1U);
    EXPECT_EQ(changed.states[1].residency, 1500U);
    EXPECT_DOUBLE_EQ(changed.states[0].dutyCycle, 0.25);
    EXPECT_DOUBLE_EQ(changed.states[1].dutyCycle, 0.75);
}

} // namespace
} // namespace contract
