// SPDX-License-Identifier: Apache-2.0
// Device-wide settings: how they are read, and which sessions get them.
#include "support/EmittedCodes.h"
#include "support/ServiceHarness.h"

#include <gmock/gmock.h>

namespace {

using namespace support;
using enum platform::LogLevel;
using foundation::Array;
using foundation::Dictionary;
using foundation::Number;
using foundation::Value;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

constexpr auto accessoryKey = "spatial-audio-accessory-feature";
constexpr auto accessoryNotification = "com.quarn.halden.spatial-audio-accessory-feature.changed";
constexpr auto preferencesNotification = "com.quarn.kesto.reporting";
constexpr auto ringerNotification = "com.quarn.halden.ringerstate";

class FeaturesTest : public testing::Test {
protected:
    explicit FeaturesTest(const std::function<void(TestPlatform&)>& prepare = {}) : harness(prepare) { }

    std::optional<Dictionary> state()
    {
        return onServerQueue(platform.workQueues, [&] { return harness.service->getFeaturesState(); });
    }
    void post(const char* notification)
    {
        platform.notifications.post(notification);
        platform.workQueues.runAll();
    }

    ServiceHarness harness;
    TestPlatform& platform = harness.platform;
};

// --- registration

TEST_F(FeaturesTest, AreRegisteredForInTheOrderOfTheTable)
{
    EXPECT_THAT(platform.notifications.registered(),
                ElementsAre(accessoryNotification, preferencesNotification, ringerNotification));
    EXPECT_EQ(gReportingNotifydNotificationName, preferencesNotification);
}

TEST_F(FeaturesTest, AreHandledOnTheServerQueue)
{
    platform.notifications.post(ringerNotification);
    EXPECT_THAT(platform.log.lines(), IsEmpty());
    platform.log.setObserver([](const LogLine&) { EXPECT_TRUE(utility::serverQueue()->isCurrent()); });
    platform.workQueues.runAll();
    EXPECT_THAT(platform.log.lines(), SizeIs(3));
}

TEST(FeatureRegistration, ThatFailsIsOnlySaidAndItsTokenIsKept)
{
    TestPlatform platform;
    platform.notifications.failRegistration(ringerNotification, 9);
    platform.notifications.setState(ringerNotification, 1);
    platform.notifications.setState(accessoryNotification, 1);
    const auto service = KestoReportingServiceDelegate::make();
    EXPECT_THAT(platform.log.lines(), testing::Contains(IsLine(Default, "kers", "notify setup result 9 token 0")));
    const auto state = onServerQueue(platform.workQueues, [&] { return service->getFeaturesState(); });
    EXPECT_EQ(state, std::nullopt) << "the state of token 0 cannot be read";
    EXPECT_THAT(platform.notifications.asked(), ElementsAre(0)) << "although it is asked for";
}

// --- state

TEST_F(FeaturesTest, AreNothingWhenNoneIsKnown)
{
    EXPECT_EQ(state(), std::nullopt);
    EXPECT_THAT(platform.log.lines(), ElementsAre(IsLine(Default, "kers", "getting features")));
}

TEST_F(FeaturesTest, AreThePreferencesAndTheRingersStateAndTheTime)
{
    platform.preferences.set("com.quarn.halden", accessoryKey, Array{1, "on"});
    platform.preferences.set("com.quarn.kesto", "device_name", 7);
    platform.notifications.setState(ringerNotification, 1);
    platform.clock.set(1234.5);
    platform.clock.setSystemUptime(99.5);
    EXPECT_EQ(Value(*state()).text(),
              R"({"spatial-audio-accessory-feature":[1,"on"],"device_name":7,"ringerstate":true,)"
              R"("kestoreporting_timestamp":1234.5,"systemuptime_sec":100})");
}

TEST_F(FeaturesTest, CarryTheTimeWithEachOfThemAlone)
{
    const auto keys = [this] {
        std::vector<std::string> found;
        const Dictionary told = state().value();
        for (const auto& entry : told)
            found.emplace_back(entry.key.view());
        return found;
    };
    platform.preferences.set("com.quarn.halden", accessoryKey, false);
    EXPECT_THAT(keys(), ElementsAre(accessoryKey, "kestoreporting_timestamp", "systemuptime_sec"));
    platform.preferences.remove("com.quarn.halden", accessoryKey);
    platform.preferences.set("com.quarn.kesto", "device_name", "Speaker");
    EXPECT_THAT(keys(), ElementsAre("device_name", "kestoreporting_timestamp", "systemuptime_sec"));
    platform.preferences.remove("com.quarn.kesto", "device_name");
    platform.notifications.setState(ringerNotification, 0);
    EXPECT_THAT(keys(), ElementsAre("ringerstate", "kestoreporting_timestamp", "systemuptime_sec"));
    platform.notifications.removeState(ringerNotification);
    EXPECT_EQ(state(), std::nullopt);
}

TEST_F(FeaturesTest, AreReadFromTheirOwnDomains)
{
    platform.preferences.set("com.quarn.kesto", accessoryKey, 1);
    platform.preferences.set("com.quarn.halden", "device_name", "x");
    platform.preferences.set("com.quarn.halden", "ringerstate", true);
    platform.notifications.setState(accessoryNotification, 1);
    platform.notifications.setState(preferencesNotification, 1);
    EXPECT_EQ(state(), std::nullopt);
}

TEST_F(FeaturesTest, TakeTheRingerForOnOnlyInStateOne)
{
    const auto ringer = [this](std::uint64_t ringerState) {
        platform.notifications.setState(ringerNotification, ringerState);
        return *state()->find("ringerstate");
    };
    for (const std::uint64_t off :
         {std::uint64_t{0}, std::uint64_t{2}, (std::uint64_t{1} << 32) + 1, ~std::uint64_t{0}})
        EXPECT_EQ(ringer(off), Value(false)) << off;
    EXPECT_EQ(ringer(1), Value(true));
    EXPECT_EQ(ringer(1).number()->kind(), Number::Kind::Boolean);
}

TEST_F(FeaturesTest, RoundTheUptimeToTheNearestSecond)
{
    platform.preferences.set("com.quarn.kesto", "device_name", "Speaker");
    const auto uptime = [this](double seconds) {
        platform.clock.setSystemUptime(seconds);
        return state()->find("systemuptime_sec")->number()->exactly<std::int32_t>();
    };
    EXPECT_EQ(uptime(41.49), 41);
    EXPECT_EQ(uptime(41.5), 42);
    EXPECT_EQ(uptime(0.2), 0);
}

// --- changes

TEST_F(FeaturesTest, ThatChangeAreSentToEverySessionOfEveryClientStartedOrNot)
{
    auto player = harness.connect();
    auto recorder = harness.connect();
    player.call(CreateReportingSession, 42);
    player.call(StartReportingSessionForID, 42);
    player.call(CreateReportingSession, 41);
    recorder.call(CreateReportingSession, 43);
    recorder.call(StartReportingSessionForID, 43);
    platform.preferences.set("com.quarn.kesto", "device_name", "Speaker");
    platform.clock.set(5);
    platform.clock.setSystemUptime(6);
    harness.forget();

    post(preferencesNotification);
    EXPECT_THAT(platform.log.lines(),
                ElementsAre(IsLine(Info, "kers", "feature 2 changes"), IsLine(Default, "kers", "getting features"),
                            IsLine(Info, "kers",
                                   R"(defaults {"device_name":"Speaker","kestoreporting_timestamp":5,)"
                                   R"("systemuptime_sec":6})"),
                            IsLine(Debug, "kerr", "sending message for session owned by 42"),
                            IsLine(Debug, "kerr", "sending message for session owned by 41"),
                            IsLine(Debug, "kerr", "sending message for session owned by 43")));
    const Dictionary told{
        {"Setup_Setup_1", Dictionary{{"device_name", "Speaker"}, {"systemuptime_sec", 6}, {"audiotag", "SetupSetup"}}}};
    EXPECT_THAT(*player.session(42)->nestedAggregatedPayloadData(), ElementsAre(told));
    EXPECT_THAT(*recorder.session(43)->nestedAggregatedPayloadData(), ElementsAre(told));
}

TEST_F(FeaturesTest, ThatChangeAreSentWhenNothingIsKnownToo)
{
    auto player = harness.connect();
    player.call(CreateReportingSession, 42);
    player.call(StartReportingSessionForID, 42);
    harness.forget();
    post(ringerNotification);
    EXPECT_THAT(platform.log.lines(),
                ElementsAre(IsLine(Info, "kers", "feature 3 changes"), IsLine(Default, "kers", "getting features"),
                            IsLine(Info, "kers", "defaults (null)"),
                            IsLine(Debug, "kerr", "sending message for session owned by 42")));
    EXPECT_THAT(*player.session(42)->nestedAggregatedPayloadData(),
                ElementsAre(Dictionary{{"Setup_Setup_1", Dictionary{{"audiotag", "SetupSetup"}}}}));
}

// With each message that a session accepts, a slice of the server queue's time passes; a client has more sessions than
// one slice reaches.
class ChangeForManyTest : public FeaturesTest {
protected:
    static constexpr std::int64_t sessions = 100;

