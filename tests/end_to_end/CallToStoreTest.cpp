// SPDX-License-Identifier: Apache-2.0
// The whole path, from a client's call to a stored event, through a real service.
#include "end_to_end/AnotherProcess.h"
#include "end_to_end/Kestod.h"
#include "end_to_end/Sums.h"
#include "end_to_end/WireClient.h"
#include "support/MessageKinds.h"

#include <csignal>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

namespace end_to_end {
namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;
using support::playback;
using support::typeStart;
using support::typeStop;
using testing::ElementsAre;
using testing::Field;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::MatchesRegex;
using testing::SizeIs;

constexpr std::string_view uptimeEvent = "com.quarn.kesto.kestoreportingclientuptime";

Array success(std::uint64_t call)
{
    return {call, null, true};
}

class CallToStoreTest : public testing::Test {
protected:
    void SetUp() override { kestod.start(); }
    Kestod kestod;
};

auto named(std::string_view name)
{
    return Field(&StoreRow::name, name);
}

TEST_F(CallToStoreTest, AMessageBecomesTwoStoredEventsWithTheApplicationAdded)
{
    WireClient client(kestod.socketPath());
    EXPECT_EQ(client.ask(Create, 42), success(1));
    EXPECT_EQ(client.ask(SetServiceType, 7, 42), success(2));
    EXPECT_EQ(client.ask(SetConfiguration, Dictionary{{"HostApplicationDisplayID", "org.example.player"}}, 42),
              success(3));
    const auto start = client.call(Start, 42);
    EXPECT_EQ(client.ask(SendMessage, Dictionary{{"volume", 0.5}}, playback, typeStart, Array{42}), (Array{5, null}));
    const auto stop = client.call(Stop, 42);
    EXPECT_EQ(client.nextReply(), success(start));
    EXPECT_EQ(client.nextReply(), success(stop));

    const auto events = kestod.events();
    ASSERT_THAT(events,
                ElementsAre(named("com.quarn.kesto.Playback.Start"), named("com.quarn.longformaudio.Playback.Start")));
    EXPECT_EQ(events[0].payload, R"({"volume":0.5,"HostApplicationDisplayID":"org.example.player"})");
    EXPECT_EQ(events[1].payload, events[0].payload);
}

TEST_F(CallToStoreTest, EventsOfOneStreamCanBePairedAndNameWhoSentThem)
{
    {
        WireClient client(kestod.socketPath());
        WireClient other(kestod.socketPath());
        for (const int reporter : {42, 43}) {
            client.ask(Create, reporter);
            client.ask(SetServiceType, 7, reporter);
            client.ask(SetConfiguration, Dictionary{{"HostApplicationDisplayID", "org.example.player"}}, reporter);
        }
        const auto say = [](WireClient& sender, int reporter, int type, double time) {
            sender.ask(SendMessage, Dictionary{{"kestoreporting_timestamp", time}}, playback, type, Array{reporter});
        };
        say(client, 42, typeStart, 100);
        say(client, 43, typeStart, 101);
        say(client, 42, typeStop, 103.5);
        say(other, 43, typeStop, 111);
        client.ask(Destroy, 42);
    }
    EXPECT_TRUE(waitUntil([&] { return kestod.events(uptimeEvent).size() == 2; }));
    EXPECT_EQ(kestod.query("SELECT count(*) FROM messages"), std::vector<std::string>{"6"})
        << "four messages, and two clients that ended";
    EXPECT_THAT(kestod.query("SELECT sum(iif(name GLOB '*.Stop', happened, -happened)) || ' ' || reporter || ' ' || "
                             "service || ' ' || application FROM events JOIN sessions ON sessions.id = session "
                             "WHERE name GLOB 'com.quarn.kesto.Playback.*' GROUP BY session ORDER BY reporter"),
                ElementsAre("3.5 42 longformaudio org.example.player", "10.0 43 longformaudio org.example.player"));
    EXPECT_THAT(kestod.query("SELECT count(DISTINCT source) FROM events WHERE session IS NOT NULL"), ElementsAre("2"));
    EXPECT_THAT(kestod.query("SELECT DISTINCT process || ' ' || user FROM sources"),
                ElementsAre(std::to_string(::getpid()) + " " + std::to_string(::getuid())));
    EXPECT_THAT(kestod.query("SELECT count(*) FROM events WHERE source IS NULL"), ElementsAre("0"));
    EXPECT_TRUE(waitUntil([&] {
        return kestod
            .query("SELECT id FROM sources WHERE ended IS NULL UNION ALL SELECT id FROM sessions WHERE ended IS "
                   "NULL")
            .empty();
    }));
}

TEST_F(CallToStoreTest, WhatIsAcknowledgedIsKeptWhenTheServiceIsKilled)
{
    WireClient client(kestod.socketPath());
    client.ask(Create, 1);
    client.call(Start, 1);
    constexpr int count = 500;
    for (int number = 0; number < count; ++number)
        client.call(SendMessage, Dictionary{{"number", number}}, playback, typeStart, Array{1});
    int acknowledged = 0;
    while (acknowledged < count / 2) {
        ASSERT_TRUE(client.nextReply());
        ++acknowledged;
    }
    kestod.kill();
    while (client.nextReply()) // replies that had left already
        ++acknowledged;
    EXPECT_GE(kestod.events("com.quarn.kesto.*").size(), static_cast<std::size_t>(acknowledged));
}

TEST_F(CallToStoreTest, TwoClientsAtOnceDoNotMix)
{
    WireClient first(kestod.socketPath());
    WireClient second(kestod.socketPath());
    for (WireClient* client : {&first, &second}) {
        client->ask(Create, 7);
        client->call(Start, 7);
    }
    EXPECT_EQ(second.ask(SetServiceType, 10, 7), success(3));
    EXPECT_EQ(first.ask(GetServiceName, 7), (Array{3, null, 0}));
    EXPECT_EQ(second.ask(GetServiceName, 7), (Array{4, null, 10}));
    first.ask(SendMessage, Dictionary{{"from", "first"}}, playback, typeStart, Array{7});
    second.ask(SendMessage, Dictionary{{"from", "second"}}, playback, typeStart, Array{7});
    EXPECT_THAT(kestod.events("com.quarn.generic.*"), ElementsAre(Field(&StoreRow::payload, HasSubstr("first"))));
    EXPECT_THAT(kestod.events("com.quarn.alerts.*"), ElementsAre(Field(&StoreRow::payload, HasSubstr("second"))));
}

TEST_F(CallToStoreTest, ASessionOfAnotherClientIsReachedBySendingAndValidatingButNotByStarting)
{
    WireClient owner(kestod.socketPath());
    owner.ask(Create, 5);
    owner.ask(SetServiceType, 3, 5);
    WireClient other(kestod.socketPath());
    EXPECT_EQ(other.ask(Validate, 5), (Array{1, null, Dictionary{{"reporterID", 5}, {"serviceType", 3}}}));
    EXPECT_EQ(other.ask(SendMessage, Dictionary{{"a", 1}}, playback, typeStart, Array{5}), (Array{2, null}));
    EXPECT_THAT(kestod.events("com.quarn.haptics.*"), SizeIs(1));
    EXPECT_EQ(other.ask(Start, 5), success(3)); // immediately: another client's session
    EXPECT_EQ(other.ask(GetAllReporters), (Array{4, null, Array{5}}));
}

TEST_F(CallToStoreTest, TheServiceTypeOfNoSessionIsAnsweredTwice)
{
    WireClient client(kestod.socketPath());
    const auto call = client.call(GetServiceName, 0);
    EXPECT_EQ(client.nextReply(), (Array{call, null, 65535}));
    EXPECT_EQ(client.nextReply(), (Array{call, null, 65535}));
    EXPECT_EQ(client.ask(Validate, 99), (Array{2, null, Dictionary{{"reporterID", 0}, {"serviceType", 65535}}}));
}

TEST_F(CallToStoreTest, TheAnswerToAStartIsHeldUntilTheStopAndOtherCallsOvertakeIt)
{
    WireClient client(kestod.socketPath());
    client.ask(Create, 1);
    const auto start = client.call(Start, 1);
    EXPECT_EQ(client.ask(Start, 1), success(3)); // already started: answered immediately
    EXPECT_EQ(client.ask(GetAllReporters), (Array{4, null, Array{1}}));
    const auto stop = client.call(Stop, 1);
    EXPECT_EQ(client.nextReply(), success(start));
    EXPECT_EQ(client.nextReply(), success(stop));
}

TEST_F(CallToStoreTest, WithoutAListAllStartedSessionsGetTheMessage)
{
    WireClient first(kestod.socketPath());
    WireClient second(kestod.socketPath());
    first.ask(Create, 1);
    first.ask(SetServiceType, 4, 1);
    first.call(Start, 1);
    first.ask(Create, 2);
    second.ask(Create, 3);
    second.ask(SetServiceType, 10, 3);
    second.call(Start, 3);
    second.ask(SendMessage, Dictionary{{"a", 1}}, playback, typeStop, null);
    EXPECT_THAT(kestod.events("*.Playback.Stop"),
                ElementsAre(named("com.quarn.kesto.Playback.Stop"), named("com.quarn.alarms.Playback.Stop"),
                            named("com.quarn.kesto.Playback.Stop"), named("com.quarn.alerts.Playback.Stop")));
}

TEST_F(CallToStoreTest, WithoutAListAndWithoutSessionsTheMessageStandsAlone)
{
    WireClient client(kestod.socketPath());
    EXPECT_EQ(client.ask(SendMessage, Dictionary{{"a", 1}}, playback, typeStart, null), (Array{1, null}));
    const auto events = kestod.events();
    ASSERT_THAT(events,
                ElementsAre(named("com.quarn.kesto.Playback.Start"), named("com.quarn.standalone.Playback.Start")));
    EXPECT_EQ(events[0].payload, R"({"a":1,"HostApplicationDisplayID":"Unknown"})");
}

TEST_F(CallToStoreTest, AnEmptyListGoesNowhere)
{
    WireClient client(kestod.socketPath());
    client.ask(Create, 1);
    EXPECT_EQ(client.ask(SendMessage, Dictionary{{"to", "nobody"}}, playback, typeStart, Array{}), (Array{2, null}));
    client.ask(SendMessage, Dictionary{{"to", "one"}}, playback, typeStart, Array{1});
    EXPECT_THAT(kestod.events(),
                ElementsAre(Field(&StoreRow::payload, HasSubstr(R"("to":"one")")),
                            Field(&StoreRow::payload, HasSubstr(R"("to":"one")"))));
}

TEST_F(CallToStoreTest, AClientThatDisconnectsLeavesAnUptimeEvent)
{
    WireClient client(kestod.socketPath());
    client.ask(Create, 1);
    client.call(Start, 1);
    client.ask(GetAllReporters);
    client.close();
    const auto events = kestod.waitForEvents(uptimeEvent);
    ASSERT_THAT(events, SizeIs(1));
    EXPECT_THAT(events[0].payload, MatchesRegex(R"(\{"processName":"end_to_end_test","seconds":[0-9.e-]+\})"));
    EXPECT_TRUE(kestod.waitForLog("ending session 1"));
    EXPECT_TRUE(kestod.waitForLog("removing " + std::to_string(::getpid()) + " from the server client list"));
    EXPECT_FALSE(kestod.log().contains("interruptionHandler"));
}

TEST_F(CallToStoreTest, AClientThatClosesItsSendingSideHasItsCallsCarriedOutAndGetsNoMoreAnswersThanHadLeft)
{
    constexpr std::uint64_t count = 200;
    WireClient client(kestod.socketPath());
    client.ask(Create, 1);
    const auto start = client.call(Start, 1);
    client.ask(GetAllReporters);
    std::uint64_t next = 0;
    for (std::uint64_t number = 0; number < count; ++number) {
        const auto call = client.call(SendMessage, Dictionary{{"number", number}}, playback, typeStart, Array{1});
        if (number == 0)
            next = call;
    }
    client.closeSendingSide();
    while (const auto reply = client.nextReply()) { // until the service closes its side, too
        EXPECT_EQ(*reply, (Array{next, null}))
            << "in their order, and never that to the start, which is call " << start;
        ++next;
    }
    ASSERT_TRUE(kestod.waitForLog("removing " + std::to_string(::getpid()) + " from the server client list"));
    EXPECT_THAT(kestod.waitForEvents("com.quarn.kesto.Playback.Start", count), SizeIs(count));
    EXPECT_TRUE(kestod.log().contains("ending session 1"));
    EXPECT_FALSE(kestod.log().contains("interruptionHandler"));
}

TEST_F(CallToStoreTest, AResetIsAnInterruptionAndThenAnInvalidationAndStopsSessionsOnce)
{
    WireClient client(kestod.socketPath());
    client.ask(Create, 77);
    client.call(Start, 77);
    client.ask(GetAllReporters);
    client.reset();
    ASSERT_TRUE(kestod.waitForLog("deallocing this session 77"));
    ASSERT_TRUE(kestod.waitForLog("invalidationHandler: connection exited")); // on another thread
    const std::string log = kestod.log();
    const auto interruption = log.find("interruptionHandler: connection exited");
    ASSERT_NE(interruption, std::string::npos);
    EXPECT_NE(log.find("invalidationHandler: connection exited", interruption), std::string::npos);
    EXPECT_EQ(kestod.countInLog("ending session 77"), 2U); // both lines of one stop
    EXPECT_THAT(kestod.waitForEvents(uptimeEvent), SizeIs(1));
}

// A connection may end before the busy server queue registers it. It then has no uptime yet, which is logged, but it is
// still registered and removed.
TEST(CrowdedRoadTest, EveryConnectionThatComesAndVanishesBesideABusyClientIsRegisteredAndRemoved)
{
    constexpr std::size_t processes = 50; // none of them makes more log lines than it may
    constexpr std::size_t connectionsOfEach = 200;
    constexpr std::size_t connections = processes * connectionsOfEach;
    Kestod kestod({}, {{"KESTO_LOG", "default"}});
    kestod.startAndAwait(); // with a first connection, which ends immediately
    std::jthread busy([&](const std::stop_token& isOver) {
        WireClient client(kestod.socketPath());
        client.ask(Create, 1);
        client.call(Start, 1);
        while (!isOver.stop_requested()) {
            constexpr int burst = 5'000; // more than the connection thread runs itself
            client.sendFrame(Array{0, static_cast<int>(Validate), 1}, burst);
            for (int number = 0; number < burst; ++number)
                ASSERT_TRUE(client.nextReply());
        }
    });
    for (std::size_t process = 0; process < processes; ++process)
        EXPECT_TRUE(doInAnotherProcess([&] {
            for (std::size_t number = 0; number < connectionsOfEach; ++number) {
                WireClient client(kestod.socketPath());
                if (number % 2 == 0)
                    client.sendBytes("\x05"); // the stream ends inside a frame: an interruption
            }
        }));
    busy.request_stop();
    busy.join();

    constexpr std::size_t all = connections + 2;
    EXPECT_TRUE(waitUntil([&] { return kestod.countInLog("from the server client list") == 2 * all; }))
        << "removed and freed";
    EXPECT_EQ(kestod.countInLog("new client with pid"), all);
    EXPECT_EQ(kestod.countInLog(" removing "), all);
    EXPECT_TRUE(waitUntil([&] { return kestod.countInLog(" dealloc ") == all; }));
    EXPECT_TRUE(waitUntil([&] { return kestod.countInLog("invalidationHandler: connection exited") == all; }));
    EXPECT_EQ(kestod.countInLog("interruptionHandler: connection exited"), connections / 2);
    EXPECT_EQ(kestod.events(uptimeEvent).size() + kestod.countInLog("clientProcessName is nil"), all);
}

TEST_F(CallToStoreTest, KillServiceEndsTheProcessWithStatus2)
{
    WireClient client(kestod.socketPath());
    client.call(KillService);
    EXPECT_TRUE(client.isClosed());
    EXPECT_EQ(kestod.exitStatus(), 2);
    EXPECT_THAT(kestod.log(),
                MatchesRegex("(.|\n)* end_to_end_test asks the service to end: connection of process "
                             + std::to_string(::getpid()) + " .user " + std::to_string(::getuid())
                             + ".\n[^\n]*DESTROYING SERVICE\n"));
}

TEST_F(CallToStoreTest, AServiceThatWasKilledStartsAgainAtItsStaleSocket)
{
    WireClient(kestod.socketPath()).ask(SendMessage, Dictionary{{"run", 1}}, playback, typeStart, null);
    kestod.kill();
    kestod.start();
    WireClient(kestod.socketPath()).ask(SendMessage, Dictionary{{"run", 2}}, playback, typeStart, null);
    EXPECT_THAT(kestod.events("com.quarn.kesto.Playback.Start"), SizeIs(2));
}

TEST(FeatureRoadTest, ARingerSwitchReachesASessionThatIsNotStartedToo)
{
    Kestod kestod;
    kestod.start();
    WireClient client(kestod.socketPath());
    client.ask(Create, 1);
    support::replaceFile(kestod.directory() / "run/notifications/com.quarn.halden.ringerstate", "1");
    ASSERT_TRUE(kestod.waitForLog(R"(defaults {"ringerstate":true)"));
    EXPECT_TRUE(kestod.waitForLog("sending message for session owned by 1"));
}

TEST(FeatureRoadTest, APreferenceThatChangesReachesEverySession)
{
    Kestod kestod;
    kestod.start();
    WireClient client(kestod.socketPath());
    client.ask(Create, 1);
    const std::filesystem::path preferences = kestod.directory() / "configuration/preferences";
    std::filesystem::create_directory(preferences);
    support::replaceFile(preferences / "com.quarn.kesto.toml", "device_name = \"Kitchen\"\n");
    EXPECT_TRUE(kestod.waitForLog("feature 2 changes"));
    EXPECT_TRUE(kestod.waitForLog(R"(defaults {"device_name":"Kitchen",)"));
    EXPECT_EQ(kestod.countInLog("feature 1 changes"), 0U);
    support::replaceFile(preferences / "com.quarn.halden.toml", "spatial-audio-accessory-feature = true\n");
    EXPECT_TRUE(kestod.waitForLog("feature 1 changes"));
    EXPECT_TRUE(kestod.waitForLog(R"(defaults {"spatial-audio-accessory-feature":true,"device_name":"Kitchen",)"));
    EXPECT_TRUE(kestod.waitForLog("sending message for session owned by 1"));
    kestod.awaitLog();
    EXPECT_EQ(kestod.countInLog("feature 2 changes"), 1U);
}

// A session that plays from the second 10 on.
void playUntil(double end, const Kestod& kestod)
{
    WireClient client(kestod.socketPath());
    client.ask(Create, 1);
    client.call(Start, 1);
    client.ask(
        SendMessage,
        Dictionary{{"session_output_running", true}, {"PomoSessionVolume", 0.5}, {"kestoreporting_timestamp", 10.0}},
        playback, typeStart, Array{1});
    client.ask(SendMessage, Dictionary{{"session_output_running", false}, {"kestoreporting_timestamp", end}}, playback,
               typeStop, Array{1});
    client.call(Stop, 1);
    client.nextReply();
    client.nextReply();
}

TEST(CustomerRoadTest, EventsKeepTheTimeStampThatRecordedMessagesLose)
{
    Kestod kestod;
    kestod.start();
    playUntil(20.0, kestod);
    EXPECT_THAT(kestod.events("com.quarn.kesto.Playback.Start"),
                ElementsAre(Field(&StoreRow::payload, HasSubstr("kestoreporting_timestamp"))));
    EXPECT_THAT(kestod.events("com.quarn.kesto.Volume.Summary"), SizeIs(0)); // every stretch measures 0
    EXPECT_FALSE(std::filesystem::exists(kestod.directory() / "logs/Audio"));
}

TEST(UnwantedRoadTest, EventsWithUnwantedNamesAreNotStored)
{
    Kestod kestod(Kestod::Files{{"analytics.toml", "used = [\"com.quarn.alerts.*\"]\n"}});
    kestod.start();
    const auto sendAlert = [&] {
        WireClient client(kestod.socketPath());
        client.ask(Create, 1);
        client.ask(SetServiceType, 10, 1);
        client.ask(SendMessage, Dictionary{{"a", 1}}, playback, typeStart, Array{1});
    };
    sendAlert();
    ASSERT_TRUE(kestod.waitForLog("invalidationHandler: connection exited"));
    sendAlert(); // the events of the first session's end are stored before this, or never
    EXPECT_THAT(kestod.events(),
                ElementsAre(named("com.quarn.alerts.Playback.Start"), named("com.quarn.alerts.Playback.Start")));
}

TEST(InternalRoadTest, PlayingBecomesAVolumeEventAndASummaryFile)
{
    Kestod kestod(Kestod::Files{{"device.toml", "InternalBuild = true\n"}});
    kestod.start();
    playUntil(20.6, kestod);
    EXPECT_THAT(kestod.events("com.quarn.kesto.Volume.Summary"),
                ElementsAre(Field(&StoreRow::payload, HasSubstr(R"("play_seconds":10.6)"))));
    std::size_t files = 0;
    for (const auto& file : std::filesystem::directory_iterator(kestod.directory() / "logs/Audio/Reporting")) {
        ++files;
        EXPECT_THAT(support::readFile(file.path()), HasSubstr("Volume_Summary_1"));
    }
    EXPECT_EQ(files, 1U);
}

// The end of this session takes many times as long as a call.
TEST(InternalRoadTest, ALongStopHoldsUpItsClientAndNoOther)
{
    constexpr int changes = 20'000;
    constexpr int session = 1;
    Kestod kestod(Kestod::Files{{"device.toml", "InternalBuild = true\n"}});
    kestod.start();
    WireClient player(kestod.socketPath());
    player.ask(Create, session);
    const auto started = player.call(Start, session);
    for (int change = 0; change <= changes; ++change)
        player.ask(SendMessage,
                   Dictionary{{"session_output_running", true},
                              {"PomoSessionVolume", change % 2},
                              {"kestoreporting_timestamp", change}},
                   playback, typeStart, Array{session});
    const auto stopped = player.call(Stop, session);
    const auto destroyed = player.call(Destroy, session);
    ASSERT_TRUE(kestod.waitForLog("sending volume event for reporter 1"));
    EXPECT_TRUE(doInAnotherProcess([&] {
        WireClient other(kestod.socketPath());
        for (int call = 0; call < 3; ++call)
            other.ask(SendMessage, Dictionary{{"a", call}}, playback, typeStart, null);
    }));
    EXPECT_EQ(kestod.countInLog("stopping 1"), 0U) << "the others were answered before it was over";
    EXPECT_EQ(kestod.countInLog("active reporting sessions 0 : []"), 3U) << "for them it was stopped";
    player.replyTo(started);
    player.replyTo(stopped);
    player.replyTo(destroyed);
    EXPECT_THAT(kestod.events("com.quarn.kesto.Volume.Summary"), SizeIs(changes));
    EXPECT_THAT(brokenSums(kestod), IsEmpty());
}

TEST(InternalRoadTest, AFolderForDiagnosticFilesThatWentIsMadeAgain)
{
    Kestod kestod(Kestod::Files{{"device.toml", "InternalBuild = true\n"}});
    kestod.start();
    WireClient client(kestod.socketPath());
    client.ask(Create, 1);
    client.call(Start, 1);
    client.ask(SendMessage, Dictionary{{"a", 1}}, playback, typeStart, Array{1});
    std::filesystem::remove_all(kestod.directory() / "logs");
    client.call(Stop, 1);
    client.nextReply();
    client.nextReply();
    EXPECT_FALSE(std::filesystem::is_empty(kestod.directory() / "logs/Audio/Reporting"));
}

TEST(InternalRoadTest, OldSummaryFilesGoWhenThereAreTooMany)
{
    constexpr std::size_t most = 4096;
    const auto filesIn = [](const std::filesystem::path& folder) {
        const std::filesystem::directory_iterator end;
        return static_cast<std::size_t>(std::distance(std::filesystem::directory_iterator(folder), end));
    };
    Kestod kestod(Kestod::Files{{"device.toml", "InternalBuild = true\n"}});
    const auto folder = kestod.directory() / "logs/Audio/Reporting";
    std::filesystem::create_directories(folder);
    for (std::size_t number = 0; number < most; ++number)
        support::writeFile(folder / ("20260101-000000+0000-kesto-" + std::to_string(number) + "-generic.json"), "[]");
    support::writeFile(folder / "notes.txt", "of another program");
    kestod.start();
    WireClient client(kestod.socketPath());
    client.ask(Create, 1);
    client.call(Start, 1);
    client.ask(SendMessage, Dictionary{{"a", 1}}, playback, typeStart, Array{1});
    client.call(Stop, 1);
    client.nextReply();
    client.nextReply();
    EXPECT_TRUE(kestod.waitForLog("removed the oldest 1025 files from " + folder.string()
                                  + ", 1025 since the start: there may be 4096 of 256 MiB together"));
    EXPECT_EQ(filesIn(folder), most / 4 * 3 + 1);
    EXPECT_TRUE(std::filesystem::exists(folder / "notes.txt"));
}

} // namespace
} // namespace end_to_end
