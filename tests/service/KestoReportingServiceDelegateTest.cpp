// The service object's making, its defaults, and what it answers its clients.
#include "service/KestoReportingServiceDelegate.h"
#include "support/ServiceHarness.h"

#include <gmock/gmock.h>
#include <map>

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
                ElementsAre(FakeWorkQueues::MadeQueue{"com.quarn.kesto.reporting.server",
                                                      platform::QualityOfService::UserInteractive}));
    EXPECT_FALSE(KestoReportingServerQueue()->isCurrent());
    EXPECT_EQ(gReportingQueueName, "com.quarn.kesto.reporting.server");
}

TEST(ServiceMaking, ReplacesTheQueueOfAServiceBefore)
{
    const TestPlatform platform;
    const auto first = KestoReportingServiceDelegate::make();
    const auto queue = KestoReportingServerQueue();
    const auto second = KestoReportingServiceDelegate::make();
    EXPECT_NE(KestoReportingServerQueue(), queue);
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
    const ServiceHarness harness;
    EXPECT_THAT(harness.service->getAllClients(), IsEmpty());
    EXPECT_THAT(harness.service->getAllActiveReportingSessions(), IsEmpty());
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
    ServiceHarness harness;
    TestPlatform& platform = harness.platform;
    KestoReportingServiceDelegate& service = *harness.service;
};

TEST_F(ServiceTest, IsEnabledWhateverThePreferencesSay)
{
    EXPECT_TRUE(service.isReportingEnabled());
    const ServiceHarness disabled(
        [](TestPlatform& prepared) { prepared.preferences.set("com.quarn.kesto", "disable_reporting", true); });
    EXPECT_TRUE(disabled.service->isReportingEnabled());
}

TEST_F(ServiceTest, CountsNoActiveSessionsWhateverIsStarted)
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
    EXPECT_EQ(service.findReportingSessionForID(0), nullptr);
    EXPECT_THAT(platform.log.lines(), IsEmpty());
}

TEST_F(ServiceTest, FindsASessionAndSaysWhose)
{
    auto player = harness.connect();
    player.call(CreateReportingSession, -42);
    harness.forget();
    EXPECT_EQ(service.findReportingSessionForID(-42), player.session(-42));
    EXPECT_THAT(platform.log.lines(), ElementsAre(IsLine(Info, "kers", "found reporting session -42 for client 1001")));
}

TEST_F(ServiceTest, SaysThatItFindsNone)
{
    EXPECT_EQ(service.findReportingSessionForID(42), nullptr);
    EXPECT_THAT(platform.log.lines(), ElementsAre(IsLine(Error, "kers", "failed to find reporting session 42")));
}

TEST_F(ServiceTest, FindsTheSessionOfTheClientRegisteredFirst)
{
    auto first = harness.connect();
    auto second = harness.connect();
    second.call(CreateReportingSession, 42); // made before the other's
    first.call(CreateReportingSession, 42);
    EXPECT_EQ(service.findReportingSessionForID(42), first.session(42));
    first.call(DestroyReportingSession, 42);
    EXPECT_EQ(service.findReportingSessionForID(42), second.session(42));
    first.call(CreateReportingSession, 42);
    EXPECT_EQ(service.findReportingSessionForID(42), first.session(42));
    first.close();
    EXPECT_EQ(service.findReportingSessionForID(42), second.session(42));
    second.close();
    EXPECT_EQ(service.findReportingSessionForID(42), nullptr);
}

TEST_F(ServiceTest, FindsTheNewSessionInPlaceOfAReplacedOne)
{
    auto player = harness.connect();
    player.call(CreateReportingSession, 42);
    player.call(CreateReportingSession, 42);
    EXPECT_EQ(service.findReportingSessionForID(42), player.session(42));
}

// --- active sessions

TEST_F(ServiceTest, HasNoActiveSessionsWhenNoneIsStarted)
{
    auto player = harness.connect();
    auto recorder = harness.connect();
    player.call(CreateReportingSession, 42);
    harness.forget();
    EXPECT_THAT(service.getAllActiveReportingSessions(), IsEmpty());
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
    EXPECT_THAT(service.getAllActiveReportingSessions(),
                ElementsAre(player.session(3), player.session(2), recorder.session(9)));
}

// --- the log

TEST_F(ServiceTest, NamesTheClassOfEachLogLineInWhicheverFileItStands)
{
    auto player = harness.connect();
    player.call(CreateReportingSession, 42);
    player.call(StartReportingSessionForID, 42);
    player.call(SendMessage, Dictionary{{"a", 1}}, 4, 1, Array{42});
    platform.notifications.post("com.quarn.kesto.reporting");
    player.call(StopReportingSessionForID, 42);
    player.breakOff();
    const std::map<std::string, std::string> classes{{"kerc", "KestoReportingClientServerInstance"},
                                                     {"kers", "KestoReportingServiceDelegate"},
                                                     {"kerr", "KestoReportingSession"},
                                                     {"keri", "KestoReportingSession"}};
    for (const LogLine& line : platform.log.take())
        EXPECT_EQ(line.file, classes.at(line.tag)) << line.message;
}

// --- bug capture

constexpr AudioEventType gimbo = 8;
const Dictionary hapticTime{{"Haptic_Active_Hardware_Time_Seconds", 1}};

TEST_F(ServiceTest, HasNoBugCaptureOutsideInternalBuilds)
{
    auto player = harness.connect();
    player.call(CreateReportingSession, 42);
    harness.forget();
    for (const int seconds : {1, 2, 3})
        service.handleEventForVorp({{"Haptic_Active_Hardware_Time_Seconds", seconds}}, 4, gimbo, player.session(42),
                                   "player");
    EXPECT_THAT(platform.log.lines(), IsEmpty());
    EXPECT_EQ(platform.bugCapture.reportersMade(), 0);
}

TEST(ServiceOfAnInternalBuild, HandsMessagesToTheBugCaptureManager)
{
    ServiceHarness harness([](TestPlatform& platform) { platform.deviceProperties.setInternalBuild(true); });
    auto player = harness.connect();
    player.call(CreateReportingSession, 42);
    harness.forget();
    harness.service->handleEventForVorp(hapticTime, 4, gimbo, player.session(42), "player");
    EXPECT_THAT(harness.platform.log.lines(), ElementsAre(IsLine(Info, "kerb", "Incrementing Vorp counter. player")));
}

TEST(ServiceOfAnInternalBuild, AsksForThatOnceInItsLife)
{
    ServiceHarness harness;
    harness.platform.deviceProperties.setInternalBuild(true);
    auto player = harness.connect();
    player.call(CreateReportingSession, 42);
    player.call(SendMessage, hapticTime, 4, gimbo, Array{42});
    EXPECT_THAT(harness.platform.log.lines("kerb"), IsEmpty());
    EXPECT_EQ(harness.platform.deviceProperties.timesAsked("InternalBuild"), 1);
}

} // namespace
