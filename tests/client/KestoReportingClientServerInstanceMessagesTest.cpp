// SPDX-License-Identifier: Apache-2.0
// The delivery of a message: its receivers, its order, and its sender.
#include "client/KestoReportingClientServerInstance.h"
#include "support/EmittedCodes.h"
#include "support/ServiceHarness.h"

#include <gmock/gmock.h>

namespace {

using namespace support;
using enum platform::LogLevel;
using foundation::Array;
using foundation::Dictionary;
using foundation::Value;
using support::clientSendMessage;
using support::sessionCreated;
using support::sessionDestroyed;
using support::sessionMessageAccepted;
using testing::_;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Return;
using testing::SizeIs;

std::string described(const TestClient& client, std::int64_t reporterID)
{
    return Value(Array{client.session(reporterID)->description()}).text();
}

class MessagesTest : public testing::Test {
protected:
    explicit MessagesTest(const std::function<void(TestPlatform&)>& prepare = {}) : harness(prepare)
    {
        platform.analytics.use("*");
    }

    void makeSession(TestClient& client, std::int64_t reporterID, bool started = true)
    {
        client.call(CreateReportingSession, reporterID);
        if (started)
            client.call(StartReportingSessionForID, reporterID);
        harness.forget();
    }
    Answers send(TestClient& client, const Value& reporterIDs, const Dictionary& message = {{"a", 1}})
    {
        platform.analytics.clear();
        return client.call(SendMessage, message, 4, 1, reporterIDs);
    }
    // The content that the session recorded under its first Playback message.
    static std::optional<Dictionary> recorded(const TestClient& client, std::int64_t reporterID)
    {
        const auto messages = client.session(reporterID)->nestedAggregatedPayloadData().value();
        for (const auto& message : messages)
            if (const Value* payload = message.find("Playback_Start_1"))
                return payload->dictionary();
        return std::nullopt;
    }

