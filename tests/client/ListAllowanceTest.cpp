// SPDX-License-Identifier: Apache-2.0
// How much of the log a client's calls fill with lists of sessions.
#include "client/ListAllowance.h"

#include "support/ServiceHarness.h"

#include <gmock/gmock.h>
#include <numeric>

namespace {

using namespace support;
using foundation::Array;
using foundation::Dictionary;
using testing::EndsWith;
using testing::HasSubstr;

// --- one list

class ListTest : public testing::Test {
protected:
    TestPlatform platform;
};

TEST_F(ListTest, DescribesOneMoreSessionAfterExactly24KibibytesOfDescriptionsAndNoneAfterMore)
{
    constexpr std::size_t sessionsOf24Kibibytes = 96;
    constexpr std::size_t bytesOfADescription = 256;
    std::vector<std::shared_ptr<KestoReportingSession>> sessions;
    const auto addSession = [&](std::int64_t reporterID) {
        sessions.push_back(std::make_shared<KestoReportingSession>(reporterID, std::vector<std::int32_t>{1001}));
        sessions.back()->setConfiguration(Dictionary{{"HostApplicationDisplayID", std::string(173, 'x')}});
        ASSERT_EQ(sessions.back()->description().size(), bytesOfADescription);
    };
    for (std::size_t count = 0; count < sessionsOf24Kibibytes; ++count)
        addSession(100);
    const auto describe = [&] {
        return client::descriptionOfSessions(sessions.size(), [next = sessions.begin()]() mutable { return *next++; });
    };
    addSession(201);
    EXPECT_THAT(describe(), EndsWith("xxx,started=0\"]"));
    EXPECT_THAT(describe(), HasSubstr("\"reporterID=201,"));
    addSession(202);
    EXPECT_THAT(describe(), HasSubstr("\"reporterID=201,"));
    EXPECT_THAT(describe(), EndsWith("xxx,started=0\",\"... 1 more\"]"));
}

// --- the lists of a minute

class ListAllowanceTest : public testing::Test {
protected:
    static constexpr std::int64_t sessions = 400; // more than one line shows

    ListAllowanceTest()
    {
        for (std::int64_t reporterID = 1; reporterID <= sessions; ++reporterID)
            player.call(CreateReportingSession, reporterID);
        player.call(StartReportingSessionForID, 1);
        harness.platform.clock.advance(60);
    }

    // The bytes of the lines that the calls log.
    template <typename Calls> std::size_t bytesLogged(Calls calls)
    {
        harness.forget();
        calls();
        const auto lines = harness.platform.log.lines();
        return std::accumulate(lines.begin(), lines.end(), std::size_t{0},
                               [](std::size_t sum, const LogLine& line) { return sum + line.message.size(); });
    }
    static void sendToAll(TestClient& client, int times)
    {
        for (int number = 0; number < times; ++number)
            client.call(SendMessage, Dictionary{{"number", number}}, 4, 1, foundation::Value());
    }
    [[nodiscard]] std::string lastOfPlayer() const
    {
        std::string last;
        for (const LogLine& line : harness.platform.log.lines("kers"))
            if (line.message.starts_with("sessions for client 1001 : "))
                last = line.message;
        return last;
    }

