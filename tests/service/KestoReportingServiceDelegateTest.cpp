// SPDX-License-Identifier: Apache-2.0
// The making of the service object, its defaults, and its answers to clients.
#include "service/KestoReportingServiceDelegate.h"
#include "support/ServiceHarness.h"

#include <gmock/gmock.h>
#include <set>

namespace {

using namespace support;
using enum platform::LogLevel;
using foundation::Array;
using foundation::Dictionary;
using foundation::Value;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

// --- making

TEST(ServiceMaking, BeginsWithTheServerQueue)
{
    const TestPlatform platform;
    const auto service = KestoReportingServiceDelegate::make();
    EXPECT_THAT(platform.workQueues.made(),
                ElementsAre(FakeWorkQueues::MadeQueue{
                    .name = "com.quarn.kesto.reporting.server",
                    .options = {.quality = platform::QualityOfService::UserInteractive, .mayBeHelped = true},
                    .hasTurns = true}));
    EXPECT_FALSE(utility::serverQueue()->isCurrent());
    EXPECT_EQ(gReportingQueueName, "com.quarn.kesto.reporting.server");
}

TEST(ServiceMaking, ReplacesTheQueueOfAServiceBefore)
{
    const TestPlatform platform;
    const auto first = KestoReportingServiceDelegate::make();
    const auto queue = utility::serverQueue();
    const auto second = KestoReportingServiceDelegate::make();
    EXPECT_NE(utility::serverQueue(), queue);
}

TEST(ServiceMaking, ListensForFeaturesAndThenWatchesDrivers)
{
    const TestPlatform platform;
    const auto service = KestoReportingServiceDelegate::make();
    const auto lines = platform.log.lines();
    ASSERT_THAT(lines, SizeIs(testing::Ge(5U)));
    EXPECT_THAT(lines[0],
                IsLine(Info, "kers",
                       R"(listening for features [)"
                       R"({"defaults_domain":"com.quarn.halden",)"
                       R"("feature_domain":"spatial-audio-accessory-feature",)"
                       R"("notification":"com.quarn.halden.spatial-audio-accessory-feature.changed"},)"
                       R"({"defaults_domain":"com.quarn.kesto","feature_domain":"device_name",)"
                       R"("notification":"com.quarn.kesto.reporting"},)"
                       R"({"feature_domain":"ringerstate","notification":"com.quarn.halden.ringerstate"}])"));
    EXPECT_THAT(lines[1], IsLine(Default, "kers", "notify setup result 0 token 1"));
    EXPECT_THAT(lines[2], IsLine(Default, "kers", "notify setup result 0 token 2"));
    EXPECT_THAT(lines[3], IsLine(Default, "kers", "notify setup result 0 token 3"));
    EXPECT_THAT(lines[4], IsLine(Info, "kerd", "creating cavlet driver utility"));
}

TEST(ServiceMaking, BeginsWithNoClients)
{
    ServiceHarness harness;
    EXPECT_THAT(harness.service->getAllClients(), IsEmpty());
}

TEST(ServiceMaking, TakesOnNothingOfAServiceThatIsGone)
{
    TestPlatform platform;
    auto service = KestoReportingServiceDelegate::make();
    const std::weak_ptr<KestoReportingServiceDelegate> gone = service;
    service.reset();
    EXPECT_TRUE(gone.expired());
    platform.log.clear();
    platform.notifications.post("com.quarn.kesto.reporting");
    platform.workQueues.runAll();
    EXPECT_THAT(platform.log.lines(), IsEmpty());
}

// --- defaults

Dictionary defaultsWith(const std::function<void(FakePreferences&)>& prepare)
{
    const ServiceHarness harness([&](TestPlatform& platform) { prepare(platform.preferences); });
    return harness.service->getDefaults();
}

Dictionary defaultsWithDisabled(const Value& stored)
{
    return defaultsWith([&](auto& preferences) { preferences.set("com.quarn.kesto", "disable_reporting", stored); });
}

TEST(ServiceDefaults, SayOnlyThatReportingIsNotDisabledWhenNothingIsStored)
{
    const Dictionary defaults = defaultsWith([](auto&) { });
    EXPECT_EQ(defaults, (Dictionary{{"disable_reporting", 0}}));
    EXPECT_EQ(defaults.find("disable_reporting")->number()->kind(), foundation::Number::Kind::Signed64);
}

TEST(ServiceDefaults, ReadDisableReportingAsABoolean)
{
    for (const Value& stored : {Value("YES"), Value(1), Value(true), Value("true"), Value(7), Value("1")})
        EXPECT_EQ(defaultsWithDisabled(stored), (Dictionary{{"disable_reporting", 1}})) << stored.text();
    for (const Value& stored : {Value("NO"), Value(0), Value(false), Value(""), Value(Array{1})})
        EXPECT_EQ(defaultsWithDisabled(stored), (Dictionary{{"disable_reporting", 0}})) << stored.text();
}

TEST(ServiceDefaults, ReadTheDeviceNameAsAString)
{
    const auto deviceName = [](const Value& stored) {
        return *defaultsWith([&](auto& preferences) {
                    preferences.set("com.quarn.kesto", "device_name", stored);
                }).find("device_name");
    };
    EXPECT_EQ(deviceName("Kitchen speaker"), Value("Kitchen speaker"));
    EXPECT_EQ(deviceName(""), Value(""));
    EXPECT_EQ(deviceName(7), Value("7"));
}

TEST(ServiceDefaults, AreThoseOfTheServicesOwnDomain)
{
    EXPECT_EQ(defaultsWith([](auto& preferences) {
                  preferences.set("com.quarn.halden", "device_name", "x");
                  preferences.set("com.quarn.halden", "disable_reporting", true);
                  preferences.set("com.quarn.kesto", "something", "else");
              }),
              (Dictionary{{"disable_reporting", 0}}));
}

TEST(ServiceDefaults, AreReadOnce)
{
    ServiceHarness harness;
    harness.platform.preferences.set("com.quarn.kesto", "device_name", "Speaker");
    harness.platform.notifications.post("com.quarn.kesto.reporting");
    harness.platform.workQueues.runAll();
    EXPECT_EQ(harness.service->getDefaults(), (Dictionary{{"disable_reporting", 0}}));
    EXPECT_EQ(KestoReportingServiceDelegate::KestoReportingDefaults(),
              (Dictionary{{"device_name", "Speaker"}, {"disable_reporting", 0}}));
}

// --- switches and counters

class ServiceTest : public testing::Test {
protected:
    std::vector<std::shared_ptr<KestoReportingSession>> activeSessions()
    {
        return onServerQueue(platform.workQueues, [&] {
            auto walk = service.getAllActiveReportingSessions();
            client::ListAllowance allowance;
            while (walk.logNextClient(allowance)) { }
            std::vector<std::shared_ptr<KestoReportingSession>> sessions;
            while (const auto step = walk.step())
                if (*step != nullptr)
                    sessions.push_back(*step);
            EXPECT_EQ(walk.count(), sessions.size());
            return sessions;
        });
    }