    ServiceHarness harness;
    TestPlatform& platform = harness.platform;
    TestClient player = harness.connect("player");
    TestClient recorder = harness.connect("recorder");
};

// --- to a list of reporters

TEST_F(MessagesTest, ReachTheSessionTheyAreFor)
{
    makeSession(player, 42);
    makeSession(player, 43);
    EXPECT_EQ(send(player, Array{42}), answeredOnce(delivered));
    EXPECT_EQ(recorded(player, 42), (Dictionary{{"a", 1}, {"audiotag", "PlaybackStart"}}));
    EXPECT_EQ(recorded(player, 43), std::nullopt);
    EXPECT_THAT(platform.log.lines(),
                ElementsAre(IsLine(Debug, "kerc", "sending message for reporter [42]"),
                            IsLine(Debug, "kerr", "sending message for session owned by 42")));
    EXPECT_THAT(platform.traceEmitter.take(), ElementsAre(clientSendMessage, sessionMessageAccepted));
    EXPECT_THAT(platform.analytics.sent(),
                ElementsAre("com.quarn.kesto.Playback.Start", "com.quarn.generic.Playback.Start"));
}

TEST_F(MessagesTest, LeaveTheDeviceAsTheClientSentThem)
{
    makeSession(player, 42);
    player.call(SetConfiguration, Dictionary{{"HostApplicationDisplayID", "org.player"}}, 42);
    send(player, Array{42}, {{"a key", 1}, {"kestoreporting_timestamp", 2.5}});
    EXPECT_THAT(platform.analytics.payloads("com.quarn.kesto.Playback.Start"),
                ElementsAre(Dictionary{
                    {"a key", 1}, {"kestoreporting_timestamp", 2.5}, {"HostApplicationDisplayID", "org.player"}}));
}

TEST_F(MessagesTest, LeaveTheDeviceEvenWhenTheSessionDropsOrCannotRecordThem)
{
    makeSession(player, 42);
    makeSession(player, 43, false);
    send(player, Array{42});
    send(player, Array{42});
    EXPECT_THAT(platform.analytics.sent(), SizeIs(2));
    send(player, Array{43});
    EXPECT_THAT(platform.analytics.sent(), SizeIs(2));
}

TEST_F(MessagesTest, ReachEverySessionOfTheirListInItsOrderAsOftenAsItStandsThere)
{
    makeSession(player, 42);
    makeSession(recorder, 43);
    EXPECT_EQ(send(player, Array{43, 42, 43}), answeredOnce(delivered));
    EXPECT_THAT(platform.log.lines(),
                ElementsAre(IsLine(Debug, "kerc", "sending message for reporter [43,42,43]"),
                            IsLine(Info, "kers", "found reporting session 43 for client 1002"),
                            IsLine(Debug, "kerr", "sending message for session owned by 43"),
                            IsLine(Debug, "kerr", "sending message for session owned by 42"),
                            IsLine(Info, "kers", "found reporting session 43 for client 1002"),
                            IsLine(Debug, "kerr", "sending message for session owned by 43"),
                            IsLine(Debug, "kerr", "dropping redundant event")));
    EXPECT_NE(recorded(recorder, 43), std::nullopt);
}

TEST_F(MessagesTest, SkipZeroAndIDsThatNobodyHas)
{
    makeSession(player, 42);
    makeSession(player, 0, false);
    support::onServerQueue(harness.platform.workQueues, [&] { player.session(0)->start(); });
    harness.forget();
    EXPECT_EQ(send(player, Array{0, 99}), answeredOnce(delivered));
    EXPECT_THAT(platform.analytics.asked(), IsEmpty());
    EXPECT_THAT(platform.log.lines(),
                ElementsAre(IsLine(Debug, "kerc", "sending message for reporter [0,99]"),
                            IsLine(Error, "kers", "failed to find reporting session 99")));
    EXPECT_THAT(platform.traceEmitter.take(), ElementsAre(clientSendMessage));
    EXPECT_EQ(send(player, Array{0, 42, 99}), answeredOnce(delivered));
    EXPECT_NE(recorded(player, 42), std::nullopt);
}

// Without a limit, a large message to many sessions would delay all clients.
TEST_F(MessagesTest, AreDeliveredToNoMoreOfManySessionsThanTheirSizeAllows)
{
    constexpr std::int64_t sessions = 100;
    constexpr std::size_t most = KestoReportingClientServerInstance::mostBytesOfADelivery;
    std::vector<Value> reporterIDs{0, 4711};
    for (std::int64_t reporterID = 1; reporterID <= sessions; ++reporterID) {
        makeSession(player, reporterID, false);
        reporterIDs.emplace_back(reporterID);
    }
    const Dictionary large{{"a", std::string(1'000'000, 'x')}};
    const auto receivers = static_cast<std::int64_t>(most / large.roughBytes());
    ASSERT_LT(receivers, sessions);
    const auto told = [&](int pid) {
        return IsLine(Error, "kerc",
                      "a message of client " + std::to_string(pid) + " is not delivered to "
                          + std::to_string(sessions - receivers)
                          + " sessions: it may take 67108864 bytes in all of its receivers; further ones are counted "
                            "until the client goes");
    };
    EXPECT_EQ(send(player, Array(reporterIDs), large), answeredOnce(delivered)) << "the client is answered as always";
    EXPECT_THAT(platform.log.lines("kerc"), testing::Contains(told(1001)).Times(1));
    EXPECT_THAT(platform.analytics.sent(), SizeIs(2 * receivers)) << "unknown sessions do not count";
    const ledger::Account account = platform.ledger.account();
    const auto refusals = static_cast<std::uint64_t>(sessions - receivers);
    EXPECT_EQ(account[ledger::Counter::Deliveries], static_cast<std::uint64_t>(sessions));
    EXPECT_EQ(account[ledger::Counter::Inert], static_cast<std::uint64_t>(receivers));
    EXPECT_EQ(account[ledger::Counter::RefusedForSize], refusals);
    ASSERT_THAT(account.culprits[0], SizeIs(1));
    EXPECT_EQ(account.culprits[0][0].culprit, (ledger::Culprit{.user = 0, .process = "player", .application = ""}));
    EXPECT_EQ(account.culprits[0][0].count, refusals);
    EXPECT_EQ(send(player, Array(reporterIDs)), answeredOnce(delivered));
    EXPECT_THAT(platform.analytics.sent(), SizeIs(2 * sessions)) << "a small message reaches all";

    for (std::int64_t reporterID = 1; reporterID <= sessions; ++reporterID)
        player.call(StartReportingSessionForID, reporterID);
    EXPECT_EQ(send(recorder, null, large), answeredOnce(delivered));
    EXPECT_THAT(platform.analytics.sent(), SizeIs(2 * receivers));
    EXPECT_THAT(platform.log.lines("kerc"), testing::Contains(told(1002)).Times(1));
    EXPECT_EQ(send(player, Array(reporterIDs), large), answeredOnce(delivered));
    EXPECT_THAT(platform.log.lines("kerc"), testing::Contains(told(1001)).Times(1)) << "the first refusal is logged";

    platform.analytics.clear();
    player.close();
    recorder.close();
    const auto refused = [&](int pid, std::int64_t times) {
        return IsLine(Error, "kerc",
                      "messages of client " + std::to_string(pid) + " were not delivered " + std::to_string(times)
                          + " times: a message may take 67108864 bytes in all of its receivers");
    };
    EXPECT_THAT(platform.log.lines("kerc"), testing::Contains(refused(1001, 2 * (sessions - receivers))).Times(1));
    EXPECT_THAT(platform.log.lines("kerc"), testing::Contains(refused(1002, sessions - receivers)).Times(1));
}

TEST_F(MessagesTest, AreDeliveredToOneSessionWhateverTheirSize)
{
    makeSession(player, 42);
    EXPECT_EQ(send(player, Array{42}, {{"a", Array(std::vector<Value>(500'000, Value(Array{})))}}),
              answeredOnce(delivered));
    EXPECT_THAT(platform.analytics.sent(), SizeIs(2));
}

TEST_F(MessagesTest, ToAnEmptyListReachNobody)
{
    makeSession(player, 42);
    EXPECT_EQ(send(player, Array{}), answeredOnce(delivered));
    EXPECT_EQ(recorded(player, 42), std::nullopt);
    EXPECT_THAT(platform.analytics.asked(), IsEmpty());
    EXPECT_THAT(platform.log.lines(), ElementsAre(IsLine(Debug, "kerc", "sending message for reporter []")));
}

TEST_F(MessagesTest, AreCountedByWhatBecameOfThem)
{
    using ledger::Counter;
    platform.analytics.use("com.quarn.kesto.*");
    makeSession(player, 42);
    makeSession(recorder, 43, false);
    const ledger::Account before = platform.ledger.account();
    const auto since = [&](Counter counter) { return platform.ledger.account()[counter] - before[counter]; };
    send(player, Array{42, 43, 44, 0});
    send(player, Array{42});
    send(player, Array{});
    EXPECT_EQ(since(Counter::CallsSendMessage), 3U);
    EXPECT_EQ(since(Counter::Deliveries), 3U) << "an unknown session gets no delivery";
    EXPECT_EQ(since(Counter::Recorded), 1U);
    EXPECT_EQ(since(Counter::Repeated), 1U);
    EXPECT_EQ(since(Counter::Inert), 1U);
    EXPECT_EQ(since(Counter::Events), 6U);
    player.call(StopReportingSessionForID, 42);
    const ledger::Account stopped = platform.ledger.account();
    send(player, null); // to none, and so without a session
    EXPECT_EQ(platform.ledger.account()[Counter::Inert] - stopped[Counter::Inert], 1U);
    EXPECT_EQ(platform.ledger.account()[Counter::Events] - stopped[Counter::Events], 2U);
    const ledger::Account account = platform.ledger.account();
    EXPECT_EQ(account[Counter::Deliveries],
              account[Counter::Recorded] + account[Counter::Repeated] + account[Counter::Inert]
                  + account.sum(ledger::Charge::Refused));
    EXPECT_EQ(account[Counter::Events],
              account[Counter::Kept] + account[Counter::Unwanted] + account.sum(ledger::Charge::Lost));
}

// --- to all sessions

TEST_F(MessagesTest, WithoutAListReachTheStartedSessionsOfAllClients)
{
    makeSession(recorder, 43);
    makeSession(player, 42);
    makeSession(player, 41, false);
    makeSession(player, 40);
    const std::string sessions = Value(Array{player.session(42)->description(), player.session(40)->description(),
                                             recorder.session(43)->description()})
                                     .text();
    const std::string ofPlayer = Value(Array{player.session(42)->description(), player.session(41)->description(),
                                             player.session(40)->description()})
                                     .text();
    EXPECT_EQ(send(player, null), answeredOnce(delivered));
    EXPECT_THAT(platform.log.lines(),
                ElementsAre(IsLine(Debug, "kerc", "sending message for reporter (null)"),
                            IsLine(Default, "kers", "sessions for client 1001 : " + ofPlayer),
                            IsLine(Default, "kers", "sessions for client 1002 : " + described(recorder, 43)),
                            IsLine(Default, "kerc", "active reporting sessions 3 : " + sessions),
                            IsLine(Debug, "kerr", "sending message for session owned by 42"),
                            IsLine(Debug, "kerr", "sending message for session owned by 40"),
                            IsLine(Debug, "kerr", "sending message for session owned by 43")));
    EXPECT_THAT(platform.analytics.sent(), SizeIs(6));
    for (const std::int64_t reporterID : {40, 42})
        EXPECT_NE(recorded(player, reporterID), std::nullopt);
    EXPECT_NE(recorded(recorder, 43), std::nullopt);
}

TEST_F(MessagesTest, WithoutAListReachAStartedSessionZeroToo)
{
    makeSession(player, 0, false);
    support::onServerQueue(harness.platform.workQueues, [&] { player.session(0)->start(); });
    send(player, null);
    EXPECT_NE(recorded(player, 0), std::nullopt);
}

// --- to unknown sessions

TEST_F(MessagesTest, WithoutAListAndAnyStartedSessionAreDeliveredOnceThroughAStandaloneOne)
{
    makeSession(player, 42, false);
    EXPECT_EQ(send(player, null), answeredOnce(delivered));
    EXPECT_THAT(platform.log.lines(),
                ElementsAre(IsLine(Debug, "kerc", "sending message for reporter (null)"),
                            IsLine(Default, "kers", "sessions for client 1001 : " + described(player, 42)),
                            IsLine(Default, "kers", "sessions for client 1002 : []"),
                            IsLine(Default, "kerc", "active reporting sessions 0 : []"),
                            IsLine(Info, "kerr", "created reporting session for ID: 1"),
                            IsLine(Info, "kerr", "setting service type standalone"),
                            IsLine(Debug, "kerr", "sending message for session owned by 1")));
    EXPECT_THAT(platform.traceEmitter.take(), ElementsAre(clientSendMessage, sessionCreated, sessionMessageAccepted));
    EXPECT_THAT(platform.analytics.events(),
                ElementsAre(AnalyticsEvent{"com.quarn.kesto.Playback.Start",
                                           {{"a", 1}, {"HostApplicationDisplayID", "Unknown"}}},
                            AnalyticsEvent{"com.quarn.standalone.Playback.Start",
                                           {{"a", 1}, {"HostApplicationDisplayID", "Unknown"}}}));
}

TEST_F(MessagesTest, LetGoOfTheStandaloneSession)
{
    send(player, null);
    EXPECT_EQ(player.session(1), nullptr);
    EXPECT_EQ(player.call(GetAllReporters), answeredOnce({null, Array{}}));
    platform.analytics.clear(); // it kept the earlier payload
    EXPECT_EQ(platform.log.lines().back().message, "deallocing this session 1");
    EXPECT_EQ(platform.traceEmitter.take().back(), sessionDestroyed);
}

// --- to many sessions

// With each message that a session accepts, a slice of the server queue's time passes.
class ManyReceiversTest : public MessagesTest {
protected:
    static constexpr std::int64_t sessions = 20;

    ManyReceiversTest()
    {
        for (std::int64_t reporterID = 1; reporterID <= sessions; ++reporterID)
            makeSession(player, reporterID);
        platform.traceEmitter.setObserver([this](std::uint32_t code) {
            if (code == sessionMessageAccepted)
                platform.clock.advance(0.001);
        });
    }
    ~ManyReceiversTest() override { platform.traceEmitter.setObserver(nullptr); }

    [[nodiscard]] static Value allIDs()
    {
        std::vector<Value> reporterIDs;
        for (std::int64_t reporterID = 1; reporterID <= sessions; ++reporterID)
            reporterIDs.emplace_back(reporterID);
        return Array(std::move(reporterIDs));
    }
    [[nodiscard]] std::int64_t receivers() const
    {
        std::int64_t count = 0;
        for (std::int64_t reporterID = 1; reporterID <= sessions; ++reporterID)
            count += player.session(reporterID) && recorded(player, reporterID) ? 1 : 0;
        return count;
    }
    // Runs until so many sessions have the message.
    void runUntilReceived(std::int64_t count)
    {
        while (receivers() < count)
            ASSERT_TRUE(platform.workQueues.runOne());
    }
};

TEST_F(ManyReceiversTest, LetTheCallsOfOthersGoInBetween)
{
    for (const Value& reporterIDs : {Value(), allIDs()}) {
        const Dictionary message{{reporterIDs.isNull() ? "a" : "b", 1}};
        const auto sent = player.submit(SendMessage, {message, 4, 1, reporterIDs});
        const auto behind = player.submit(GetServiceNameForReporterID, {1});
        const auto other = recorder.submit(GetServiceNameForReporterID, {1});
        while (recorder.answersTo(other) == unanswered)
            ASSERT_TRUE(platform.workQueues.runOne());
        EXPECT_EQ(player.answersTo(sent), unanswered);
        EXPECT_EQ(player.answersTo(behind), unanswered);
        platform.workQueues.runAll();
        EXPECT_EQ(player.answersTo(sent), answeredOnce(delivered));
        EXPECT_EQ(player.answersTo(behind), answeredOnce({null, 0}));
        EXPECT_EQ(receivers(), sessions);
    }
    EXPECT_EQ(platform.ledger.account()[ledger::Counter::Recorded], 2U * sessions);
}

// So the service remembers the sessions that a message has yet to reach once for each user, not for each connection.
TEST_F(ManyReceiversTest, GetTheMessagesOfAUserOneAfterTheOther)
{
    TestClient stranger = harness.connect("stranger", 77);
    const auto first = player.submit(SendMessage, {Dictionary{{"a", 1}}, 4, 1, null});
    const auto second = recorder.submit(SendMessage, {Dictionary{{"b", 1}}, 4, 1, null});
    const auto third = recorder.submit(GetAllReporters, {});
    const auto ofAnother = stranger.submit(SendMessage, {Dictionary{{"c", 1}}, 4, 1, allIDs()});
    const auto recordedSoFar = [&] { return platform.ledger.account()[ledger::Counter::Recorded]; };
    while (player.answersTo(first) == unanswered)
        ASSERT_TRUE(platform.workQueues.runOne());
    EXPECT_GT(recordedSoFar(), 25U) << "that of another user goes in between";
    EXPECT_LE(recordedSoFar(), 40U) << "the second has not begun";
    platform.workQueues.runAll();
    EXPECT_EQ(recorder.answersTo(second), answeredOnce(delivered));
    EXPECT_EQ(stranger.answersTo(ofAnother), answeredOnce(delivered));
    EXPECT_NE(recorder.answersTo(third), unanswered);
    EXPECT_EQ(recordedSoFar(), 3U * sessions);
}

TEST_F(ManyReceiversTest, AreReachedTogetherWhileItIsQuick)
{
    platform.traceEmitter.setObserver(nullptr);
    const auto sent = player.submit(SendMessage, {Dictionary{{"a", 1}}, 4, 1, null});
    ASSERT_TRUE(platform.workQueues.runOne());
    EXPECT_EQ(player.answersTo(sent), answeredOnce(delivered));
}

TEST_F(ManyReceiversTest, DoNotGetAMessageWhenTheyHaveEndedMeanwhile)
{
    makeSession(recorder, 101);
    makeSession(recorder, 102);
    makeSession(recorder, 103);
    const auto before = platform.ledger.account();
    platform.analytics.clear();
    player.submit(SendMessage, {Dictionary{{"a", 1}}, 4, 1, null});
    recorder.submit(StopReportingSessionForID, {101});
    recorder.submit(DestroyReportingSession, {102});
    recorder.submit(CreateReportingSession, {103}); // in place of the one before
    platform.workQueues.runAll();
    const auto after = platform.ledger.account();
    EXPECT_EQ(receivers(), sessions);
    EXPECT_THAT(platform.analytics.payloads("com.quarn.kesto.Playback.Start"), SizeIs(sessions));
    EXPECT_EQ(after[ledger::Counter::Deliveries] - before[ledger::Counter::Deliveries], sessions + 3U);
    EXPECT_EQ(after[ledger::Counter::Inert] - before[ledger::Counter::Inert], 3U);
}

TEST_F(ManyReceiversTest, DoNotGetAMessageInARunThatBeganMeanwhile)
{
    makeSession(recorder, 101);
    const auto before = platform.ledger.account();
    player.submit(SendMessage, {Dictionary{{"a", 1}}, 4, 1, null});
    recorder.submit(StopReportingSessionForID, {101});
    recorder.submit(StartReportingSessionForID, {101});
    platform.workQueues.runAll();
    EXPECT_EQ(receivers(), sessions);
    EXPECT_EQ(recorded(recorder, 101), std::nullopt);
    const auto after = platform.ledger.account();
    EXPECT_EQ(after[ledger::Counter::Inert] - before[ledger::Counter::Inert], 1U);
}

TEST_F(ManyReceiversTest, AreNotThoseThatStartMeanwhile)
{
    makeSession(recorder, 101, false);
    player.submit(SendMessage, {Dictionary{{"a", 1}}, 4, 1, null});
    ASSERT_TRUE(platform.workQueues.runOne());
    recorder.submit(StartReportingSessionForID, {101});
    platform.workQueues.runAll();
    EXPECT_EQ(receivers(), sessions);
    EXPECT_EQ(recorded(recorder, 101), std::nullopt);
}

TEST_F(ManyReceiversTest, AreNotReachedAnyMoreWhenTheServiceObjectHasGone)
{
    const auto sent = player.submit(SendMessage, {Dictionary{{"a", 1}}, 4, 1, null});
    runUntilReceived(3);
    const auto keptAlive = player.object();
    std::vector<std::shared_ptr<KestoReportingSession>> kept;
    for (std::int64_t reporterID = 1; reporterID <= sessions; ++reporterID)
        kept.push_back(player.session(reporterID));
    harness.service.reset();
    platform.workQueues.runAll();
    EXPECT_EQ(player.answersTo(sent), answeredOnce(delivered));
    EXPECT_EQ(receivers(), 3);
}

TEST_F(ManyReceiversTest, AreAllReachedBeforeTheirLostClientGoes)
{
    player.submit(SendMessage, {Dictionary{{"a", 1}}, 4, 1, null});
    player.close();
    EXPECT_EQ(player.object(), nullptr);
    EXPECT_EQ(platform.ledger.account()[ledger::Counter::Recorded], 2U * sessions) << "the message and the summaries";
}

// --- order

// One journal of the session, the analytics bridge and the bug-capture manager.
class DeliveryOrderTest : public MessagesTest {
protected:
    DeliveryOrderTest() : MessagesTest([](TestPlatform& prepared) { prepared.deviceProperties.setInternalBuild(true); })
    {
        platform.analytics.setObserver([this](const std::string& name) { journal.push_back("asked " + name); });
        platform.log.setObserver([this](const LogLine& line) {
            if (line.message.starts_with("sending message for session") || line.tag == "kerb")
                journal.push_back(line.message);
        });
    }

    void sendHapticTime(const Value& reporterIDs, int seconds)
    {
        journal.clear();
        recorder.call(SendMessage, Dictionary{{"Haptic_Active_Hardware_Time_Seconds", seconds}}, 4, 8, reporterIDs);
    }

    std::vector<std::string> journal;
};

TEST_F(DeliveryOrderTest, PutsTheSessionLastForAList)
{
    makeSession(player, 42);
    sendHapticTime(Array{42}, 1);
    EXPECT_THAT(journal,
                ElementsAre("asked com.quarn.kesto.Playback.Gimbo", "asked com.quarn.generic.Playback.Gimbo",
                            "Incrementing Vorp counter. recorder", "sending message for session owned by 42"));
}

TEST_F(DeliveryOrderTest, PutsTheSessionFirstWithoutAList)
{
    makeSession(player, 42);
    sendHapticTime(null, 1);
    EXPECT_THAT(journal,
                ElementsAre("sending message for session owned by 42", "asked com.quarn.kesto.Playback.Gimbo",
                            "asked com.quarn.generic.Playback.Gimbo", "Incrementing Vorp counter. recorder"));
}

TEST_F(DeliveryOrderTest, PutsTheStandaloneSessionLast)
{
    sendHapticTime(null, 1);
    EXPECT_THAT(journal,
                ElementsAre("asked com.quarn.kesto.Playback.Gimbo", "asked com.quarn.standalone.Playback.Gimbo",
                            "Incrementing Vorp counter. recorder", "sending message for session owned by 1"));
}

// --- the client's requests to the service

class MockService : public KestoReportingServiceDelegateProtocol {
public:
    MOCK_METHOD(Dictionary, getDefaults, (), (const, override));
    MOCK_METHOD(std::optional<Dictionary>, getFeaturesState, (), (override));
    MOCK_METHOD(const Clients&, getAllClients, (), (const, override));
    MOCK_METHOD(bool, isReportingEnabled, (), (const, override));
    MOCK_METHOD(client::ActiveSessions, getAllActiveReportingSessions, (), (override));
    MOCK_METHOD(std::shared_ptr<KestoReportingSession>, findReportingSessionForID, (std::int64_t), (override));
    MOCK_METHOD(bool, needsDriverMoments, (), (const, override));
    MOCK_METHOD(void, readDriverMoment, (std::move_only_function<void(session::DriverMoment)>), (override));
    MOCK_METHOD(session::DriverSnapShot, getSnapShot, (const session::DriverMoment&), (override));
    MOCK_METHOD(void, sendDriverLogsForSession,
                (platform::Turn&, const std::shared_ptr<KestoReportingSession>&, const session::DriverMoment&),
                (override));
    MOCK_METHOD(std::shared_ptr<client::LongCalls>, longCalls, (), (override));
    MOCK_METHOD(std::shared_ptr<client::SessionEnds>, sessionEnds, (), (override));
    MOCK_METHOD(void, removeClient, (const std::shared_ptr<KestoReportingClientServerInstance>&), (override));
    MOCK_METHOD(void, handleEventForVorp,
                (const Dictionary&, AudioEventCategory, std::uint16_t, const std::shared_ptr<KestoReportingSession>&,
                 const std::string&),
                (override));
    MOCK_METHOD(std::int64_t, activeSessionCount, (), (const, override));
    MOCK_METHOD(void, setActiveSessionCount, (std::int64_t), (override));
    MOCK_METHOD(void, reporterIDAdded,
                (std::int64_t, const KestoReportingClientServerInstance&,
                 const std::shared_ptr<KestoReportingSession>&),
                (override));
    MOCK_METHOD(void, reporterIDRemoved, (std::int64_t, const KestoReportingClientServerInstance&), (override));
};

class ClientAndServiceTest : public testing::Test {
protected:
    ClientAndServiceTest()
    {
        utility::createServerQueue();
        client = std::make_shared<KestoReportingClientServerInstance>(17, service);
        ON_CALL(*service, isReportingEnabled).WillByDefault(Return(true));
        ON_CALL(*service, getAllActiveReportingSessions).WillByDefault([] { return allOf({}); });
    }

    static client::ActiveSessions allOf(client::ActiveSessions::Clients clients)
    {
        return {std::move(clients), [](const auto&, auto&) { }};
    }
    void createSession(std::int64_t reporterID)
    {
        client->createReportingSession(reporterID, [](auto&, const auto&, bool) { });
        platform.workQueues.runAll();
    }
    // The error of each answer.
    std::vector<std::optional<utility::ReplyError>> send(std::optional<std::vector<std::int64_t>> reporterIDs)
    {
        std::vector<std::optional<utility::ReplyError>> answers;
        client->sendMessage({{"a", 1}}, 0x10000004, 2, std::move(reporterIDs),
                            [&](auto&, const auto& error) { answers.push_back(error); });
        platform.workQueues.runAll();
        return answers;
    }
    [[nodiscard]] std::shared_ptr<KestoReportingSession> session(std::int64_t reporterID) const
    {
        return client->clientReportingSessionMap().find(reporterID);
    }

    TestPlatform platform;
    std::shared_ptr<testing::NiceMock<MockService>> service = std::make_shared<testing::NiceMock<MockService>>();
    std::shared_ptr<KestoReportingClientServerInstance> client;
};

TEST_F(ClientAndServiceTest, AnswersAMessageWithAnErrorAndDeliversNothingWhenReportingIsDisabled)
{
    platform.analytics.use("*");
    createSession(42);
    platform.log.clear();
    platform.traceEmitter.take();
    EXPECT_CALL(*service, isReportingEnabled).WillRepeatedly(Return(false));
    EXPECT_CALL(*service, handleEventForVorp).Times(0);
    EXPECT_CALL(*service, getAllActiveReportingSessions).Times(0);

    const utility::ReplyError disabled{"com.quarn.audio.reporting", 1};
    EXPECT_THAT(send(std::vector<std::int64_t>{42}), ElementsAre(disabled));
    EXPECT_THAT(send(std::nullopt), ElementsAre(disabled));
    EXPECT_THAT(platform.analytics.asked(), IsEmpty());
    EXPECT_THAT(platform.log.lines(),
                ElementsAre(IsLine(Debug, "kerc", "sending message for reporter [42]"),
                            IsLine(Debug, "kerc", "sending message for reporter (null)")));
    EXPECT_THAT(platform.traceEmitter.take(), ElementsAre(clientSendMessage, clientSendMessage));
}

TEST_F(ClientAndServiceTest, HandsTheMessageItsSessionAndTheSendersNameToTheBugCaptureManager)
{
    createSession(42);
    platform.processTable.add(17, "client");
    platform.processTable.add(18, "caller");
    EXPECT_CALL(*service, handleEventForVorp(Dictionary{{"a", 1}}, 0x10000004, 2, session(42), "caller"));
    EXPECT_CALL(*service, handleEventForVorp(_, _, _, session(42), "client"));
    EXPECT_CALL(*service, handleEventForVorp(_, _, _, session(42), "(null)"));
    {
        // The sender is the process that makes the call, not the one that the client was made for.
        const FakeConnection callers(18);
        const platform::Connection::CallScope call(callers);
        send(std::vector<std::int64_t>{42});
    }
    send(std::vector<std::int64_t>{42});
    platform.processTable.remove(17);
    send(std::vector<std::int64_t>{42});
}

TEST_F(ClientAndServiceTest, TellsWhichProcessSentTheMessageWhileTheBugCaptureManagerHasIt)
{
    createSession(42);
    support::onServerQueue(platform.workQueues, [&] { session(42)->start(); });
    const FakeConnection callers(18);
    const auto sendFromBoth = [&](const auto& reporterIDs) {
        {
            const platform::Connection::CallScope call(callers);
            send(reporterIDs);
        }
        send(reporterIDs);
    };
    ON_CALL(*service, getAllActiveReportingSessions).WillByDefault([&] { return allOf({client}); });
    std::vector<std::int32_t> senders;
    ON_CALL(*service, handleEventForVorp).WillByDefault([&](auto&, auto, auto, auto&, auto&) {
        senders.push_back(platform::BugCapture::currentSender());
    });
    sendFromBoth(std::optional(std::vector<std::int64_t>{42}));
    sendFromBoth(std::optional<std::vector<std::int64_t>>());
    EXPECT_THAT(senders, ElementsAre(18, 17, 18, 17));
    EXPECT_EQ(platform::BugCapture::currentSender(), 0);
}

TEST_F(ClientAndServiceTest, TakesTheSendersNameWhenTheCallIsMade)
{
    createSession(42);
    platform.processTable.add(17, "player");
    EXPECT_CALL(*service, handleEventForVorp(_, _, _, _, "player"));
    client->sendMessage({}, 4, 1, std::vector<std::int64_t>{42}, [](auto&, const auto&) { });
    platform.processTable.remove(17);
    platform.workQueues.runAll();
}

TEST_F(ClientAndServiceTest, MakesTheStandaloneSessionOfTheServiceItselfAndItsDefaults)
{
    EXPECT_CALL(*service, getDefaults)
        .WillOnce(Return(Dictionary{{"device_name", "Speaker"}, {"disable_reporting", 0}}));
    std::weak_ptr<KestoReportingSession> standalone;
    EXPECT_CALL(*service, handleEventForVorp).WillOnce([&](auto&, auto, auto, const auto& session, auto&) {
        standalone = session;
        EXPECT_EQ(session->reporterID(), 1);
        EXPECT_THAT(session->processIdentifiers(), ElementsAre(FakeProcessTable::ownPID));
        EXPECT_EQ(session->serviceType(), 5);
        EXPECT_EQ(session->configuration(),
                  (Dictionary{
                      {"HostApplicationDisplayID", "Unknown"}, {"device_name", "Speaker"}, {"disable_reporting", 0}}));
        EXPECT_FALSE(session->started());
    });
    EXPECT_THAT(send(std::nullopt), ElementsAre(std::nullopt));
    EXPECT_TRUE(standalone.expired());
    EXPECT_EQ(client->clientReportingSessionMap().size(), 0U);
}

TEST_F(ClientAndServiceTest, LetsTheDefaultsSpeakLastInTheStandaloneSessionsConfiguration)
{
    EXPECT_CALL(*service, getDefaults).WillOnce(Return(Dictionary{{"HostApplicationDisplayID", "default"}}));
    EXPECT_CALL(*service, handleEventForVorp).WillOnce([](auto&, auto, auto, const auto& session, auto&) {
        EXPECT_EQ(session->configuration(), (Dictionary{{"HostApplicationDisplayID", "default"}}));
    });
    send(std::nullopt);
}

TEST_F(ClientAndServiceTest, StartsInOrder)
{
    createSession(42);
    const session::DriverSnapShot snapShot{{"Rx-(null)", {}}};
    int answers = 0;
    testing::MockFunction<void()> earlierCallback;
    session(42)->setTransactionCompleteBlock([&](auto&, const auto&, bool) { earlierCallback.Call(); });

    const testing::InSequence inOrder;
    EXPECT_CALL(*service, getSnapShot).WillOnce([&] {
        EXPECT_TRUE(session(42)->started());
        return snapShot;
    });
    EXPECT_CALL(earlierCallback, Call).WillOnce([&] {
        EXPECT_EQ(session(42)->driverSnapShot()->begin()->first, "Rx-(null)");
    });
    EXPECT_CALL(*service, getFeaturesState).WillOnce([&] {
        session(42)->transactionCompleteBlock()(platform.turn, std::nullopt, true); // the new one is stored by now
        EXPECT_EQ(answers, 1);
        return Dictionary{{"ringerstate", true}};
    });
    EXPECT_CALL(*service, getAllActiveReportingSessions).WillOnce([&] {
        EXPECT_THAT(*session(42)->nestedAggregatedPayloadData(), SizeIs(1)) << "the session got the features";
        return allOf({});
    });
    client->startReportingSessionForID(42, [&](auto&, const auto&, bool) { ++answers; });
    platform.workQueues.runAll();
}

TEST_F(ClientAndServiceTest, StopsInOrder)
{
    createSession(42);
    ON_CALL(*service, getSnapShot).WillByDefault(Return(session::DriverSnapShot{{"Rx-(null)", {}}}));
    testing::MockFunction<void()> startAnswer;
    testing::MockFunction<void()> stopAnswer;
    client->startReportingSessionForID(42, [&](auto&, const auto&, bool) { startAnswer.Call(); });
    platform.workQueues.runAll();

    const testing::InSequence inOrder;
    EXPECT_CALL(*service, sendDriverLogsForSession(_, session(42), _)).WillOnce([](auto&, const auto& stopping, auto&) {
        EXPECT_TRUE(stopping->started());
        EXPECT_NE(stopping->driverSnapShot(), std::nullopt);
    });
    EXPECT_CALL(startAnswer, Call).WillOnce([&] {
        EXPECT_FALSE(session(42)->started());
        EXPECT_EQ(session(42)->driverSnapShot(), std::nullopt);
    });
    EXPECT_CALL(*service, getAllActiveReportingSessions).WillOnce([&] {
        EXPECT_FALSE(session(42)->transactionCompleteBlock());
        return allOf({});
    });
    EXPECT_CALL(stopAnswer, Call);
    client->stopReportingSessionForID(42, [&](auto&, const auto&, bool) { stopAnswer.Call(); });
    platform.workQueues.runAll();
}

// Another thread reads the drivers' channels; the test is that thread.
class DriverChannelsTest : public ClientAndServiceTest {
protected:
    using Moment = platform::ReportingChannels::Moment;

    DriverChannelsTest()
    {
        createSession(42);
        createSession(43);
        ON_CALL(*service, needsDriverMoments).WillByDefault(Return(true));
        ON_CALL(*service, readDriverMoment).WillByDefault([this](auto take) { asked.push_back(std::move(take)); });
    }
    void start(std::int64_t reporterID)
    {
        client->startReportingSessionForID(reporterID, [](auto&, const auto&, bool) { });
        platform.workQueues.runAll();
    }
    // The channels that were asked for first have been read.
    void answer()
    {
        auto take = std::move(asked.front());
        asked.erase(asked.begin());
        take(moment);
        platform.workQueues.runAll();
    }

    const session::DriverMoment moment = std::make_shared<Moment>();
    std::vector<std::move_only_function<void(session::DriverMoment)>> asked;
};

TEST_F(DriverChannelsTest, AreReadBeforeASessionStarts)
{
    start(42);
    ASSERT_THAT(asked, SizeIs(1));
    EXPECT_FALSE(session(42)->started());
    EXPECT_CALL(*service, getSnapShot(moment)).WillOnce(Return(session::DriverSnapShot{{"Rx-(null)", {}}}));
    answer();
    EXPECT_TRUE(session(42)->started());
    EXPECT_EQ(session(42)->driverSnapShot()->begin()->first, "Rx-(null)");
}

TEST_F(DriverChannelsTest, AreReadBeforeASessionStops)
{
    start(42);
    answer();
    int answers = 0;
    client->stopReportingSessionForID(42, [&](auto&, const auto&, bool) { ++answers; });
    platform.workQueues.runAll();
    EXPECT_TRUE(session(42)->started());
    EXPECT_EQ(answers, 0);
    EXPECT_CALL(*service, sendDriverLogsForSession(_, session(42), moment));
    answer();
    EXPECT_FALSE(session(42)->started());
    EXPECT_EQ(answers, 1);
}

TEST_F(DriverChannelsTest, HoldUpTheClientsNextCallsInTheirOrder)
{
    std::vector<std::string> done;
    start(42);
    client->setServiceType(3, 42, [&](auto&, const auto&, bool) {
        done.emplace_back(session(42)->started() ? "set when started" : "set before");
    });
    client->stopReportingSessionForID(42, [&](auto&, const auto&, bool) { done.emplace_back("stopped"); });
    client->setServiceType(4, 42, [&](auto&, const auto&, bool) {
        done.emplace_back(session(42)->started() ? "set before" : "set when stopped");
    });
    platform.workQueues.runAll();
    EXPECT_THAT(done, IsEmpty());
    answer();
    EXPECT_THAT(done, ElementsAre("set when started"));
    answer();
    EXPECT_THAT(done, ElementsAre("set when started", "stopped", "set when stopped"));
}

TEST_F(DriverChannelsTest, AreNotReadForACallThatChangesNothing)
{
    start(0);
    start(44);
    start(42);
    answer();
    start(42);
    for (const std::int64_t reporterID : {0, 43, 44})
        client->stopReportingSessionForID(reporterID, [](auto&, const auto&, bool) { });
    platform.workQueues.runAll();
    EXPECT_THAT(asked, IsEmpty());
}

TEST_F(DriverChannelsTest, DoNotKeepALostClientFromGoing)
{
    const KestoReportingServiceDelegateProtocol::Clients clients{client};
    ON_CALL(*service, getAllClients).WillByDefault(testing::ReturnRef(clients));
    start(42);
    client->handleConnectionError();
    platform.workQueues.runAll();
    EXPECT_CALL(*service, removeClient(client));
    answer();
    EXPECT_EQ(client->clientReportingSessionMap().size(), 0U);
}

TEST_F(ClientAndServiceTest, SendsNoDriverLogsForASessionThatIsDestroyedOrLost)
{
    createSession(42);
    createSession(43);
    for (const std::int64_t reporterID : {42, 43})
        client->startReportingSessionForID(reporterID, [](auto&, const auto&, bool) { });
    platform.workQueues.runAll();
    EXPECT_CALL(*service, sendDriverLogsForSession).Times(0);
    const KestoReportingServiceDelegateProtocol::Clients clients{client};
    ON_CALL(*service, getAllClients).WillByDefault(testing::ReturnRef(clients));
    client->destroyReportingSession(42, [](auto&, const auto&, bool) { });
    client->handleConnectionError();
    platform.workQueues.runAll();
    EXPECT_EQ(client->clientReportingSessionMap().size(), 0U);
}

TEST_F(ClientAndServiceTest, ShowsTheServicesCountOfActiveSessionsWhateverItIs)
{
    createSession(42);
    ON_CALL(*service, activeSessionCount).WillByDefault(Return(-7));
    client->startReportingSessionForID(42, [](auto&, const auto&, bool) { });
    platform.workQueues.runAll();
    EXPECT_THAT(platform.log.lines("kerc").back(), IsLine(Default, "kerc", "-7 active reporting session(s) []"));
}

TEST_F(ClientAndServiceTest, TellsTheServiceWhichIDsItsMapGainsAndLoses)
{
    const testing::InSequence inOrder;
    EXPECT_CALL(*service, reporterIDAdded(42, testing::Ref(*client), testing::_));
    EXPECT_CALL(*service, reporterIDAdded(0, testing::Ref(*client), testing::_));
    EXPECT_CALL(*service, reporterIDRemoved(42, testing::Ref(*client)));
    EXPECT_CALL(*service, reporterIDRemoved(0, testing::Ref(*client)));
    EXPECT_CALL(*service, removeClient(client));
    const KestoReportingServiceDelegateProtocol::Clients clients{client};
    ON_CALL(*service, getAllClients).WillByDefault(testing::ReturnRef(clients));
    createSession(42);
    createSession(0);
    client->destroyReportingSession(42, [](auto&, const auto&, bool) { });
    client->handleConnectionError();
    platform.workQueues.runAll();
}

TEST_F(ClientAndServiceTest, PaysForItsMessagesFromTheServicesBudget)
{
    const auto& budget = session::StorageBudget::service();
    const std::size_t before = budget->taken();
    createSession(42);
    support::onServerQueue(platform.workQueues, [&] { session(42)->start(); });
    EXPECT_THAT(send(std::vector<std::int64_t>{42}), SizeIs(1));
    EXPECT_GT(budget->taken(), before);
    client.reset();
    EXPECT_EQ(budget->taken(), before);
}

} // namespace
