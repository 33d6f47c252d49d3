// SPDX-License-Identifier: Apache-2.0
// How the drivers' channels changed during a session, as text, and which services get the text.
#include "driver/KestoReportingDriverUtility.h"
#include "support/DriverMoment.h"
#include "support/TestPlatform.h"

#include <gmock/gmock.h>
#include <locale>

namespace {

using enum platform::LogLevel;
using foundation::Dictionary;
using foundation::Value;
using platform::ChannelFormat;
using platform::ReportingChannel;
using support::AnalyticsEvent;
using support::IsLine;
using testing::Contains;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;
using testing::SizeIs;

ReportingChannel channelNamed(std::string name, ChannelFormat format)
{
    ReportingChannel channel;
    channel.format = static_cast<std::uint8_t>(format);
    channel.driver = "amp";
    channel.group = "Speaker";
    channel.name = std::move(name);
    return channel;
}

ReportingChannel simple(std::int64_t value, std::string name = "count")
{
    ReportingChannel channel = channelNamed(std::move(name), ChannelFormat::Simple);
    channel.value = value;
    return channel;
}

ReportingChannel histogram(std::vector<platform::HistogramBucket> buckets)
{
    ReportingChannel channel = channelNamed("latency", ChannelFormat::Histogram);
    channel.unit = "ms";
    channel.minimum = 3;
    channel.maximum = 37;
    channel.buckets = std::move(buckets);
    return channel;
}

ReportingChannel states(std::vector<platform::StateResidency> given)
{
    ReportingChannel channel = channelNamed("power", ChannelFormat::State);
    channel.states = std::move(given);
    return channel;
}

using DriverStats = KestoReportingDriverUtility::DriverStats;
using Process = void (*)(const ReportingChannel&, DriverStats&);

// The text of one channel; nothing if it is left out.
std::optional<Value> said(Process process, const ReportingChannel& channel)
{
    DriverStats stats;
    process(channel, stats);
    EXPECT_LE(stats.size(), 1U);
    return stats.empty() ? std::nullopt : std::optional(stats[0].value);
}

const Process processSimpleData = KestoReportingDriverUtility::processSimpleData;
const Process processHistogramData = KestoReportingDriverUtility::processHistogramData;
const Process processStateData = KestoReportingDriverUtility::processStateData;

// --- keys

TEST(DriverStatsKey, IsMadeOfAllThatAChannelIsCalled)
{
    ReportingChannel channel;
    channel.driver = "SpeakerAmp<0x1a>";
    channel.group = "Haptics";
    channel.subgroup = "Stats";
    channel.name = "Over Temp_Count";
    EXPECT_EQ(KestoReportingDriverUtility::getDriverStatsKey(channel, "Simple"),
              "SpeakerAmp_Haptics_Stats_Simple_OverTempCount");
}

TEST(DriverStatsKey, LeavesOutWhatAChannelDoesNotHave)
{
    const auto key = KestoReportingDriverUtility::getDriverStatsKey;
    ReportingChannel channel;
    EXPECT_EQ(key(channel, "State"), "State_");
    channel.name = "count";
    EXPECT_EQ(key(channel, "State"), "State_count");
    channel.subgroup = "MCA";
    EXPECT_EQ(key(channel, "State"), "MCA_State_count");
    channel.driver = "amp";
    EXPECT_EQ(key(channel, "State"), "amp_MCA_State_count");
    channel.subgroup.reset();
    channel.group = "Rx";
    EXPECT_EQ(key(channel, "State"), "amp_Rx_State_count");
}

TEST(DriverStatsKey, DeletesUnderscoresAndBlanksAndNothingElse)
{
    ReportingChannel channel;
    channel.driver = "_my amp_";
    channel.group = "State Transition_Times ms";
    channel.subgroup = "a-b.c\td<e>";
    channel.name = "__ <x> µ__";
    EXPECT_EQ(KestoReportingDriverUtility::getDriverStatsKey(channel, "Histogram"),
              "myamp_StateTransitionTimesms_a-b.c\td<e>_Histogram_<x>µ");
}

TEST(DriverStatsKey, TakesADriverUpToItsFirstBracket)
{
    ReportingChannel channel;
    channel.name = "n";
    for (const auto& [driver, expected] :
         std::vector<std::pair<std::string, std::string>>{{"amp", "amp_Simple_n"},
                                                          {"amp<1>", "amp_Simple_n"},
                                                          {"amp <1><2>", "amp_Simple_n"},
                                                          {"<1>", "_Simple_n"},
                                                          {"", "_Simple_n"},
                                                          {"amp>1<", "amp>1_Simple_n"},
                                                          {"_ _", "_Simple_n"}}) {
        channel.driver = driver;
        EXPECT_EQ(KestoReportingDriverUtility::getDriverStatsKey(channel, "Simple"), expected) << driver;
    }
}

// --- simple values

TEST(SimpleData, IsTheNumber)
{
    EXPECT_EQ(said(processSimpleData, simple(5)), Value(5));
    EXPECT_EQ(said(processSimpleData, simple(1)), Value(1));
    EXPECT_EQ(said(processSimpleData, simple(INT64_MAX)), Value(INT64_MAX));
}

TEST(SimpleData, IsNotReportedBelowOne)
{
    for (const std::int64_t value : {std::int64_t{0}, std::int64_t{-1}, INT64_MIN})
        EXPECT_EQ(said(processSimpleData, simple(value)), std::nullopt) << value;
}

// --- histograms

TEST(HistogramData, NamesTheBucketsThatWereHit)
{
    EXPECT_EQ(said(processHistogramData,
                   histogram({{.lower = 0, .upper = 10, .hits = 5},
                              {.lower = 10, .upper = 20, .hits = 0},
                              {.lower = 20, .upper = 30, .hits = 0},
                              {.lower = 30, .upper = 40, .hits = 2}})),
              Value("count=4,lower=0,upper=40,min=3,max=37,unit=ms::0-10:5;30-40:2"));
}

TEST(HistogramData, OfWhichNoBucketWasHitIsNotReported)
{
    EXPECT_EQ(said(processHistogramData, histogram({{.lower = 0, .upper = 10, .hits = 0}})), std::nullopt);
    EXPECT_EQ(said(processHistogramData, histogram({})), std::nullopt);
}

TEST(HistogramData, HasZeroBetweenItsBounds)
{
    EXPECT_EQ(said(processHistogramData, histogram({{.lower = 10, .upper = 20, .hits = 1}})),
              Value("count=1,lower=0,upper=20,min=3,max=37,unit=ms::10-20:1"));
    EXPECT_EQ(said(processHistogramData, histogram({{.lower = -20, .upper = -10, .hits = 1}})),
              Value("count=1,lower=-20,upper=0,min=3,max=37,unit=ms::-20--10:1"));
}

TEST(HistogramData, CountsBoundsOfBucketsThatWereNotHit)
{
    EXPECT_EQ(said(processHistogramData,
                   histogram({{.lower = -5, .upper = 0, .hits = 0},
                              {.lower = 0, .upper = 1, .hits = 1},
                              {.lower = 1, .upper = 99, .hits = 0}})),
              Value("count=3,lower=-5,upper=99,min=3,max=37,unit=ms::0-1:1"));
}

TEST(HistogramData, ReportsABucketOfWhichHitsWentDown)
{
    EXPECT_EQ(said(processHistogramData, histogram({{.lower = 0, .upper = 1, .hits = -4}})),
              Value("count=1,lower=0,upper=1,min=3,max=37,unit=ms::0-1:-4"));
}

TEST(HistogramData, GoesOnWithTheBoundsThatWereRead)
{
    const support::TestPlatform platform;
    EXPECT_EQ(said(processHistogramData,
                   histogram({{.lower = 0, .upper = 10, .hits = 5},
                              {.lower = -5, .upper = 50, .hits = 2, .boundsError = 22}})),
              Value("count=2,lower=-5,upper=50,min=3,max=37,unit=ms::0-10:5;-5-50:2"));
    EXPECT_THAT(platform.log.lines(), ElementsAre(IsLine(Info, "kerd", "Error in getting the bucket bounds : 22")));
}

TEST(HistogramData, MayHaveNoUnit)
{
    ReportingChannel channel = histogram({{.lower = 0, .upper = 1, .hits = 1}});
    channel.unit.reset();
    EXPECT_EQ(said(processHistogramData, channel), Value("count=1,lower=0,upper=1,min=3,max=37,unit=(null)::0-1:1"));
}

// --- states

TEST(StateData, NamesTheStatesInWhichTimeWasSpent)
{
    EXPECT_EQ(said(processStateData,
                   states({{.name = "Running", .transitions = 12, .residency = 88'000, .dutyCycle = 0.88},
                           {.name = "Off", .transitions = 3, .residency = 0, .dutyCycle = 0},
                           {.name = "Idle", .transitions = 0, .residency = 12'000, .dutyCycle = 0.12}})),
              Value("name:Running,transition:12,residency:88000,duty_cycle:0.880000;"
                    "name:Idle,transition:0,residency:12000,duty_cycle:0.120000;"));
}

TEST(StateData, IsReportedEmptyWhenNoTimeWasSpentInAnyState)
{
    EXPECT_EQ(said(processStateData, states({{.name = "On", .transitions = 3, .residency = 0}})), Value(""));
    EXPECT_EQ(said(processStateData, states({})), Value(""));
}

TEST(StateData, HasNumbersOfAnySize)
{
    EXPECT_EQ(said(processStateData,
                   states({{.name = "On", .transitions = UINT64_MAX, .residency = UINT64_MAX, .dutyCycle = 1.0 / 3}})),
              Value("name:On,transition:18446744073709551615,residency:18446744073709551615,duty_cycle:0.333333;"));
}

TEST(StateData, IsLoggedForWhoDebugs)
{
    const support::TestPlatform platform;
    said(processStateData, states({{.name = "On", .transitions = 1, .residency = 2, .dutyCycle = 1}}));
    EXPECT_THAT(platform.log.lines(),
                ElementsAre(IsLine(Debug, "kerd",
                                   "the current reported data is : "
                                   "name:On,transition:1,residency:2,duty_cycle:1.000000;")));
}

TEST(StateData, IsLoggedEvenWhenItIsEmpty)
{
    const support::TestPlatform platform;
    said(processStateData, states({{.name = "On", .transitions = 1, .residency = 0}}));
    EXPECT_THAT(platform.log.lines(), ElementsAre(IsLine(Debug, "kerd", "the current reported data is : ")));
}

// --- a session's driver logs

class DriverLogs : public testing::Test {
protected:
    DriverLogs()
    {
        platform.analytics.use("*");
        session->setServiceType(7);
    }

    void publish(ReportingChannel channel) { platform.reportingChannels.publish(std::move(channel)); }
    // The service starts with the present channels, and the session takes its snapshot.
    void begin()
    {
        utility.emplace();
        session->start();
        session->setDriverSnapShot(utility->getSnapShot(support::driverMoment(*utility, platform)));
        forget();
    }
    void forget()
    {
        platform.analytics.clear();
        platform.log.clear();
    }
    // The session's messages, as "identifier: payload".
    std::vector<std::string> end()
    {
        utility->sendDriverLogsForSession(platform.turn, session, support::driverMoment(*utility, platform));
        std::vector<std::string> messages;
        for (const Dictionary& message : session->nestedAggregatedPayloadData().value_or(std::vector<Dictionary>()))
            for (const auto& [identifier, payload] : message)
                messages.push_back(std::string(identifier.view()) + ": "
                                   + payload.dictionary()->without("kestoreporting_timestamp").values()[0].text());
        return messages;
    }
    std::vector<std::string> errors()
    {
        std::vector<std::string> messages;
        for (const auto& line : platform.log.lines("kerd"))
            if (line.level == Error)
                messages.push_back(line.message);
        return messages;
    }

    support::TestPlatform platform;
    std::shared_ptr<KestoReportingSession> session =
        std::make_shared<KestoReportingSession>(42, std::vector<std::int32_t>{7});
    std::optional<KestoReportingDriverUtility> utility;
};

TEST_F(DriverLogs, TellTheSessionAndTheAnalyticsBridgeByKindOfChannel)
{
    publish(simple(10));
    publish(histogram({{.lower = 0, .upper = 10, .hits = 5}}));
    publish(states({{.name = "On", .transitions = 1, .residency = 100}}));
    begin();
    publish(simple(15));
    publish(histogram({{.lower = 0, .upper = 10, .hits = 7}}));
    publish(states({{.name = "On", .transitions = 3, .residency = 350}}));
    EXPECT_THAT(end(),
                ElementsAre("Cavlet_Simple_1: 5",
                            "Cavlet_Histogram_1: count=1,lower=0,upper=10,min=3,max=37,unit=ms::0-10:2",
                            "Cavlet_State_1: name:On,transition:2,residency:250,duty_cycle:1.000000;"));
    EXPECT_THAT(platform.analytics.sent(),
                ElementsAre("com.quarn.kesto.Cavlet.Simple", "com.quarn.longformaudio.Cavlet.Simple",
                            "com.quarn.kesto.Cavlet.Histogram", "com.quarn.longformaudio.Cavlet.Histogram",
                            "com.quarn.kesto.Cavlet.State", "com.quarn.longformaudio.Cavlet.State"));
    EXPECT_EQ(*platform.analytics.payloads("com.quarn.kesto.Cavlet.Simple")[0].find("amp_Speaker_Simple_count"),
              Value(5));
}

TEST_F(DriverLogs, TellTheSessionFirstAndThenTheAnalyticsBridge)
{
    publish(simple(10));
    publish(states({{.name = "On", .transitions = 1, .residency = 100}}));
    begin();
    publish(simple(15));
    std::vector<std::string> steps;
    platform.traceEmitter.setObserver([&](std::uint32_t) { steps.emplace_back("session"); });
    platform.analytics.setObserver([&](const std::string& name) { steps.push_back(name); });
    end();
    platform.traceEmitter.setObserver(nullptr);
    platform.analytics.setObserver(nullptr);
    EXPECT_THAT(steps,
                ElementsAre("session", "com.quarn.kesto.Cavlet.Simple", "com.quarn.longformaudio.Cavlet.Simple",
                            "session", "com.quarn.kesto.Cavlet.State", "com.quarn.longformaudio.Cavlet.State"));
}

TEST_F(DriverLogs, SayThatSamplesAreTakenBeforeTheyAreAndThatTheyWereBehindIt)
{
    publish(simple(10));
    begin();
    std::vector<std::string> steps;
    platform.log.setObserver([&](const support::LogLine& line) { steps.push_back(line.message); });
    platform.reportingChannels.setSampleObserver([&] { steps.emplace_back("sample"); });
    end();
    platform.log.setObserver(nullptr);
    EXPECT_THAT(steps, ElementsAre("getting latest samples", "sample", "done getting latest samples"));
}

TEST_F(DriverLogs, AreNoneWhenNothingChanged)
{
    publish(simple(10));
    publish(histogram({{.lower = 0, .upper = 10, .hits = 5}}));
    begin();
    EXPECT_THAT(end(), IsEmpty());
    EXPECT_THAT(platform.analytics.sent(), IsEmpty());
}

TEST_F(DriverLogs, HoldEveryChannelOfAKindInOneMessage)
{
    publish(simple(1, "a"));
    publish(simple(1, "b"));
    publish(simple(1, "c"));
    begin();
    publish(simple(3, "a"));
    publish(simple(2, "c"));
    end();
    const auto payload = platform.analytics.payloads("com.quarn.kesto.Cavlet.Simple").at(0);
    EXPECT_EQ(*payload.find("amp_Speaker_Simple_a"), Value(2));
    EXPECT_EQ(*payload.find("amp_Speaker_Simple_c"), Value(1));
    EXPECT_FALSE(payload.contains("amp_Speaker_Simple_b"));
}

TEST_F(DriverLogs, AreNoneWithoutABaseline)
{
    publish(simple(10));
    begin();
    session->setDriverSnapShot(std::nullopt);
    publish(simple(20));
    EXPECT_THAT(end(), IsEmpty());
    EXPECT_THAT(platform.analytics.sent(), IsEmpty());
    EXPECT_THAT(errors(), IsEmpty());
    EXPECT_THAT(platform.log.lines("kerd"),
                ElementsAre(IsLine(Info, "kerd", "getting latest samples"),
                            IsLine(Info, "kerd", "done getting latest samples")))
        << "it was sampled nevertheless";
}

TEST_F(DriverLogs, LeaveOutADriverThatTheSnapshotDoesNotHave)
{
    publish(simple(10));
    ReportingChannel other = simple(10);
    other.group = "Tx";
    publish(other);
    begin();
    auto snapShot = *session->driverSnapShot();
    snapShot.erase("Speaker-(null)");
    session->setDriverSnapShot(snapShot);
    publish(simple(20));
    other.value = 14;
    publish(other);
    EXPECT_THAT(end(), ElementsAre("Cavlet_Simple_1: 4"));
    EXPECT_THAT(errors(), ElementsAre("creating the difference of samples of driver Speaker-(null): error -1"));
}

TEST_F(DriverLogs, LeaveOutADriverThatCannotBeSampled)
{
    publish(simple(10));
    ReportingChannel other = simple(10);
    other.group = "Tx";
    publish(other);
    begin();
    publish(simple(20));
    other.value = 14;
    publish(other);
    platform.reportingChannels.failures("Speaker", std::nullopt).sample = 11;
    EXPECT_THAT(end(), ElementsAre("Cavlet_Simple_1: 4"));
    EXPECT_THAT(platform.log.lines("kerd"),
                ElementsAre(IsLine(Info, "kerd", "getting latest samples"),
                            IsLine(Info, "kerd", "done getting latest samples"),
                            IsLine(Error, "kerd", "creating samples of driver Speaker-(null): error 11"),
                            IsLine(Info, "kerd", "getting latest samples"),
                            IsLine(Info, "kerd", "done getting latest samples")));
}

TEST_F(DriverLogs, SurviveADifferenceThatFails)
{
    publish(simple(10));
    begin();
    publish(simple(20));
    platform.reportingChannels.failDifferences(13);
    EXPECT_THAT(end(), IsEmpty());
    EXPECT_THAT(errors(), ElementsAre("creating the difference of samples of driver Speaker-(null): error 13"));
}

TEST_F(DriverLogs, SkipChannelsOfOtherFormats)
{
    publish(simple(10));
    begin();
    publish(simple(12));
    for (const std::uint8_t format : {0, 4, 255}) {
        ReportingChannel strange = simple(20, "strange" + std::to_string(format));
        strange.format = format;
        strange.subgroup = format == 4 ? std::optional<std::string>("Stats") : std::nullopt;
        publish(strange);
    }
    EXPECT_THAT(end(), ElementsAre("Cavlet_Simple_1: 2"));
    EXPECT_THAT(errors(),
                ElementsAre("channel format 0 is not supported, group Speaker, subgroup (null)",
                            "channel format 4 is not supported, group Speaker, subgroup Stats",
                            "channel format 255 is not supported, group Speaker, subgroup (null)"));
}

TEST_F(DriverLogs, LetTheLaterOfTwoChannelsOfOneKeyCount)
{
    publish(simple(0, "a b"));
    publish(simple(0, "a_b"));
    begin();
    publish(simple(1, "a b"));
    publish(simple(2, "a_b"));
    EXPECT_THAT(end(), ElementsAre("Cavlet_Simple_1: 2"));
}

TEST_F(DriverLogs, TellEveryDriverOfWhichAChannelIs)
{
    ReportingChannel both = simple(1);
    both.subgroup = "MCA";
    publish(both);
    begin();
    both.value = 4;
    publish(both);
    EXPECT_THAT(end(), ElementsAre("Cavlet_Simple_1: 3")) << "found by its group and by its subgroup, reported once";
}

TEST_F(DriverLogs, ReportAStateChannelInWhichNoTimePassed)
{
    publish(states({{.name = "On", .transitions = 1, .residency = 100}}));
    begin();
    EXPECT_THAT(end(), ElementsAre("Cavlet_State_1: "));
    EXPECT_THAT(platform.analytics.sent(), SizeIs(2));
}

} // namespace
