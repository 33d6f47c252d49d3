// SPDX-License-Identifier: Apache-2.0
// Subscribing to the eight driver groups, and snapshots of them.
#include "driver/KestoReportingDriverUtility.h"
#include "support/DriverMoment.h"

#include <gmock/gmock.h>

namespace {

using enum platform::LogLevel;
using platform::ReportingChannel;
using support::driverMoment;
using support::IsLine;
using testing::Contains;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Key;
using testing::Not;
using testing::Pair;
using testing::SizeIs;

ReportingChannel channelOf(std::optional<std::string> group, std::optional<std::string> subgroup,
                           std::int64_t value = 1)
{
    ReportingChannel channel;
    channel.format = static_cast<std::uint8_t>(platform::ChannelFormat::Simple);
    channel.driver = "amp";
    channel.group = std::move(group);
    channel.subgroup = std::move(subgroup);
    channel.name = "count";
    channel.value = value;
    return channel;
}

class DriverUtility : public testing::Test {
protected:
    using Name = support::FakeReportingChannels::Name;

    // One channel for each driver of the table.
    void publishAll()
    {
        for (const char* group : {"QuarnZT4", "Speaker", "StateTransitionTimes_ms", "Rx", "Tx"})
            channels.publish(channelOf(group, std::nullopt));
        channels.publish(channelOf("Haptics", "Stats"));
        for (const char* subgroup : {"MCA", "HwAudio2"})
            channels.publish(channelOf(std::nullopt, subgroup));
    }
    static std::vector<std::string> descriptions(const KestoReportingDriverUtility& utility)
    {
        std::vector<std::string> all;
        for (const auto& subscription : utility.ioChannelSubscriptions())
            all.push_back(subscription.driver.description());
        return all;
    }

