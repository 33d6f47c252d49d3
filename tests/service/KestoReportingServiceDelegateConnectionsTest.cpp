// SPDX-License-Identifier: Apache-2.0
// A connection's beginning and end in the service, and the event with its duration.
#include "support/ServiceHarness.h"
#include "support/WatchedThread.h"

#include <gmock/gmock.h>

namespace {

using namespace support;
using enum platform::LogLevel;
using foundation::Dictionary;
using foundation::Number;
using foundation::Value;
using testing::Contains;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

constexpr std::int32_t pid = 17;
constexpr std::string_view uptimeEvent = "com.quarn.kesto.kestoreportingclientuptime";
constexpr double startDate = 2'000'000'000.25;

class ClientConnectionTest : public testing::Test {
protected:
    ClientConnectionTest()
    {
        platform.processTable.add(pid, "player");
        platform.analytics.use("com.quarn.*"); // as on a device, unless its owner has other settings
        platform.clock.set(startDate);
    }

    std::shared_ptr<FakeConnection> accept() { return harness.listener.connect(pid); }
    // Accepts and registers a connection, and clears the log.
    std::shared_ptr<FakeConnection> connect()
    {
        auto connection = accept();
        platform.workQueues.runAll();
        harness.forget();
        return connection;
    }
    [[nodiscard]] const auto& clients() const { return harness.service->getAllClients(); }
    // The numbers of seconds of the uptime events.
    std::vector<Number> uptimes()
    {
        std::vector<Number> uptimes;
        for (const auto& payload : platform.analytics.payloads(uptimeEvent))
            uptimes.push_back(*payload.find("seconds")->number());
        return uptimes;
    }