    ServiceHarness harness;
    TestPlatform& platform = harness.platform;
    KestoReportingServiceDelegate& service = *harness.service;
};

TEST_F(ServiceTest, IsEnabledWithAllPreferences)
{
    EXPECT_TRUE(service.isReportingEnabled());
    const ServiceHarness disabled(
        [](TestPlatform& prepared) { prepared.preferences.set("com.quarn.kesto", "disable_reporting", true); });
    EXPECT_TRUE(disabled.service->isReportingEnabled());
}

TEST_F(ServiceTest, CountsNoActiveSessionsAfterAnyStarts)
{
    auto player = harness.connect();
    player.call(CreateReportingSession, 42);
    player.call(StartReportingSessionForID, 42);
    EXPECT_EQ(service.activeSessionCount(), 0);
    service.setActiveSessionCount(-5);
    EXPECT_EQ(service.activeSessionCount(), -5);
    player.call(StopReportingSessionForID, 42);
    EXPECT_EQ(service.activeSessionCount(), -5);
}

// --- finding sessions

TEST_F(ServiceTest, FindsNoSessionZeroAndSaysNothing)
{
    auto player = harness.connect();
    player.call(CreateReportingSession, 0);
    harness.forget();
    EXPECT_EQ(harness.find(0), nullptr);
    EXPECT_THAT(platform.log.lines(), IsEmpty());
}

TEST_F(ServiceTest, FindsASessionAndSaysWhose)
{
    auto player = harness.connect();
    player.call(CreateReportingSession, -42);
    harness.forget();
    EXPECT_EQ(harness.find(-42), player.session(-42));
    EXPECT_THAT(platform.log.lines(), ElementsAre(IsLine(Info, "kers", "found reporting session -42 for client 1001")));
}

TEST_F(ServiceTest, SaysThatItFindsNone)
{
    EXPECT_EQ(harness.find(42), nullptr);
    EXPECT_THAT(platform.log.lines(), ElementsAre(IsLine(Error, "kers", "failed to find reporting session 42")));
}

TEST_F(ServiceTest, FindsTheSessionOfTheClientRegisteredFirst)
{
    auto first = harness.connect();
    auto second = harness.connect();
    second.call(CreateReportingSession, 42); // made before the other's
    first.call(CreateReportingSession, 42);
    EXPECT_EQ(harness.find(42), first.session(42));
    first.call(DestroyReportingSession, 42);
    EXPECT_EQ(harness.find(42), second.session(42));
    first.call(CreateReportingSession, 42);
    EXPECT_EQ(harness.find(42), first.session(42));
    first.close();
    EXPECT_EQ(harness.find(42), second.session(42));
    second.close();
    EXPECT_EQ(harness.find(42), nullptr);
}

TEST_F(ServiceTest, FindsTheNewSessionInPlaceOfAReplacedOne)
{
    auto player = harness.connect();
    player.call(CreateReportingSession, 42);
    player.call(CreateReportingSession, 42);
    EXPECT_EQ(harness.find(42), player.session(42));
}

// --- active sessions

TEST_F(ServiceTest, HasNoActiveSessionsWhenNoneIsStarted)
{
    auto player = harness.connect();
    auto recorder = harness.connect();
    player.call(CreateReportingSession, 42);
    harness.forget();
    EXPECT_THAT(activeSessions(), IsEmpty());
    EXPECT_THAT(platform.log.lines(),
                ElementsAre(IsLine(Default, "kers",
                                   "sessions for client 1001 : [\"reporterID=42,serviceName=(null),ownerPid=1001,"
                                   "HostApplicationDisplayID=Unknown,started=0\"]"),
                            IsLine(Default, "kers", "sessions for client 1002 : []")));
}

TEST_F(ServiceTest, ListsActiveSessionsByClientAndThenByTheirPlaceInTheMap)
{
    auto player = harness.connect();
    auto recorder = harness.connect();
    for (const std::int64_t reporterID : {3, 1, 2, 4})
        player.call(CreateReportingSession, reporterID);
    recorder.call(CreateReportingSession, 9);
    recorder.call(StartReportingSessionForID, 9);
    for (const std::int64_t reporterID : {1, 2, 3})
        player.call(StartReportingSessionForID, reporterID);
    player.call(CreateReportingSession, 3); // keeps its place, and has to be started again
    player.call(StartReportingSessionForID, 3);
    player.call(StopReportingSessionForID, 1);
    EXPECT_THAT(activeSessions(), ElementsAre(player.session(3), player.session(2), recorder.session(9)));
}

// --- driver statistics

TEST(ServiceDriverStatistics, AreTakenAndReportedByItsSampler)
{
    platform::ReportingChannel underruns;
    underruns.format = static_cast<std::uint8_t>(platform::ChannelFormat::Simple);
    underruns.driver = "codec";
    underruns.group = "Speaker";
    underruns.subgroup = "DMA";
    underruns.name = "underruns";
    underruns.value = 3;
    ServiceHarness harness([&](TestPlatform& prepared) { prepared.reportingChannels.publish(underruns); });
    auto player = harness.connect();
    player.call(CreateReportingSession, 42);
    player.call(StartReportingSessionForID, 42);
    const auto session = player.session(42);
    const auto onQueue = [&](auto work) { return onServerQueue(harness.platform.workQueues, work); };

    const auto readMoment = [&] {
        session::DriverMoment moment;
        harness.service->readDriverMoment([&](session::DriverMoment read) { moment = std::move(read); });
        harness.platform.workQueues.runAll();
        return moment;
    };

    ASSERT_TRUE(harness.service->needsDriverMoments());
    const auto snapShot = onQueue([&, then = readMoment()] { return harness.service->getSnapShot(then); });
    ASSERT_THAT(snapShot, SizeIs(1));
    EXPECT_EQ(snapShot.begin()->first, "Speaker-(null)");
    onQueue([&] { session->setDriverSnapShot(snapShot); });
    underruns.value = 8;
    harness.platform.reportingChannels.publish(underruns);
    onQueue([&, now = readMoment()](platform::Turn& turn) {
        harness.service->sendDriverLogsForSession(turn, session, now);
    });
    const auto messages = session->nestedAggregatedPayloadData().value();
    ASSERT_THAT(messages, SizeIs(1));
    const Dictionary told = *messages[0].values()[0].dictionary();
    ASSERT_TRUE(told.contains("codec_Speaker_DMA_Simple_underruns")) << Value(told).text();
    EXPECT_EQ(*told.find("codec_Speaker_DMA_Simple_underruns"), Value(5));
}

// --- the log

TEST_F(ServiceTest, NamesTheFileOfEachLogLineButSaysSessionForAllOfASession)
{
    auto player = harness.connect();
    player.call(CreateReportingSession, 42);
    player.call(StartReportingSessionForID, 42);
    player.call(SendMessage, Dictionary{{"a", 1}}, 4, 1, Array{42});
    platform.notifications.post("com.quarn.kesto.reporting");
    player.call(StopReportingSessionForID, 42);
    player.breakOff();
    std::set<std::string> names;
    for (const LogLine& line : platform.log.take()) {
        names.insert(line.name);
        if (line.tag == "kerr" || line.tag == "keri")
            EXPECT_EQ(line.name, "KestoReportingSession") << line.message;
        else
            EXPECT_EQ(line.file, line.name + ".cpp") << line.message;
    }
    EXPECT_THAT(
        names,
        testing::IsSupersetOf({"KestoReportingClientServerInstance", "KestoReportingClientServerInstanceMessages",
                               "KestoReportingServiceDelegate", "KestoReportingServiceDelegateConnections",
                               "KestoReportingServiceDelegateFeatures", "KestoReportingSession"}));
}

// --- bug capture

constexpr AudioEventType gimbo = 8;

TEST_F(ServiceTest, HasNoBugCaptureOutsideInternalBuilds)
{
    auto player = harness.connect();
    player.call(CreateReportingSession, 42);
    harness.forget();
    for (const int seconds : {1, 2, 3})
        onServerQueue(platform.workQueues, [&] {
            service.handleEventForVorp({{"Haptic_Active_Hardware_Time_Seconds", seconds}}, 4, gimbo, player.session(42),
                                       "player");
        });
    EXPECT_THAT(platform.log.lines(), IsEmpty());
    EXPECT_EQ(platform.bugCapture.reportersMade(), 0);
}

class InternalServiceTest : public testing::Test {
protected:
    ServiceHarness harness{[](TestPlatform& prepared) { prepared.deviceProperties.setInternalBuild(true); }};
    TestPlatform& platform = harness.platform;
};

TEST_F(InternalServiceTest, HandsMessagesToTheBugCaptureManagerAsTheyAre)
{
    constexpr AudioEventCategory playbackOfTheDSP = 0x10000004;
    constexpr int serviceHaptics = 3;
    auto player = harness.connect();
    player.call(CreateReportingSession, 42);
    player.call(SetServiceType, serviceHaptics, 42);
    harness.forget();
    for (const int seconds : {1, 2})
        onServerQueue(platform.workQueues, [&] {
            harness.service->handleEventForVorp({{"Haptic_Active_Hardware_Time_Seconds", seconds}}, playbackOfTheDSP,
                                                gimbo, player.session(42), "player");
        });
    ASSERT_THAT(platform.bugCapture.snapshots(), SizeIs(1)) << "the second report differs from the first";
    const Dictionary& signature = platform.bugCapture.snapshots()[0].signature;
    EXPECT_EQ(*signature.find("type"), Value("haptics"));
    EXPECT_EQ(*signature.find("subType"), Value("DSP_Playback"));
    EXPECT_EQ(*signature.find("detectedProcess"), Value("player"));
}

TEST_F(InternalServiceTest, HandsMessagesToTheBugCaptureManagerUnderTheirOwnType)
{
    auto player = harness.connect();
    player.call(CreateReportingSession, 42);
    harness.forget();
    for (const int type : {7, 9})
        for (const int seconds : {1, 2})
            player.call(SendMessage, Dictionary{{"Haptic_Active_Hardware_Time_Seconds", seconds}}, 4, type, Array{42});
    EXPECT_THAT(platform.log.lines("kerb"), IsEmpty());
    EXPECT_EQ(platform.bugCapture.reportersMade(), 0) << "only messages of type 8 count";
}

TEST_F(InternalServiceTest, AsksForABugCaptureAsOfTheProcessThatSentTheMessage)
{
    harness.connect("player");
    auto second = harness.connect("player");
    second.call(CreateReportingSession, 42);
    for (const int seconds : {1, 2})
        second.call(SendMessage, Dictionary{{"Haptic_Active_Hardware_Time_Seconds", seconds}}, 4, gimbo, Array{42});
    ASSERT_THAT(platform.bugCapture.snapshots(), SizeIs(1));
    EXPECT_EQ(platform.bugCapture.snapshots()[0].sender, ServiceHarness::firstPID + 1);
}

TEST_F(InternalServiceTest, TellsBugCapturesOfItsClientsAndTheirSessions)
{
    const auto describeState = [this] {
        return onServerQueue(platform.workQueues, [this] { return platform.bugCapture.describeState(); });
    };
    EXPECT_EQ(describeState(), (Dictionary{{"clients", 0}, {"sessions", 0}, {"shown", Array()}}));
    auto player = harness.connect("player");
    auto recorder = harness.connect("recorder");
    player.call(CreateReportingSession, 42);
    player.call(SetServiceType, 3, 42);
    player.submit(StartReportingSessionForID, {42});
    recorder.call(CreateReportingSession, 7);
    EXPECT_EQ(describeState(),
              (Dictionary{{"clients", 2},
                          {"sessions", 2},
                          {"shown",
                           Array{Dictionary{{"process", "player"},
                                            {"pid", ServiceHarness::firstPID},
                                            {"reporterID", 42},
                                            {"service", "haptics"},
                                            {"started", true}},
                                 Dictionary{{"process", "recorder"},
                                            {"pid", ServiceHarness::firstPID + 1},
                                            {"reporterID", 7},
                                            {"service", "generic"},
                                            {"started", false}}}}}));
    for (int reporter = 100; reporter < 400; ++reporter)
        recorder.call(CreateReportingSession, reporter);
    const Dictionary state = *describeState().dictionary();
    EXPECT_EQ(*state.find("sessions"), Value(302));
    EXPECT_EQ(state.find("shown")->array()->size(), 200U) << "so few that the requesting thread is not delayed";

    harness.service.reset();
    EXPECT_EQ(describeState(), Value()) << "a destroyed service is not called";
}

TEST(ServiceOfAnInternalBuild, IsOneOrNotForItsWholeLife)
{
    ServiceHarness harness;
    harness.platform.deviceProperties.setInternalBuild(true);
    auto player = harness.connect();
    player.call(CreateReportingSession, 42);
    player.call(SendMessage, Dictionary{{"Haptic_Active_Hardware_Time_Seconds", 1}}, 4, gimbo, Array{42});
    EXPECT_THAT(harness.platform.log.lines("kerb"), IsEmpty());
    EXPECT_EQ(harness.platform.deviceProperties.timesAsked("InternalBuild"), 1);
}

} // namespace