    support::TestPlatform platform;
    support::FakeReportingChannels& channels = platform.reportingChannels;
};

// --- the drivers

TEST(Driver, IsDescribedByItsGroupAndSubgroup)
{
    EXPECT_EQ((KestoReportingDriver{"Haptics", "Stats"}).description(), "Haptics-Stats");
    EXPECT_EQ((KestoReportingDriver{"Speaker", std::nullopt}).description(), "Speaker-(null)");
    EXPECT_EQ((KestoReportingDriver{std::nullopt, "MCA"}).description(), "(null)-MCA");
    EXPECT_EQ((KestoReportingDriver{std::nullopt, std::nullopt}).description(), "(null)-(null)");
}

TEST_F(DriverUtility, AsksForTheEightDriversInTheOrderOfTheTable)
{
    const KestoReportingDriverUtility utility;
    EXPECT_THAT(channels.asked(),
                ElementsAre(Pair(Name("QuarnZT4"), Name()), Pair(Name("Speaker"), Name()), Pair(Name(), Name("MCA")),
                            Pair(Name("Haptics"), Name("Stats")), Pair(Name("StateTransitionTimes_ms"), Name()),
                            Pair(Name("Rx"), Name()), Pair(Name("Tx"), Name()), Pair(Name(), Name("HwAudio2"))));
}

TEST_F(DriverUtility, ReadsTheChannelsOfAllDriversAtOnce)
{
    publishAll();
    const KestoReportingDriverUtility utility;
    EXPECT_EQ(channels.readings(), 1U);
    EXPECT_THAT(utility.getSnapShot(driverMoment(utility, platform)), SizeIs(8));
    EXPECT_EQ(channels.readings(), 2U);
}

TEST_F(DriverUtility, NeedsNoMomentAndNoThreadWithoutSubscriptions)
{
    const KestoReportingDriverUtility utility;
    EXPECT_FALSE(utility.needsMoments());
    EXPECT_THAT(platform.workQueues.made(), IsEmpty());
}

TEST_F(DriverUtility, ReadsMomentsOnAQueueOfItsOwn)
{
    publishAll();
    const KestoReportingDriverUtility utility;
    ASSERT_THAT(platform.workQueues.made(), SizeIs(1));
    EXPECT_EQ(platform.workQueues.made()[0].name, "com.quarn.kesto.reporting.channels");
    bool isRead = false;
    utility.readMoment([&](auto) { isRead = true; });
    EXPECT_FALSE(isRead);
    EXPECT_EQ(channels.readings(), 1U) << "when it looked for channels";
    platform.workQueues.runAll();
    EXPECT_TRUE(isRead);
    EXPECT_EQ(channels.readings(), 2U);
}

TEST_F(DriverUtility, ReadsOnceForAllThatAskedBeforeAndAgainForThoseThatAskMeanwhile)
{
    publishAll();
    const KestoReportingDriverUtility utility;
    std::vector<session::DriverMoment> moments;
    const auto keep = [&](session::DriverMoment moment) { moments.push_back(std::move(moment)); };
    utility.readMoment(keep);
    utility.readMoment(keep);
    utility.readMoment([&](auto) { utility.readMoment(keep); }); // runs when the channels have been read
    platform.workQueues.runAll();
    EXPECT_EQ(channels.readings(), 3U) << "the first when it looked for channels";
    ASSERT_THAT(moments, SizeIs(3));
    EXPECT_EQ(moments[0], moments[1]);
    EXPECT_NE(moments[1], moments[2]);
}

TEST_F(DriverUtility, ReadsOnTheCallersThreadIfTheSystemHasNoOther)
{
    publishAll();
    platform.workQueues.hasThreads = false;
    const KestoReportingDriverUtility utility;
    session::DriverMoment moment;
    utility.readMoment([&](session::DriverMoment read) { moment = std::move(read); });
    EXPECT_THAT(utility.getSnapShot(moment), SizeIs(8));
    EXPECT_THAT(platform.log.lines(),
                testing::Contains(IsLine(Error, "kerd",
                                         "no thread reads the channels of drivers (Resource temporarily unavailable): "
                                         "all calls wait while a session starts or stops")));
}

TEST_F(DriverUtility, SubscribesToEveryDriverThatPublishes)
{
    publishAll();
    const KestoReportingDriverUtility utility;
    EXPECT_THAT(descriptions(utility),
                ElementsAre("QuarnZT4-(null)", "Speaker-(null)", "(null)-MCA", "Haptics-Stats",
                            "StateTransitionTimes_ms-(null)", "Rx-(null)", "Tx-(null)", "(null)-HwAudio2"));
    for (const auto& subscription : utility.ioChannelSubscriptions()) {
        EXPECT_NE(subscription.subscription, nullptr);
        EXPECT_NE(subscription.subscribedChannels, nullptr);
    }
}

// --- the log of subscriptions

TEST_F(DriverUtility, SaysOnceThatADriverHasNoChannelsAndNothingLater)
{
    const KestoReportingDriverUtility utility;
    EXPECT_THAT(
        platform.log.take(),
        ElementsAre(IsLine(Info, "kerd", "creating cavlet driver utility"),
                    IsLine(Info, "kerd", "couldn't find any channels for driver group QuarnZT4-(null)"),
                    IsLine(Info, "kerd", "couldn't find any channels for driver group Speaker-(null)"),
                    IsLine(Info, "kerd", "couldn't find any channels for driver group (null)-MCA"),
                    IsLine(Info, "kerd", "couldn't find any channels for driver group Haptics-Stats"),
                    IsLine(Info, "kerd", "couldn't find any channels for driver group StateTransitionTimes_ms-(null)"),
                    IsLine(Info, "kerd", "couldn't find any channels for driver group Rx-(null)"),
                    IsLine(Info, "kerd", "couldn't find any channels for driver group Tx-(null)"),
                    IsLine(Info, "kerd", "couldn't find any channels for driver group (null)-HwAudio2")));
    EXPECT_THAT(utility.ioChannelSubscriptions(), IsEmpty());
    EXPECT_THAT(utility.getSnapShot(driverMoment(utility, platform)), IsEmpty());
    EXPECT_THAT(platform.log.take(), IsEmpty());
}

TEST_F(DriverUtility, SaysWhatItSubscribedTo)
{
    channels.publish(channelOf(std::nullopt, "MCA"));
    const KestoReportingDriverUtility utility;
    EXPECT_THAT(platform.log.lines(), Contains(IsLine(Info, "kerd", "subscribed to group group (null)-MCA")));
    EXPECT_THAT(descriptions(utility), ElementsAre("(null)-MCA"));
}

TEST_F(DriverUtility, LeavesOutADriverWhoseChannelsCannotBeHad)
{
    publishAll();
    channels.failures("Rx", std::nullopt).copy = 7;
    const KestoReportingDriverUtility utility;
    EXPECT_THAT(platform.log.lines(), Contains(IsLine(Error, "kerd", "error 7 getting channels for driver Rx-(null)")));
    EXPECT_THAT(platform.log.lines(),
                Not(Contains(IsLine(Info, "kerd", "couldn't find any channels for driver group Rx-(null)"))))
        << "there was no channel to count";
    EXPECT_THAT(descriptions(utility), SizeIs(7));
    EXPECT_THAT(descriptions(utility), Not(Contains("Rx-(null)")));
}

TEST_F(DriverUtility, GoesOnWithChannelsThatCameBackBesideAnError)
{
    publishAll();
    auto& failures = channels.failures("Rx", std::nullopt);
    failures.copy = -536870212;
    failures.copiesAnyway = true;
    const KestoReportingDriverUtility utility;
    EXPECT_THAT(platform.log.lines(),
                Contains(IsLine(Error, "kerd", "error -536870212 getting channels for driver Rx-(null)")));
    EXPECT_THAT(descriptions(utility), SizeIs(8));
}

TEST_F(DriverUtility, SaysBothThatAnErrorCameBackAndThatThereAreNoChannelsBesideIt)
{
    auto& failures = channels.failures("Rx", std::nullopt);
    failures.copy = 7;
    failures.copiesAnyway = true;
    const KestoReportingDriverUtility utility;
    const auto lines = platform.log.lines();
    ASSERT_THAT(lines, SizeIs(10));
    EXPECT_THAT(lines[6], IsLine(Error, "kerd", "error 7 getting channels for driver Rx-(null)"));
    EXPECT_THAT(lines[7], IsLine(Info, "kerd", "couldn't find any channels for driver group Rx-(null)"));
}

TEST_F(DriverUtility, SubscribesToWhatCameBackBesideAnErrorAndDoesNotSayTheError)
{
    channels.publish(channelOf("Rx", std::nullopt));
    auto& failures = channels.failures("Rx", std::nullopt);
    failures.subscription = 9;
    failures.subscribesAnyway = true;
    const KestoReportingDriverUtility utility;
    EXPECT_THAT(platform.log.lines(), Contains(IsLine(Info, "kerd", "subscribed to group group Rx-(null)")));
    EXPECT_THAT(platform.log.lines(),
                Not(Contains(IsLine(Error, "kerd", "error 9 creating subscription for Rx-(null)"))));
    EXPECT_THAT(utility.getSnapShot(driverMoment(utility, platform)), SizeIs(1));
}

TEST_F(DriverUtility, LeavesOutADriverWithChannelsButWithoutASubscription)
{
    publishAll();
    channels.failures("Rx", std::nullopt).subscribesWithoutHandle = true;
    auto& failures = channels.failures("Tx", std::nullopt);
    failures.subscribesWithoutHandle = true;
    failures.subscription = 9;
    failures.subscribesAnyway = true;
    const KestoReportingDriverUtility utility;
    EXPECT_THAT(descriptions(utility), SizeIs(6));
    EXPECT_THAT(utility.getSnapShot(driverMoment(utility, platform)), SizeIs(6));
    EXPECT_THAT(platform.log.lines(), Contains(IsLine(Error, "kerd", "error 9 creating subscription for Tx-(null)")));
    EXPECT_THAT(platform.log.lines(), Not(Contains(IsLine(Info, "kerd", "subscribed to group group Rx-(null)"))));
}

TEST_F(DriverUtility, LeavesOutADriverThatCannotBeSubscribedTo)
{
    publishAll();
    channels.failures(std::nullopt, "HwAudio2").subscription = 9;
    const KestoReportingDriverUtility utility;
    EXPECT_THAT(platform.log.lines(),
                Contains(IsLine(Error, "kerd", "error 9 creating subscription for (null)-HwAudio2")));
    EXPECT_THAT(descriptions(utility), SizeIs(7));
    EXPECT_THAT(utility.getSnapShot(driverMoment(utility, platform)), SizeIs(7));
}

TEST_F(DriverUtility, SaysNothingOfADriverForWhichNeitherChannelsNorAnErrorComeBack)
{
    publishAll();
    channels.failures("Rx", std::nullopt).copiesNothing = true;
    channels.failures("Tx", std::nullopt).subscribesToNothing = true;
    const KestoReportingDriverUtility utility;
    EXPECT_THAT(platform.log.lines(),
                ElementsAre(IsLine(Info, "kerd", "creating cavlet driver utility"),
                            IsLine(Info, "kerd", "subscribed to group group QuarnZT4-(null)"),
                            IsLine(Info, "kerd", "subscribed to group group Speaker-(null)"),
                            IsLine(Info, "kerd", "subscribed to group group (null)-MCA"),
                            IsLine(Info, "kerd", "subscribed to group group Haptics-Stats"),
                            IsLine(Info, "kerd", "subscribed to group group StateTransitionTimes_ms-(null)"),
                            IsLine(Info, "kerd", "subscribed to group group (null)-HwAudio2")));
    EXPECT_THAT(descriptions(utility),
                ElementsAre("QuarnZT4-(null)", "Speaker-(null)", "(null)-MCA", "Haptics-Stats",
                            "StateTransitionTimes_ms-(null)", "(null)-HwAudio2"));
}

// --- snapshots

TEST_F(DriverUtility, TakesASnapshotOfEveryDriverUnderItsDescription)
{
    publishAll();
    const KestoReportingDriverUtility utility;
    platform.log.clear();
    const auto snapShot = utility.getSnapShot(driverMoment(utility, platform));
    EXPECT_THAT(snapShot, SizeIs(8));
    ASSERT_THAT(snapShot, Contains(Key("(null)-MCA")));
    ASSERT_THAT(snapShot.at("(null)-MCA").channels, SizeIs(1));
    EXPECT_EQ(snapShot.at("(null)-MCA").channels[0].subgroup, "MCA");
    const auto lines = platform.log.lines();
    ASSERT_THAT(lines, SizeIs(8));
    EXPECT_THAT(lines[0], IsLine(Info, "kerd", "sampling driver QuarnZT4-(null)"));
    EXPECT_THAT(lines[2], IsLine(Info, "kerd", "sampling driver (null)-MCA"));
}

TEST_F(DriverUtility, SaysWhichDriverItSamplesBeforeItDoes)
{
    channels.publish(channelOf("Rx", std::nullopt));
    const KestoReportingDriverUtility utility;
    std::vector<std::string> steps;
    platform.log.setObserver([&](const support::LogLine& line) { steps.push_back(line.message); });
    channels.setSampleObserver([&] { steps.emplace_back("sample"); });
    EXPECT_THAT(utility.getSnapShot(driverMoment(utility, platform)), SizeIs(1));
    platform.log.setObserver(nullptr);
    EXPECT_THAT(steps, ElementsAre("sampling driver Rx-(null)", "sample"));
}

TEST_F(DriverUtility, KeepsTheOtherDriversWhenOneCannotBeSampled)
{
    publishAll();
    const KestoReportingDriverUtility utility;
    channels.failures("Tx", std::nullopt).sample = 5;
    platform.log.clear();
    const auto snapShot = utility.getSnapShot(driverMoment(utility, platform));
    EXPECT_THAT(snapShot, SizeIs(7));
    EXPECT_THAT(snapShot, Not(Contains(Key("Tx-(null)"))));
    EXPECT_THAT(platform.log.lines(), Contains(IsLine(Error, "kerd", "creating samples of driver Tx-(null): error 5")));
    channels.failures("Tx", std::nullopt).sample.reset();
    EXPECT_THAT(utility.getSnapShot(driverMoment(utility, platform)), SizeIs(8)) << "the subscription lives on";
}

TEST_F(DriverUtility, NeverSubscribesAgain)
{
    const KestoReportingDriverUtility utility;
    publishAll();
    EXPECT_THAT(utility.getSnapShot(driverMoment(utility, platform)), IsEmpty());
    EXPECT_THAT(channels.asked(), SizeIs(8));
}

TEST_F(DriverUtility, SnapshotsHoldWhatTheChannelsHeldThen)
{
    channels.publish(channelOf("Speaker", std::nullopt, 5));
    const KestoReportingDriverUtility utility;
    const auto snapShot = utility.getSnapShot(driverMoment(utility, platform));
    channels.publish(channelOf("Speaker", std::nullopt, 8));
    EXPECT_EQ(snapShot.at("Speaker-(null)").channels.at(0).value, 5);
    EXPECT_EQ(utility.getSnapShot(driverMoment(utility, platform)).at("Speaker-(null)").channels.at(0).value, 8);
}

} // namespace