    ServiceHarness harness;
    TestPlatform& platform = harness.platform;
};

// --- acceptance

TEST_F(ClientConnectionTest, IsAcceptedAndResumed)
{
    const auto connection = accept();
    EXPECT_TRUE(connection->isResumed());
    EXPECT_THAT(platform.log.lines(),
                ElementsAre(IsLine(Default, "kers", "newConnection: connection of process 17"),
                            IsLine(Default, "kerc", "new client with pid 17")));
}

TEST_F(ClientConnectionTest, IsRegisteredOnTheServerQueue)
{
    const auto connection = accept();
    EXPECT_THAT(clients(), IsEmpty());
    platform.workQueues.runAll();
    ASSERT_THAT(clients(), SizeIs(1));
    EXPECT_EQ(clients()[0]->processIdentifier(), pid);
    EXPECT_EQ(clients()[0]->clientStartDate(), startDate);
    EXPECT_EQ(clients()[0]->clientProcessName(), "player");
    EXPECT_THAT(platform.processTable.forgotten(), ElementsAre(pid))
        << "the client keeps the name, so it must be the current one";
}

TEST_F(ClientConnectionTest, IsRegisteredBeforeItsFirstCallIsServed)
{
    const auto connection = accept();
    EXPECT_TRUE(connection->call({1, 1, 42}));
    platform.workQueues.runAll();
    EXPECT_NE(harness.find(42), nullptr);
}

TEST_F(ClientConnectionTest, HasAClientOfItsOwn)
{
    const auto first = connect();
    const auto second = connect();
    ASSERT_THAT(clients(), SizeIs(2));
    EXPECT_NE(clients()[0], clients()[1]);
    first->call({1, 1, 42});
    platform.workQueues.runAll();
    EXPECT_NE(clients()[0]->clientReportingSessionMap().find(42), nullptr);
    EXPECT_EQ(clients()[1]->clientReportingSessionMap().find(42), nullptr);
}

TEST_F(ClientConnectionTest, GetsItsClientWhileNoSessionIsLookedUp)
{
    std::optional<WatchedThread> looker;
    bool waits = false;
    platform.log.setObserver([&](const LogLine& line) {
        if (line.message != "new client with pid 17")
            return;
        looker.emplace([&] { EXPECT_EQ(harness.service->findReportingSessionForID(42), nullptr); });
        waits = looker->fallsAsleep();
    });
    onServerQueue(platform.workQueues, [&] {
        const auto connection = accept();
        looker.reset();
    });
    platform.log.setObserver(nullptr);
    EXPECT_TRUE(waits) << "both hold the service object's lock";
    EXPECT_THAT(platform.log.lines("kers"), Contains(IsLine(Error, "kers", "failed to find reporting session 42")));
}

TEST_F(ClientConnectionTest, EndsWhenACallBreaksTheProtocolAndNoOtherDoes)
{
    const auto hostile = connect();
    const auto other = connect();
    const auto result = hostile->call({1, 1});
    ASSERT_FALSE(result);
    EXPECT_EQ(result.error().reason, "createReportingSession takes 1 arguments, not 0");
    platform.workQueues.runAll();
    EXPECT_THAT(clients(), SizeIs(1));
    EXPECT_TRUE(other->call({1, 1, 42}));
    platform.workQueues.runAll();
    EXPECT_THAT(other->received(), SizeIs(1));
}

// --- invalidation

TEST_F(ClientConnectionTest, ThatIsClosedLeavesTheRegistryAndTellsItsTime)
{
    const auto connection = connect();
    platform.clock.advance(12.5);
    connection->close();
    platform.workQueues.runAll();
    EXPECT_THAT(clients(), IsEmpty());
    EXPECT_THAT(
        platform.log.lines(),
        ElementsAre(IsLine(Default, "kers", "invalidationHandler: connection exited process=player uptime_sec=12"),
                    IsLine(Default, "kerc", "removing 17 from the server client list"),
                    IsLine(Default, "kerc", "dealloc 17 from the server client list")));
    EXPECT_THAT(platform.analytics.events(),
                ElementsAre(AnalyticsEvent{std::string(uptimeEvent), {{"processName", "player"}, {"seconds", 12.5}}}));
    EXPECT_EQ(uptimes()[0].kind(), Number::Kind::Float64);
    ASSERT_EQ(platform.analytics.origins().size(), 1U);
    EXPECT_NE(platform.analytics.origins()[0].source, 0U);
}

TEST_F(ClientConnectionTest, ThatIsClosedHasItsClientLeaveBeforeAnythingElseIsDone)
{
    const auto connection = connect();
    clients()[0]->setClientStartDate(std::nullopt);
    std::vector<std::size_t> submitted;
    platform.log.setObserver([&](const LogLine&) { submitted.push_back(platform.workQueues.pending()); });
    connection->close();
    platform.log.setObserver(nullptr);
    EXPECT_THAT(submitted, ElementsAre(1, 1)) << "before each of the two lines";
}

TEST_F(ClientConnectionTest, OfNoTimeIsStillADouble)
{
    const auto connection = connect();
    connection->close();
    ASSERT_THAT(uptimes(), ElementsAre(Number(0.0)));
    EXPECT_EQ(uptimes()[0].kind(), Number::Kind::Float64);
    EXPECT_THAT(
        platform.log.lines(),
        ElementsAre(IsLine(Default, "kers", "invalidationHandler: connection exited process=player uptime_sec=0")))
        << "it began no later than now";
}

TEST_F(ClientConnectionTest, TellsItsTimeWithoutBuildingThePayload)
{
    connect()->close();
    EXPECT_THAT(platform.analytics.sent(), ElementsAre(uptimeEvent));
    EXPECT_EQ(platform.analytics.timesBuilt(), 0);
}

TEST_F(ClientConnectionTest, ThatBeganLaterThanNowSaysSoInItsOwnWords)
{
    const auto connection = connect();
    platform.clock.set(startDate - 99.75);
    connection->close();
    EXPECT_THAT(
        platform.log.lines(),
        ElementsAre(IsLine(Default, "kers", "clientStartDate is in the past. clientpid=17 clientprocessname=player"),
                    IsLine(Default, "kers", "invalidationHandler: connection exited process=player uptime_sec=99")));
    EXPECT_THAT(uptimes(), ElementsAre(Number(99.75))) << "the length of the interval, whichever way it runs";
}

TEST_F(ClientConnectionTest, OfUnknownBeginningHasAnUptimeOfMinusOneAsAnInteger)
{
    const auto connection = connect();
    clients()[0]->setClientStartDate(std::nullopt);
    connection->close();
    EXPECT_THAT(
        platform.log.lines(),
        ElementsAre(IsLine(Default, "kers", "clientStartDate is nil. clientpid=17 clientprocessname=player"),
                    IsLine(Default, "kers", "invalidationHandler: connection exited process=player uptime_sec=-1")));
    ASSERT_THAT(uptimes(), ElementsAre(Number(-1)));
    EXPECT_EQ(uptimes()[0].kind(), Number::Kind::Signed64);
}

TEST_F(ClientConnectionTest, OfAProcessWithoutANameSendsNoEvent)
{
    platform.processTable.remove(pid);
    const auto connection = connect();
    EXPECT_EQ(clients()[0]->clientProcessName(), std::nullopt);
    platform.clock.advance(3);
    connection->close();
    EXPECT_THAT(
        platform.log.lines(),
        ElementsAre(IsLine(Default, "kers", "invalidationHandler: connection exited process=unknown uptime_sec=3"),
                    IsLine(Default, "kers", "clientProcessName is nil. clientpid=17")));
    EXPECT_THAT(platform.analytics.sent(), IsEmpty());
}

TEST_F(ClientConnectionTest, ThatEndsBeforeItIsRegisteredIsRegisteredAndRemoved)
{
    const auto connection = accept();
    harness.forget();
    connection->close();
    EXPECT_THAT(
        platform.log.lines(),
        ElementsAre(IsLine(Default, "kers", "clientStartDate is nil. clientpid=17 clientprocessname=unknown"),
                    IsLine(Default, "kers", "invalidationHandler: connection exited process=unknown uptime_sec=-1"),
                    IsLine(Default, "kers", "clientProcessName is nil. clientpid=17")));
    EXPECT_THAT(platform.analytics.sent(), IsEmpty());
    harness.forget();
    platform.workQueues.runAll();
    EXPECT_THAT(clients(), IsEmpty());
    EXPECT_THAT(platform.log.lines(),
                ElementsAre(IsLine(Default, "kerc", "removing 17 from the server client list"),
                            IsLine(Default, "kerc", "dealloc 17 from the server client list")));
}

TEST_F(ClientConnectionTest, WhoseClientIsFreedAlreadyKnowsNothingOfIt)
{
    const auto connection = connect();
    connection->interrupt();
    connection->setCallHandler(nullptr); // the connection owns its client
    platform.workQueues.runAll();
    harness.forget();
    connection->close();
    EXPECT_THAT(
        platform.log.lines(),
        ElementsAre(IsLine(Default, "kers", "clientStartDate is nil. clientpid=17 clientprocessname=unknown"),
                    IsLine(Default, "kers", "invalidationHandler: connection exited process=unknown uptime_sec=-1"),
                    IsLine(Default, "kers", "clientProcessName is nil. clientpid=17")));
    EXPECT_EQ(platform.workQueues.pending(), 0U);
}

TEST_F(ClientConnectionTest, IsReleasedWhenItIsOver)
{
    auto connection = connect();
    connection->call({1, 1, 42});
    connection->call({2, 5, 42});
    platform.workQueues.runAll();
    connection->close();
    platform.workQueues.runAll();
    const std::weak_ptr<FakeConnection> gone = connection;
    connection.reset();
    EXPECT_TRUE(gone.expired());
}

// --- interruption

TEST_F(ClientConnectionTest, ThatBreaksIsRemovedOnceAndItsSessionsAreStoppedOnce)
{
    const auto connection = connect();
    connection->call({1, 1, 42});
    connection->call({2, 5, 42});
    platform.workQueues.runAll();
    harness.forget();
    platform.clock.advance(1);

    connection->interrupt();
    connection->close();
    platform.workQueues.runAll();
    EXPECT_THAT(clients(), IsEmpty());
    EXPECT_THAT(
        platform.log.lines("kers"),
        ElementsAre(IsLine(Default, "kers", "interruptionHandler: connection exited"),
                    IsLine(Default, "kers", "invalidationHandler: connection exited process=player uptime_sec=1")));
    EXPECT_THAT(platform.log.lines("kerc"),
                ElementsAre(IsLine(Default, "kerc", "removing 17 from the server client list"),
                            IsLine(Default, "kerc", "dealloc 17 from the server client list")));
    EXPECT_THAT(platform.log.lines("kerr"), Contains(IsLine(Debug, "kerr", "ending session 42")).Times(2))
        << "one stop says it twice";
    EXPECT_THAT(uptimes(), SizeIs(1));
}

TEST_F(ClientConnectionTest, ThatBreaksIsSaidToBeforeItsClientHearsOfIt)
{
    const auto connection = connect();
    std::vector<std::size_t> submitted;
    platform.log.setObserver([&](const LogLine& line) {
        EXPECT_EQ(line.message, "interruptionHandler: connection exited");
        submitted.push_back(platform.workQueues.pending());
    });
    connection->interrupt();
    platform.log.setObserver(nullptr);
    EXPECT_THAT(submitted, ElementsAre(0));
    EXPECT_EQ(platform.workQueues.pending(), 1U);
}

TEST_F(ClientConnectionTest, ThatIsInvalidatedLongAfterItBrokeFindsItsClientGone)
{
    const auto connection = connect();
    connection->interrupt();
    platform.workQueues.runAll();
    EXPECT_THAT(clients(), IsEmpty());
    harness.forget();
    platform.clock.advance(5);
    connection->close();
    platform.workQueues.runAll();
    EXPECT_THAT(
        platform.log.lines(),
        ElementsAre(IsLine(Default, "kers", "invalidationHandler: connection exited process=player uptime_sec=5"),
                    IsLine(Default, "kerc", "dealloc 17 from the server client list")));
    EXPECT_THAT(uptimes(), ElementsAre(Number(5.0)));
}

TEST_F(ClientConnectionTest, OfOneProcessMayBeOneOfMany)
{
    const auto first = connect();
    const auto second = connect();
    first->close();
    platform.workQueues.runAll();
    EXPECT_THAT(clients(), SizeIs(1));
    EXPECT_TRUE(second->call({1, 10}));
    platform.workQueues.runAll();
    EXPECT_THAT(second->received(), SizeIs(1));
}

} // namespace