    ServiceHarness harness;
    TestClient player = harness.connect("player");
    TestClient recorder = harness.connect("recorder");
};

TEST_F(ListAllowanceTest, ListsSessionsUntilItIsUsedUpAndThenTheirNumber)
{
    constexpr std::size_t allowance = 256 * 1024;
    constexpr std::size_t everythingElse = 64 * 1024;
    const std::size_t bytes = bytesLogged([&] { sendToAll(recorder, 100); });
    EXPECT_GT(bytes, allowance);
    EXPECT_LT(bytes, allowance + everythingElse);
    EXPECT_EQ(lastOfPlayer(), "sessions for client 1001 : 400 sessions");
    EXPECT_EQ(harness.platform.log.lines("kerc").back().message, "active reporting sessions 1 : 1 session");
}

TEST_F(ListAllowanceTest, IsThereAgainAMinuteLater)
{
    sendToAll(recorder, 100);
    harness.platform.clock.advance(59.9);
    sendToAll(recorder, 1);
    EXPECT_EQ(lastOfPlayer(), "sessions for client 1001 : 400 sessions");
    harness.platform.clock.advance(0.1);
    sendToAll(recorder, 1);
    EXPECT_THAT(lastOfPlayer(), HasSubstr("[\"reporterID=1,"));
}

TEST_F(ListAllowanceTest, IsThatOfTheClientWhichCalls)
{
    sendToAll(recorder, 100);
    sendToAll(player, 1);
    EXPECT_THAT(lastOfPlayer(), HasSubstr("[\"reporterID=1,"));
}

TEST_F(ListAllowanceTest, IsUsedUpByTheStartsAndStopsOfSessionsToo)
{
    for (int number = 0; number < 20; ++number) {
        player.call(StopReportingSessionForID, 1);
        player.call(StartReportingSessionForID, 1);
    }
    EXPECT_EQ(lastOfPlayer(), "sessions for client 1001 : 400 sessions");
    EXPECT_EQ(harness.platform.log.lines("kerc").back().message, "0 active reporting session(s) 1 session");
}

TEST_F(ListAllowanceTest, IsSharedByAllClientsSoThatNoneGetsMoreByConnectingAgain)
{
    constexpr std::size_t allowance = 1024 * 1024;
    constexpr std::size_t everythingElse = 256 * 1024;
    std::size_t bytes = 0;
    for (int number = 0; number < 10; ++number) {
        TestClient again = harness.connect("again");
        bytes += bytesLogged([&] { sendToAll(again, 20); });
    }
    EXPECT_GT(bytes, allowance);
    EXPECT_LT(bytes, allowance + everythingElse);
}

// --- many lists

// Each reading of the clock takes longer than a slice of the server queue's time.
class SlowListsTest : public ListAllowanceTest {
protected:
    SlowListsTest()
    {
        harness.forget();
        harness.platform.clock.setPaceOfSystemUptime(0.001);
    }

    // The lines that list sessions when another client's call is answered.
    std::vector<std::string> listedBeforeTheNextAnswer()
    {
        const auto other = recorder.submit(GetServiceNameForReporterID, {0});
        while (recorder.answersTo(other) == unanswered)
            EXPECT_TRUE(harness.platform.workQueues.runOne());
        std::vector<std::string> lines;
        for (const LogLine& line : harness.platform.log.lines())
            if (line.message.contains("essions for client") || line.message.contains("active reporting session"))
                lines.push_back(line.message.substr(0, line.message.find(" [")));
        return lines;
    }
};

TEST_F(SlowListsTest, LetTheCallsOfOthersGoInBetweenAtAStop)
{
    const auto stopped = player.submit(StopReportingSessionForID, {1});
    EXPECT_THAT(listedBeforeTheNextAnswer(), testing::ElementsAre("sessions for client 1001 :"));
    EXPECT_EQ(player.answersTo(stopped), unanswered);
    harness.platform.workQueues.runAll();
    EXPECT_THAT(listedBeforeTheNextAnswer(),
                testing::ElementsAre(
                    "sessions for client 1001 :", "sessions for client 1002 :", "0 active reporting session(s)"));
    EXPECT_EQ(player.answersTo(stopped), answeredOnce(succeeded));
}

TEST_F(SlowListsTest, LetTheCallsOfOthersGoInBetweenAtAMessageToAll)
{
    const auto sent = player.submit(SendMessage, {Dictionary{{"a", 1}}, 4, 1, null});
    EXPECT_THAT(listedBeforeTheNextAnswer(), testing::ElementsAre("sessions for client 1001 :"));
    EXPECT_EQ(player.answersTo(sent), unanswered);
    harness.platform.workQueues.runAll();
    EXPECT_THAT(listedBeforeTheNextAnswer(),
                testing::ElementsAre(
                    "sessions for client 1001 :", "sessions for client 1002 :", "active reporting sessions 1 :"));
    EXPECT_EQ(player.answersTo(sent), answeredOnce(delivered));
}

TEST_F(ListAllowanceTest, CoversTheReporterIDsOfAMessage)
{
    const Array unknown(std::vector<foundation::Value>(9'000, foundation::Value(987'654)));
    const auto lastReceivers = [&] {
        harness.forget();
        recorder.call(SendMessage, Dictionary{}, 4, 1, unknown);
        return harness.platform.log.lines("kerc").front().message;
    };
    EXPECT_THAT(lastReceivers(), testing::StartsWith("sending message for reporter [987654,987654,"));
    for (int number = 0; number < 10; ++number)
        lastReceivers();
    EXPECT_EQ(lastReceivers(), "sending message for reporter 9,000 sessions");
}

} // namespace