    ChangeForManyTest()
    {
        platform.notifications.setState(ringerNotification, 0);
        for (std::int64_t reporterID = 1; reporterID <= sessions; ++reporterID) {
            player.call(CreateReportingSession, reporterID);
            if (reporterID != 99)
                player.call(StartReportingSessionForID, reporterID);
        }
        platform.traceEmitter.setObserver([this](std::uint32_t code) {
            if (code == sessionMessageAccepted)
                platform.clock.advance(0.001);
        });
        platform.notifications.setState(ringerNotification, 1);
        platform.notifications.post(ringerNotification);
        while (toldOf(1).size() == 1)
            EXPECT_TRUE(platform.workQueues.runOne());
    }
    ~ChangeForManyTest() override { platform.traceEmitter.setObserver(nullptr); }

    // The states of the ringer that the session was told of.
    [[nodiscard]] std::vector<std::string> toldOf(std::int64_t reporterID) const
    {
        std::vector<std::string> told;
        const auto messages = player.session(reporterID)->nestedAggregatedPayloadData().value();
        for (const auto& message : messages)
            told.push_back(message.values()[0].dictionary()->find("ringerstate")->text());
        return told;
    }

    TestClient player = harness.connect();
    TestClient recorder = harness.connect();
};

TEST_F(ChangeForManyTest, LetsTheCallsOfOthersGoInBetween)
{
    const auto other = recorder.submit(CreateReportingSession, {200});
    while (recorder.answersTo(other) == unanswered)
        ASSERT_TRUE(platform.workQueues.runOne());
    EXPECT_THAT(toldOf(1), ElementsAre("0", "1"));
    EXPECT_THAT(toldOf(sessions), ElementsAre("0"));
    platform.workQueues.runAll();
    EXPECT_THAT(toldOf(sessions), ElementsAre("0", "1"));
}

TEST_F(ChangeForManyTest, IsCompleteBeforeTheNextOneBegins)
{
    platform.notifications.setState(ringerNotification, 0);
    platform.notifications.post(ringerNotification);
    while (toldOf(1).size() == 2)
        ASSERT_TRUE(platform.workQueues.runOne());
    EXPECT_THAT(toldOf(sessions), ElementsAre("0", "1"));
    platform.workQueues.runAll();
    EXPECT_THAT(toldOf(1), ElementsAre("0", "1", "0"));
    EXPECT_THAT(toldOf(sessions), ElementsAre("0", "1", "0"));
}

TEST_F(ChangeForManyTest, IsOlderThanWhatASessionGetsThatStartsMeanwhile)
{
    platform.notifications.setState(ringerNotification, 0);
    const auto started = player.submit(StartReportingSessionForID, {99});
    platform.workQueues.runAll();
    EXPECT_EQ(player.answersTo(started), unanswered);
    EXPECT_THAT(toldOf(99), ElementsAre("0"));
    EXPECT_THAT(toldOf(sessions), ElementsAre("0", "1"));
}

TEST_F(FeaturesTest, AreNotSentToSinks)
{
    platform.analytics.use("*");
    auto player = harness.connect();
    player.call(CreateReportingSession, 42);
    player.call(StartReportingSessionForID, 42);
    post(accessoryNotification);
    EXPECT_THAT(platform.analytics.asked(), IsEmpty());
}

TEST_F(FeaturesTest, AreReadAtTheirChangeAndNotRemembered)
{
    auto player = harness.connect();
    player.call(CreateReportingSession, 42);
    player.call(StartReportingSessionForID, 42);
    for (const std::uint64_t ringerState : {1, 1, 0}) {
        platform.notifications.setState(ringerNotification, ringerState);
        post(ringerNotification);
    }
    const auto messages = player.session(42)->nestedAggregatedPayloadData().value();
    std::vector<std::string> told;
    for (const auto& message : messages)
        told.push_back(message.values()[0].dictionary()->find("ringerstate")->text());
    EXPECT_THAT(told, ElementsAre("1", "0")) << "the second is a repetition, even with another time";
}

TEST_F(FeaturesTest, AreListenedForAsLongAsTheServiceLives)
{
    for (int time = 0; time < 3; ++time) {
        harness.forget();
        post(accessoryNotification);
        EXPECT_THAT(platform.log.lines().at(0), IsLine(Info, "kers", "feature 1 changes"));
    }
}

} // namespace
