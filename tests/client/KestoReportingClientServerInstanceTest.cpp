// SPDX-License-Identifier: Apache-2.0
// A client's operations on sessions, called through the protocol: their answers, their log lines in order, and which
// client's sessions each of them reaches.
#include "client/KestoReportingClientServerInstance.h"
#include "platform/linux/connection/FrameReader.h"
#include "support/EmittedCodes.h"
#include "support/ServiceHarness.h"

#include <cstdlib>
#include <gmock/gmock.h>
#include <iostream>

namespace {

using namespace support;
using enum platform::LogLevel;
using foundation::Array;
using foundation::Dictionary;
using foundation::Value;
using support::clientCreate;
using support::clientDestroy;
using support::clientSendMessage;
using support::clientStart;
using support::clientStop;
using support::sessionCreated;
using support::sessionDestroyed;
using support::sessionMessageAccepted;
using support::sessionStarted;
using support::sessionStopping;
using testing::ElementsAre;
using testing::IsEmpty;

constexpr Answers::size_type once = 1;

// The description of a session of the first client, without service type and configuration.
std::string described(std::int64_t reporterID, bool started)
{
    return "\"reporterID=" + std::to_string(reporterID)
        + ",serviceName=(null),ownerPid=1001,HostApplicationDisplayID=Unknown,started=" + (started ? "1\"" : "0\"");
}

class ClientServerInstanceTest : public testing::Test {
protected:
    ServiceHarness harness;
    TestClient player = harness.connect("player");
    TestClient recorder = harness.connect("recorder");
    TestPlatform& platform = harness.platform;

    // The log lines, except those about a stopping session's volume.
    [[nodiscard]] std::vector<LogLine> lines() const
    {
        auto lines = harness.platform.log.lines();
        std::erase_if(lines, [](const LogLine& line) { return line.tag == "keri"; });
        return lines;
    }

    Answers create(std::int64_t reporterID) { return player.call(CreateReportingSession, reporterID); }
    Answers start(std::int64_t reporterID) { return player.call(StartReportingSessionForID, reporterID); }
    Answers stop(std::int64_t reporterID) { return player.call(StopReportingSessionForID, reporterID); }
};

// --- making

TEST_F(ClientServerInstanceTest, IsMadeWithItsProcessAndNoSessions)
{
    const auto client = std::make_shared<KestoReportingClientServerInstance>(17, harness.service);
    EXPECT_EQ(client->processIdentifier(), 17);
    EXPECT_EQ(client->clientReportingSessionMap().size(), 0U);
    EXPECT_EQ(client->clientStartDate(), std::nullopt);
    EXPECT_EQ(client->clientProcessName(), std::nullopt);
    EXPECT_THAT(lines(), ElementsAre(IsLine(Default, "kerc", "new client with pid 17")));
}

TEST_F(ClientServerInstanceTest, SaysThatItGoes)
{
    std::make_shared<KestoReportingClientServerInstance>(17, harness.service);
    EXPECT_THAT(lines(),
                ElementsAre(IsLine(Default, "kerc", "new client with pid 17"),
                            IsLine(Default, "kerc", "dealloc 17 from the server client list")));
    EXPECT_EQ(platform.memory.clientsGone(), 1);
}

TEST_F(ClientServerInstanceTest, DoesNothingOnTheCallersThreadButSubmit)
{
    for (const auto& [method, arguments] :
         std::vector<std::pair<Method, Array>>{{CreateReportingSession, {42}},
                                               {SetServiceType, {4, 42}},
                                               {GetServiceNameForReporterID, {42}},
                                               {SetConfiguration, {Dictionary{}, 42}},
                                               {StartReportingSessionForID, {42}},
                                               {SendMessage, {Dictionary{}, 4, 1, Array{42}}},
                                               {StopReportingSessionForID, {42}},
                                               {DestroyReportingSession, {42}},
                                               {ValidReporterID, {42}},
                                               {GetAllReporters, {}}}) {
        const auto call = player.submit(method, arguments);
        EXPECT_EQ(platform.workQueues.pending(), 1U);
        EXPECT_THAT(lines(), IsEmpty());
        EXPECT_THAT(platform.traceEmitter.take(), IsEmpty());
        EXPECT_THAT(player.answersTo(call), IsEmpty());
        platform.workQueues.runAll();
        platform.log.clear();
        platform.traceEmitter.take();
    }
}

TEST_F(ClientServerInstanceTest, ServesCallsInTheOrderInWhichTheyCame)
{
    player.submit(CreateReportingSession, {42});
    player.submit(SetServiceType, {4, 42});
    const auto asked = player.submit(GetServiceNameForReporterID, {42});
    platform.workQueues.runAll();
    EXPECT_EQ(player.answersTo(asked), answeredOnce({null, 4}));
}

TEST_F(ClientServerInstanceTest, SaysWhatIsCalledBeforeItMarksIt)
{
    struct Row {
        Method method;
        Array arguments;
        std::vector<std::string> firstSteps;
    };
    const auto mark = [](std::uint32_t code) { return std::to_string(code); };
    const std::vector<Row> rows{
        {CreateReportingSession,
         {42},
         {"creating session for reporter 42", mark(clientCreate), "created reporting session for ID: 42",
          mark(sessionCreated), "session created for reporter 42"}},
        {StartReportingSessionForID,
         {42},
         {"starting session for reporter 42", mark(clientStart), "starting session owned by 42", mark(sessionStarted)}},
        {SendMessage,
         {Dictionary{{"a", 1}}, 4, 1, Array{42}},
         {"sending message for reporter [42]", mark(clientSendMessage)}},
        {StopReportingSessionForID, {42}, {"stopping session for reporter 42", mark(clientStop)}},
        {DestroyReportingSession,
         {42},
         {"destroying session for reporter 42", mark(clientDestroy), mark(sessionDestroyed),
          "deallocing this session 42", "destroying 42"}}};
    std::vector<std::string> steps;
    platform.log.setObserver([&](const LogLine& line) { steps.push_back(line.message); });
    platform.traceEmitter.setObserver([&](std::uint32_t code) { steps.push_back(std::to_string(code)); });
    for (const auto& [method, arguments, firstSteps] : rows) {
        steps.clear();
        player.submit(method, arguments);
        platform.workQueues.runAll();
        ASSERT_GE(steps.size(), firstSteps.size());
        steps.resize(firstSteps.size());
        EXPECT_EQ(steps, firstSteps);
    }
    platform.log.setObserver(nullptr);
    platform.traceEmitter.setObserver(nullptr);
}

// --- create

TEST_F(ClientServerInstanceTest, CreatesASessionOwnedByItsProcess)
{
    EXPECT_EQ(create(42), answeredOnce(succeeded));
    ASSERT_NE(player.session(42), nullptr);
    EXPECT_EQ(player.session(42)->reporterID(), 42);
    EXPECT_THAT(player.session(42)->processIdentifiers(), ElementsAre(1001));
    EXPECT_FALSE(player.session(42)->started());
    EXPECT_THAT(lines(),
                ElementsAre(IsLine(Debug, "kerc", "creating session for reporter 42"),
                            IsLine(Info, "kerr", "created reporting session for ID: 42"),
                            IsLine(Default, "kerc", "session created for reporter 42")));
    EXPECT_THAT(platform.traceEmitter.take(), ElementsAre(clientCreate, sessionCreated));
}

TEST_F(ClientServerInstanceTest, ReplacesASessionOfTheSameIDWithoutStoppingOrReportingIt)
{
    platform.analytics.use("*");
    create(42);
    start(42);
    const std::weak_ptr<KestoReportingSession> first = player.session(42);
    harness.forget();
    platform.analytics.clear();

    EXPECT_EQ(create(42), answeredOnce(succeeded));
    EXPECT_TRUE(first.expired());
    EXPECT_FALSE(player.session(42)->started());
    EXPECT_THAT(lines(),
                ElementsAre(IsLine(Debug, "kerc", "creating session for reporter 42"),
                            IsLine(Info, "kerr", "created reporting session for ID: 42"),
                            IsLine(Info, "kerr", "deallocing this session 42"),
                            IsLine(Default, "kerc", "session created for reporter 42")));
    EXPECT_THAT(platform.traceEmitter.take(), ElementsAre(clientCreate, sessionCreated, sessionDestroyed));
    EXPECT_THAT(platform.analytics.sent(), IsEmpty());
}

TEST_F(ClientServerInstanceTest, NeverAnswersTheStartOfASessionThatWasReplaced)
{
    create(42);
    const auto started = player.submit(StartReportingSessionForID, {42});
    create(42);
    stop(42);
    EXPECT_EQ(player.answersTo(started), unanswered);
    EXPECT_EQ(player.connection().unansweredCalls(), 0U) << "no work waits for it";
}

TEST_F(ClientServerInstanceTest, CreatesNoMoreSessionsThanItMayHave)
{
    constexpr auto most = static_cast<std::int64_t>(KestoReportingClientServerInstance::mostSessions);
    for (std::int64_t reporterID = 1; reporterID <= most; ++reporterID)
        player.submit(CreateReportingSession, {reporterID});
    platform.workQueues.runAll();

    harness.forget();
    EXPECT_EQ(create(most + 1), answeredOnce(succeeded)) << "the client is answered as always";
    EXPECT_EQ(player.session(most + 1), nullptr);
    const auto refused = IsLine(Error, "kerc",
                                "client 1001 is refused a session: it may have 10000, and all clients 110000; further "
                                "ones are counted until it goes");
    EXPECT_THAT(lines(), ElementsAre(IsLine(Debug, "kerc", "creating session for reporter 10001"), refused));
    EXPECT_EQ(create(most + 2), answeredOnce(succeeded));
    EXPECT_THAT(platform.log.lines("kerc"), testing::Contains(refused).Times(1))
        << "the first refusal is logged, all are counted";
    const auto replaced = player.session(1);
    EXPECT_EQ(create(1), answeredOnce(succeeded));
    EXPECT_NE(player.session(1), replaced) << "an existing session may be replaced";
    EXPECT_EQ(recorder.call(CreateReportingSession, most + 1), answeredOnce(succeeded));
    EXPECT_NE(recorder.session(most + 1), nullptr) << "each client has its own limit";

    player.call(DestroyReportingSession, 2);
    create(most + 1);
    EXPECT_NE(player.session(most + 1), nullptr);

    const ledger::Account account = platform.ledger.account();
    EXPECT_EQ(account[ledger::Counter::SessionsRefused], 2U);
    EXPECT_EQ(account[ledger::Counter::SessionsCreated], 10'003U);
    EXPECT_EQ(account[ledger::Counter::SessionsGone], 2U) << "one replaced, one destroyed";

    harness.forget();
    player.close();
    EXPECT_EQ(platform.ledger.account()[ledger::Counter::SessionsGone], 10'002U);
    EXPECT_THAT(platform.log.lines("kerc"),
                testing::Contains(IsLine(
                    Error, "kerc", "client 1001 was refused 2 sessions: it may have 10000, and all clients 110000")));
}

// One frame must hold the IDs of all sessions.
TEST_F(ClientServerInstanceTest, CreatesNoMoreSessionsThanAllClientsMayHaveTogether)
{
    constexpr std::size_t longestID = 9; // bytes of CBOR
    constexpr std::size_t restOfAnAnswer = 32;
    constexpr std::size_t most = KestoReportingClientServerInstance::mostSessionsOfTheService;
    static_assert(most * longestID + restOfAnAnswer <= platform::longestFrame);

    std::vector<std::shared_ptr<KestoReportingClientServerInstance>> clients;
    std::size_t sessions = 0;
    const auto fill = [&](std::size_t count) {
        clients.push_back(std::make_shared<KestoReportingClientServerInstance>(17, harness.service));
        for (std::size_t index = 0; index < count; ++index)
            clients.back()->createReportingSession(static_cast<std::int64_t>(index), [](auto&, const auto&, bool) { });
        platform.workQueues.runAll();
        platform.log.clear();
        platform.traceEmitter.take();
        sessions += clients.back()->clientReportingSessionMap().size();
    };
    while (clients.size() < most / KestoReportingClientServerInstance::mostSessions)
        fill(KestoReportingClientServerInstance::mostSessions);
    EXPECT_EQ(sessions, most);
    fill(3);
    EXPECT_EQ(sessions, most);
    clients.pop_back();
    EXPECT_THAT(platform.log.lines("kerc"),
                testing::Contains(IsLine(
                    Error, "kerc", "client 17 was refused 3 sessions: it may have 10000, and all clients 110000")));
    clients.pop_back();
    fill(3);
    EXPECT_EQ(clients.back()->clientReportingSessionMap().size(), 3U) << "the sessions of a client that goes make room";
}

// --- set service type

TEST_F(ClientServerInstanceTest, SetsAServiceType)
{
    create(42);
    harness.forget();
    EXPECT_EQ(player.call(SetServiceType, 4, 42), answeredOnce(succeeded));
    EXPECT_EQ(player.session(42)->serviceType(), 4);
    EXPECT_THAT(lines(),
                ElementsAre(IsLine(Debug, "kerc", "setting service type 4 for reporter 42"),
                            IsLine(Info, "kerr", "setting service type alarms"),
                            IsLine(Default, "kerc", "service type 4 set for reporter  42")));
    EXPECT_THAT(platform.traceEmitter.take(), IsEmpty());
}

TEST_F(ClientServerInstanceTest, SetsNoServiceTypeOfASessionThatItDoesNotHave)
{
    recorder.call(CreateReportingSession, 43);
    harness.forget();
    EXPECT_EQ(player.call(SetServiceType, 4, 43), answeredOnce(succeeded));
    EXPECT_EQ(recorder.session(43)->serviceType(), 0);
    EXPECT_THAT(lines(), ElementsAre(IsLine(Debug, "kerc", "setting service type 4 for reporter 43")));
}

TEST_F(ClientServerInstanceTest, SetsNoServiceTypeOfSessionZero)
{
    create(0);
    harness.forget();
    EXPECT_EQ(player.call(SetServiceType, 4, 0), answeredOnce(succeeded));
    EXPECT_EQ(player.session(0)->serviceType(), 0);
    EXPECT_THAT(lines(), ElementsAre(IsLine(Debug, "kerc", "setting service type 4 for reporter 0")));
}

// --- get service type

TEST_F(ClientServerInstanceTest, TellsTheServiceTypeOfItsOwnSession)
{
    create(42);
    player.call(SetServiceType, 4, 42);
    harness.forget();
    EXPECT_EQ(player.call(GetServiceNameForReporterID, 42), answeredOnce({null, 4}));
    EXPECT_THAT(lines(),
                ElementsAre(IsLine(Debug, "kerc", "fetching seviceType"),
                            IsLine(Default, "kerc", "returning service type 4 for reporter  42")));
    EXPECT_THAT(platform.traceEmitter.take(), IsEmpty());
}

TEST_F(ClientServerInstanceTest, TellsTheServiceTypeOfAnotherClientsSession)
{
    create(42);
    player.call(SetServiceType, 4, 42);
    harness.forget();
    EXPECT_EQ(recorder.call(GetServiceNameForReporterID, 42), answeredOnce({null, 4}));
    EXPECT_THAT(lines(),
                ElementsAre(IsLine(Debug, "kerc", "fetching seviceType"),
                            IsLine(Info, "kers", "found reporting session 42 for client 1001"),
                            IsLine(Default, "kerc", "returning service type 4 for reporter  42")));
}

TEST_F(ClientServerInstanceTest, PrefersItsOwnSessionToThatOfAClientThatCameBefore)
{
    create(42);
    player.call(SetServiceType, 4, 42);
    recorder.call(CreateReportingSession, 42);
    recorder.call(SetServiceType, 7, 42);
    EXPECT_EQ(recorder.call(GetServiceNameForReporterID, 42), answeredOnce({null, 7}));
}

TEST_F(ClientServerInstanceTest, TellsAnUnknownServiceTypeOfASessionThatNobodyHas)
{
    EXPECT_EQ(player.call(GetServiceNameForReporterID, 42), answeredOnce({null, 65535}));
    EXPECT_THAT(lines(),
                ElementsAre(IsLine(Debug, "kerc", "fetching seviceType"),
                            IsLine(Error, "kers", "failed to find reporting session 42"),
                            IsLine(Default, "kerc", "returning service type 65535 for reporter  42")));
}

TEST_F(ClientServerInstanceTest, AnswersTheServiceTypeOfSessionZeroTwice)
{
    EXPECT_EQ(player.call(GetServiceNameForReporterID, 0), (Answers{{null, 65535}, {null, 65535}}));
    EXPECT_THAT(lines(),
                ElementsAre(IsLine(Debug, "kerc", "fetching seviceType"),
                            IsLine(Default, "kerc", "returning service type 65535 for reporter  0")));
}

TEST_F(ClientServerInstanceTest, AnswersTheServiceTypeOfItsOwnSessionZeroTheSecondTime)
{
    create(0);
    EXPECT_EQ(player.call(GetServiceNameForReporterID, 0), (Answers{{null, 65535}, {null, 0}}));
    EXPECT_EQ(recorder.call(GetServiceNameForReporterID, 0), (Answers{{null, 65535}, {null, 65535}}))
        << "no other client finds it";
}

// --- set configuration

TEST_F(ClientServerInstanceTest, MergesAConfiguration)
{
    create(42);
    harness.forget();
    EXPECT_EQ(player.call(SetConfiguration, Dictionary{{"a", 1}, {"b", 2}}, 42), answeredOnce(succeeded));
    EXPECT_EQ(player.call(SetConfiguration, Dictionary{{"a", 3}}, 42), answeredOnce(succeeded));
    EXPECT_EQ(player.session(42)->configuration(), (Dictionary{{"a", 3}, {"b", 2}}));
    EXPECT_THAT(
        lines(),
        ElementsAre(IsLine(Debug, "kerc", "setting configuration"), IsLine(Debug, "kerc", "setting configuration")));
    EXPECT_THAT(platform.traceEmitter.take(), IsEmpty());
}

TEST_F(ClientServerInstanceTest, ConfiguresSessionZero)
{
    create(0);
    EXPECT_EQ(player.call(SetConfiguration, Dictionary{{"a", 1}}, 0), answeredOnce(succeeded));
    EXPECT_EQ(player.session(0)->configuration(), (Dictionary{{"a", 1}}));
}

TEST_F(ClientServerInstanceTest, ConfiguresNoSessionThatItDoesNotHave)
{
    recorder.call(CreateReportingSession, 43);
    EXPECT_EQ(player.call(SetConfiguration, Dictionary{{"a", 1}}, 43), answeredOnce(succeeded));
    EXPECT_EQ(recorder.session(43)->configuration(), Dictionary());
}

TEST_F(ClientServerInstanceTest, CannotSendTheTraceTypeConstant)
{
    create(42);
    player.call(SetConfiguration, Dictionary{{"KestoReportingTraceType", KestoReportingTraceTypeKtrace}}, 42);
    const auto received = player.session(42)->configuration().find("KestoReportingTraceType")->string();
    EXPECT_EQ(*received, KestoReportingTraceTypeKtrace);
    EXPECT_FALSE(received->isSameObject(KestoReportingTraceTypeKtrace));
}

// --- start

TEST_F(ClientServerInstanceTest, StartsASessionAndHoldsTheAnswer)
{
    create(42);
    harness.forget();
    EXPECT_EQ(start(42), unanswered);
    EXPECT_TRUE(player.session(42)->started());
    EXPECT_TRUE(player.session(42)->transactionCompleteBlock());
    EXPECT_NE(player.session(42)->driverSnapShot(), std::nullopt);
    EXPECT_EQ(player.connection().unansweredCalls(), once);
    EXPECT_THAT(lines(),
                ElementsAre(IsLine(Debug, "kerc", "starting session for reporter 42"),
                            IsLine(Debug, "kerr", "starting session owned by 42"),
                            IsLine(Default, "kers", "getting features"),
                            IsLine(Default, "kers", "sessions for client 1001 : [" + described(42, true) + "]"),
                            IsLine(Default, "kers", "sessions for client 1002 : []"),
                            IsLine(Default, "kerc", "0 active reporting session(s) [" + described(42, true) + "]")));
    EXPECT_THAT(platform.traceEmitter.take(), ElementsAre(clientStart, sessionStarted));
}

TEST_F(ClientServerInstanceTest, AnswersAStartOfASessionThatIsStartedAtOnce)
{
    create(42);
    const auto first = player.submit(StartReportingSessionForID, {42});
    platform.workQueues.runAll();
    harness.forget();

    EXPECT_EQ(start(42), answeredOnce(succeeded));
    EXPECT_EQ(player.answersTo(first), unanswered);
    EXPECT_THAT(lines(), ElementsAre(IsLine(Debug, "kerc", "starting session for reporter 42")));
    EXPECT_THAT(platform.traceEmitter.take(), ElementsAre(clientStart));

    stop(42);
    EXPECT_EQ(player.answersTo(first), answeredOnce(succeeded)) << "the stored callback was not replaced";
}

TEST_F(ClientServerInstanceTest, StartsNeitherSessionZeroNorOneThatItDoesNotHave)
{
    create(0);
    recorder.call(CreateReportingSession, 43);
    harness.forget();
    for (const std::int64_t reporterID : {0, 43, 44})
        EXPECT_EQ(start(reporterID), answeredOnce(succeeded));
    EXPECT_FALSE(player.session(0)->started());
    EXPECT_FALSE(recorder.session(43)->started());
    EXPECT_THAT(lines(),
                ElementsAre(IsLine(Debug, "kerc", "starting session for reporter 0"),
                            IsLine(Debug, "kerc", "starting session for reporter 43"),
                            IsLine(Debug, "kerc", "starting session for reporter 44")));
    EXPECT_THAT(platform.traceEmitter.take(), ElementsAre(clientStart, clientStart, clientStart));
}

TEST_F(ClientServerInstanceTest, AnswersTheFirstOfTwoStartsAtTheStopBetweenThem)
{
    create(42);
    const auto first = player.submit(StartReportingSessionForID, {42});
    const auto stopped = player.submit(StopReportingSessionForID, {42});
    const auto second = player.submit(StartReportingSessionForID, {42});
    const std::size_t before = player.connection().received().size();
    platform.workQueues.runAll();

    EXPECT_EQ(player.answersTo(second), unanswered);
    const auto& received = player.connection().received();
    EXPECT_THAT(std::vector(received.begin() + static_cast<std::ptrdiff_t>(before), received.end()),
                ElementsAre(Array{first, null, true}, Array{stopped, null, true}))
        << "the start is answered first, then the stop";
    EXPECT_TRUE(player.session(42)->started());
}

TEST_F(ClientServerInstanceTest, AnswersACallbackThatTheSessionStillHoldsBeforeItStoresTheNext)
{
    create(42);
    int answered = 0;
    player.session(42)->setTransactionCompleteBlock([&](auto&, const auto& error, bool success) {
        EXPECT_EQ(error, std::nullopt);
        EXPECT_TRUE(success);
        ++answered;
    });
    EXPECT_EQ(start(42), unanswered);
    EXPECT_EQ(answered, 1);
    stop(42);
    EXPECT_EQ(answered, 1);
}

TEST_F(ClientServerInstanceTest, TellsAStartedSessionTheFeatureState)
{
    platform.preferences.set("com.quarn.kesto", "device_name", "Speaker");
    create(42);
    harness.forget();
    start(42);
    const auto messages = player.session(42)->nestedAggregatedPayloadData().value();
    ASSERT_EQ(messages.size(), 1U);
    const auto payload = messages[0].find("Setup_Setup_1")->dictionary();
    EXPECT_EQ(*payload->find("device_name"), Value("Speaker"));
    EXPECT_EQ(*payload->find("audiotag"), Value("SetupSetup"));
    EXPECT_THAT(platform.traceEmitter.take(), ElementsAre(clientStart, sessionStarted, sessionMessageAccepted));
}

TEST_F(ClientServerInstanceTest, TellsAStartedSessionNothingWhenNoFeatureIsKnown)
{
    create(42);
    start(42);
    EXPECT_THAT(*player.session(42)->nestedAggregatedPayloadData(), IsEmpty());
}

class TracedStartTest : public ClientServerInstanceTest {
protected:
    void makeTestSession(AudioServiceType serviceType)
    {
        create(42);
        player.call(SetServiceType, serviceType, 42);
    }
};

TEST_F(TracedStartTest, IsAnsweredAtOnceAndAgainAtTheStop)
{
    platform.featureFlags.enable("Sonalis", "Tracing");
    makeTestSession(11);
    const auto started = player.submit(StartReportingSessionForID, {42});
    platform.workQueues.runAll();
    EXPECT_EQ(player.answersTo(started), answeredOnce(succeeded));
    stop(42);
    EXPECT_EQ(player.answersTo(started), (Answers{succeeded, succeeded}));
}

TEST_F(TracedStartTest, IsAnsweredAtOnceBetweenTheFeatureMessageAndTheActiveSessions)
{
    platform.featureFlags.enable("Sonalis", "Tracing");
    platform.preferences.set("com.quarn.kesto", "device_name", "Speaker");
    makeTestSession(11);
    player.submit(StartReportingSessionForID, {42});
    std::vector<std::string> steps;
    const std::size_t before = player.connection().sent();
    const auto note = [&](const std::string& step) {
        steps.push_back(step + ", answers: " + std::to_string(player.connection().sent() - before));
    };
    platform.traceEmitter.setObserver([&](std::uint32_t code) {
        if (code == sessionMessageAccepted)
            note("features told");
    });
    platform.log.setObserver([&](const LogLine& line) {
        if (line.message.starts_with("0 active reporting session(s)"))
            note("active sessions said");
    });
    platform.workQueues.runAll();
    platform.traceEmitter.setObserver(nullptr);
    platform.log.setObserver(nullptr);
    EXPECT_THAT(steps, ElementsAre("features told, answers: 0", "active sessions said, answers: 1"));
}

TEST_F(TracedStartTest, IsHeldForAnotherServiceType)
{
    platform.featureFlags.enable("Sonalis", "Tracing");
    makeTestSession(12);
    EXPECT_EQ(start(42), unanswered);
}

TEST_F(TracedStartTest, IsHeldWhenTheFlagIsOff)
{
    platform.featureFlags.enable("Sonalis", "tracing");
    platform.featureFlags.enable("Other", "Tracing");
    makeTestSession(11);
    EXPECT_EQ(start(42), unanswered);
}

TEST_F(TracedStartTest, IsHeldOnASystemThatCannotTrace)
{
    platform.featureFlags.enable("Sonalis", "Tracing");
    platform.kernelTrace.available = false;
    makeTestSession(11);
    EXPECT_EQ(start(42), unanswered);
}

// --- stop

TEST_F(ClientServerInstanceTest, StopsASessionAndAnswersItsStart)
{
    create(42);
    const auto started = player.submit(StartReportingSessionForID, {42});
    platform.workQueues.runAll();
    harness.forget();
    EXPECT_EQ(stop(42), answeredOnce(succeeded));
    EXPECT_EQ(player.answersTo(started), answeredOnce(succeeded));
    EXPECT_FALSE(player.session(42)->started());
    EXPECT_FALSE(player.session(42)->transactionCompleteBlock());
    EXPECT_EQ(player.session(42)->driverSnapShot(), std::nullopt);
    EXPECT_EQ(player.connection().unansweredCalls(), 0U);
    EXPECT_THAT(lines(),
                ElementsAre(IsLine(Debug, "kerc", "stopping session for reporter 42"),
                            IsLine(Debug, "kerr", "ending session 42"), IsLine(Debug, "kerr", "ending session 42"),
                            IsLine(Default, "kers", "sessions for client 1001 : [" + described(42, false) + "]"),
                            IsLine(Default, "kers", "sessions for client 1002 : []"),
                            IsLine(Default, "kerc", "0 active reporting session(s) []"),
                            IsLine(Default, "kerc", "stopping 42")));
    EXPECT_THAT(platform.traceEmitter.take(), ElementsAre(clientStop, sessionStopping));
}

TEST_F(ClientServerInstanceTest, LetsGoOfTheDriversSnapshotBeforeItStopsASession)
{
    create(42);
    start(42);
    EXPECT_NE(player.session(42)->driverSnapShot(), std::nullopt);
    std::vector<bool> snapShots;
    platform.log.setObserver([&](const LogLine& line) {
        if (line.message == "ending session 42")
            snapShots.push_back(player.session(42)->driverSnapShot().has_value());
    });
    stop(42);
    platform.log.setObserver(nullptr);
    EXPECT_THAT(snapShots, ElementsAre(false, false));
}

TEST_F(ClientServerInstanceTest, AnswersTheStopOfASessionThatIsNotStarted)
{
    create(42);
    harness.forget();
    EXPECT_EQ(stop(42), answeredOnce(succeeded));
    EXPECT_THAT(
        lines(),
        ElementsAre(IsLine(Debug, "kerc", "stopping session for reporter 42"), IsLine(Default, "kerc", "stopping 42")));
    EXPECT_THAT(platform.traceEmitter.take(), ElementsAre(clientStop));
}

TEST_F(ClientServerInstanceTest, StopsNoSessionThatItDoesNotHave)
{
    recorder.call(CreateReportingSession, 43);
    recorder.call(StartReportingSessionForID, 43);
    harness.forget();
    EXPECT_EQ(stop(43), answeredOnce(succeeded));
    EXPECT_TRUE(recorder.session(43)->started());
    EXPECT_THAT(
        lines(),
        ElementsAre(IsLine(Debug, "kerc", "stopping session for reporter 43"), IsLine(Default, "kerc", "stopping 43")));
}

TEST_F(ClientServerInstanceTest, AnswersTheStopOfSessionZeroWithoutAnotherWord)
{
    create(0);
    support::onServerQueue(harness.platform.workQueues, [&] { player.session(0)->start(); });
    harness.forget();
    EXPECT_EQ(stop(0), answeredOnce(succeeded));
    EXPECT_TRUE(player.session(0)->started());
    EXPECT_THAT(lines(), ElementsAre(IsLine(Debug, "kerc", "stopping session for reporter 0")));
    EXPECT_THAT(platform.traceEmitter.take(), ElementsAre(clientStop));
}

// --- destroy

TEST_F(ClientServerInstanceTest, DestroysAStartedSessionWithoutAnsweringItsStart)
{
    create(42);
    const auto started = player.submit(StartReportingSessionForID, {42});
    platform.workQueues.runAll();
    harness.forget();
    EXPECT_EQ(player.call(DestroyReportingSession, 42), answeredOnce(succeeded));
    EXPECT_EQ(player.session(42), nullptr);
    EXPECT_EQ(player.answersTo(started), unanswered);
    EXPECT_EQ(player.connection().unansweredCalls(), 0U) << "no code can answer it any more";
    EXPECT_THAT(lines(),
                ElementsAre(IsLine(Debug, "kerc", "destroying session for reporter 42"),
                            IsLine(Debug, "kerr", "ending session 42"), IsLine(Debug, "kerr", "ending session 42"),
                            IsLine(Info, "kerr", "deallocing this session 42"),
                            IsLine(Default, "kerc", "destroying 42")));
    EXPECT_THAT(platform.traceEmitter.take(), ElementsAre(clientDestroy, sessionStopping, sessionDestroyed));
}

TEST_F(ClientServerInstanceTest, DestroysASessionThatIsNotStartedWithoutStoppingIt)
{
    create(42);
    harness.forget();
    EXPECT_EQ(player.call(DestroyReportingSession, 42), answeredOnce(succeeded));
    EXPECT_EQ(player.session(42), nullptr);
    EXPECT_THAT(lines(),
                ElementsAre(IsLine(Debug, "kerc", "destroying session for reporter 42"),
                            IsLine(Info, "kerr", "deallocing this session 42"),
                            IsLine(Default, "kerc", "destroying 42")));
    EXPECT_THAT(platform.traceEmitter.take(), ElementsAre(clientDestroy, sessionDestroyed));
}

TEST_F(ClientServerInstanceTest, DestroysNoSessionThatItDoesNotHave)
{
    recorder.call(CreateReportingSession, 43);
    harness.forget();
    EXPECT_EQ(player.call(DestroyReportingSession, 43), answeredOnce(succeeded));
    EXPECT_NE(recorder.session(43), nullptr);
    EXPECT_THAT(lines(),
                ElementsAre(IsLine(Debug, "kerc", "destroying session for reporter 43"),
                            IsLine(Default, "kerc", "destroying 43")));
}

TEST_F(ClientServerInstanceTest, DestroysSessionZeroNeither)
{
    create(0);
    harness.forget();
    EXPECT_EQ(player.call(DestroyReportingSession, 0), answeredOnce(succeeded));
    EXPECT_NE(player.session(0), nullptr);
    EXPECT_THAT(lines(), ElementsAre(IsLine(Debug, "kerc", "destroying session for reporter 0")));
    EXPECT_THAT(platform.traceEmitter.take(), ElementsAre(clientDestroy));
}

// --- validate and list

TEST_F(ClientServerInstanceTest, ValidatesASessionOfAnyClient)
{
    create(42);
    player.call(SetServiceType, 4, 42);
    harness.forget();
    const Array valid{null, Dictionary{{"reporterID", 42}, {"serviceType", 4}}};
    EXPECT_EQ(player.call(ValidReporterID, 42), answeredOnce(valid));
    EXPECT_THAT(lines(),
                ElementsAre(IsLine(Debug, "kerc", "validating reporter 42"),
                            IsLine(Default, "kerc", "validating reporter 42")));
    harness.forget();
    EXPECT_EQ(recorder.call(ValidReporterID, 42), answeredOnce(valid));
    EXPECT_THAT(lines(),
                ElementsAre(IsLine(Debug, "kerc", "validating reporter 42"),
                            IsLine(Info, "kers", "found reporting session 42 for client 1001"),
                            IsLine(Default, "kerc", "validating reporter 42")));
    EXPECT_THAT(platform.traceEmitter.take(), IsEmpty());
}

TEST_F(ClientServerInstanceTest, ValidatesNoSessionThatNobodyHas)
{
    const Array invalid{null, Dictionary{{"reporterID", 0}, {"serviceType", 65535}}};
    EXPECT_EQ(player.call(ValidReporterID, 42), answeredOnce(invalid));
    EXPECT_EQ(player.call(ValidReporterID, 0), answeredOnce(invalid));
}

TEST_F(ClientServerInstanceTest, ValidatesItsOwnSessionZero)
{
    create(0);
    EXPECT_EQ(player.call(ValidReporterID, 0), answeredOnce({null, Dictionary{{"reporterID", 0}, {"serviceType", 0}}}));
}

TEST_F(ClientServerInstanceTest, ListsTheReportersOfAllClientsInOrder)
{
    EXPECT_EQ(player.call(GetAllReporters), answeredOnce({null, Array{}}));
    recorder.call(CreateReportingSession, 5);
    recorder.call(CreateReportingSession, -3);
    create(9);
    create(5);
    create(0);
    create(9);
    harness.forget();
    EXPECT_EQ(recorder.call(GetAllReporters), answeredOnce({null, Array{9, 5, 0, 5, -3}}));
    EXPECT_THAT(lines(), IsEmpty());
    EXPECT_THAT(platform.traceEmitter.take(), IsEmpty());
}

TEST_F(ClientServerInstanceTest, ListsManyReportersInSlices)
{
    create(42);
    recorder.call(CreateReportingSession, 43);
    platform.clock.setPaceOfSystemUptime(0.001);
    const auto listed = player.submit(GetAllReporters, {});
    const auto other = recorder.submit(CreateReportingSession, {44});
    ASSERT_TRUE(platform.workQueues.runOne());
    EXPECT_EQ(player.answersTo(listed), unanswered);
    ASSERT_TRUE(platform.workQueues.runOne());
    EXPECT_EQ(recorder.answersTo(other), answeredOnce(succeeded));
    platform.workQueues.runAll();
    EXPECT_EQ(player.answersTo(listed), answeredOnce({null, Array{42, 43, 44}}));
}

TEST_F(ClientServerInstanceTest, ListsReportersAtOnceWhileItIsQuick)
{
    create(42);
    const auto listed = player.submit(GetAllReporters, {});
    ASSERT_TRUE(platform.workQueues.runOne());
    EXPECT_EQ(player.answersTo(listed), answeredOnce({null, Array{42}}));
}

TEST_F(ClientServerInstanceTest, MakesNoFurtherListForAClientThatGoesMeanwhile)
{
    create(42);
    platform.clock.setPaceOfSystemUptime(0.001);
    const auto listed = player.submit(GetAllReporters, {});
    ASSERT_TRUE(platform.workQueues.runOne());
    player.object()->handleConnectionError();
    platform.workQueues.runAll();
    EXPECT_EQ(player.answersTo(listed), unanswered);
    EXPECT_EQ(player.connection().unansweredCalls(), 0U);
}

TEST_F(ClientServerInstanceTest, ListsNothingForAClientThatHasGone)
{
    create(42);
    const auto call = player.submit(GetAllReporters, {});
    player.connection().close();
    platform.workQueues.runAll();
    EXPECT_THAT(player.answersTo(call), IsEmpty());
    EXPECT_EQ(player.connection().unansweredCalls(), 0U);
    EXPECT_EQ(recorder.call(GetAllReporters), answeredOnce({null, Array{}}));
}

// The connection still takes answers here; a closed one would drop the list, and the work for it would not show.
TEST_F(ClientServerInstanceTest, MakesNoListsForCallsThatWaitWhenTheirConnectionIsLost)
{
    create(42);
    const auto call = player.submit(GetAllReporters, {});
    player.object()->handleConnectionError();
    platform.workQueues.runAll();
    EXPECT_EQ(player.answersTo(call), unanswered);
    EXPECT_EQ(player.connection().unansweredCalls(), 0U);
    EXPECT_EQ(recorder.call(GetAllReporters), answeredOnce({null, Array{}}));
}

// --- how the log shows many sessions

TEST_F(ClientServerInstanceTest, DescribesNoMoreSessionsThanALogLineShows)
{
    constexpr std::int64_t sessions = 2000;
    constexpr std::size_t longestLine = 64 * 1024;
    const Dictionary configuration{{"HostApplicationDisplayID", std::string(1024, 'x')}};
    for (std::int64_t reporterID = 1; reporterID <= sessions; ++reporterID) {
        player.submit(CreateReportingSession, {reporterID});
        player.submit(SetConfiguration, {configuration, reporterID});
        platform.workQueues.runAll(); // beyond a number of unanswered calls, reading from a client pauses
    }
    harness.forget();
    start(1);
    for (const LogLine& line : platform.log.lines())
        EXPECT_LT(line.message.size(), longestLine);
    EXPECT_THAT(platform.log.lines("kers"),
                testing::Contains(
                    testing::Field("message", &LogLine::message,
                                   testing::AllOf(testing::StartsWith("sessions for client 1001 : [\"reporterID=1,"),
                                                  testing::EndsWith(" more\"]")))));
}

// --- kill

class ClientDeathTest : public ClientServerInstanceTest {
protected:
    void killAloud()
    {
        platform.log.setObserver([](const LogLine& line) {
            std::cerr << platform::name(line.level) << ' ' << line.tag << ' ' << line.message << '\n';
        });
        platform.analytics.setReportingObserver([] { std::cerr << "losses of events\n"; });
        platform.ledger.count(ledger::Counter::LostToDiskFull, 3);
        platform.ledger.count(ledger::Counter::SessionsRefused, 2);
        platform.ledger.count(ledger::Counter::ConnectionsRefused, 5); // by a limit: not lost
        player.submit(KillService, {});
    }
};

TEST_F(ClientDeathTest, EndsTheProcessOnTheCallersThreadWithStatusTwo)
{
    EXPECT_EXIT(killAloud(), testing::ExitedWithCode(2),
                "^default kerc player asks the service to end: connection of process 1001\n"
                "default kerc DESTROYING SERVICE\n"
                "losses of events\n"
                "error kers lost since the start: lost.diskFull 3, sessions.refused 2\n$");
}

TEST_F(ClientDeathTest, NamesTheClientsProcessWhereNoConnectionIsAtWork)
{
    platform.processTable.remove(1001);
    const auto killWithoutAConnection = [this] {
        platform.log.setObserver([](const LogLine& line) { std::cerr << line.message << '\n'; });
        player.object()->killService(nullptr);
    };
    EXPECT_EXIT(killWithoutAConnection(), testing::ExitedWithCode(2),
                "^\\(null\\) asks the service to end: process 1001\nDESTROYING SERVICE\n$");
}

TEST_F(ClientDeathTest, EndsTheProcessAtOnceWithoutWhatIsLeftForItsExit)
{
    const auto killWithAnExitHandler = [this] {
        std::atexit([] { std::_Exit(7); });
        player.submit(KillService, {});
    };
    EXPECT_EXIT(killWithAnExitHandler(), testing::ExitedWithCode(2), "") << "other threads run then";
}

// --- connection loss

TEST_F(ClientServerInstanceTest, StopsItsStartedSessionsInOrderAndLeavesWhenTheConnectionIsLost)
{
    for (const std::int64_t reporterID : {3, 1, 2})
        create(reporterID);
    start(2);
    start(3);
    harness.forget();
    player.object()->handleConnectionError();
    platform.workQueues.runAll();

    EXPECT_EQ(player.object()->clientReportingSessionMap().size(), 0U);
    EXPECT_THAT(harness.service->getAllClients(), ElementsAre(recorder.object()));
    EXPECT_THAT(lines(),
                ElementsAre(IsLine(Debug, "kerr", "ending session 3"), IsLine(Debug, "kerr", "ending session 3"),
                            IsLine(Debug, "kerr", "ending session 2"), IsLine(Debug, "kerr", "ending session 2"),
                            IsLine(Info, "kerr", "deallocing this session 3"),
                            IsLine(Info, "kerr", "deallocing this session 1"),
                            IsLine(Info, "kerr", "deallocing this session 2"),
                            IsLine(Default, "kerc", "removing 1001 from the server client list")));
    EXPECT_THAT(platform.traceEmitter.take(),
                ElementsAre(sessionStopping, sessionStopping, sessionDestroyed, sessionDestroyed, sessionDestroyed));
}

TEST_F(ClientServerInstanceTest, SaysThatItIsRemovedOnceItIs)
{
    std::vector<std::size_t> clients;
    platform.log.setObserver([&](const LogLine& line) {
        if (line.message == "removing 1001 from the server client list")
            clients.push_back(harness.service->getAllClients().size());
    });
    player.object()->handleConnectionError();
    platform.workQueues.runAll();
    platform.log.setObserver(nullptr);
    EXPECT_THAT(clients, ElementsAre(1));
}

TEST_F(ClientServerInstanceTest, DoesNothingWhenItsConnectionIsLostAgain)
{
    player.object()->handleConnectionError();
    platform.workQueues.runAll();
    harness.forget();
    player.object()->handleConnectionError();
    platform.workQueues.runAll();
    EXPECT_THAT(lines(), IsEmpty());
    EXPECT_THAT(harness.service->getAllClients(), ElementsAre(recorder.object()));
}

TEST_F(ClientServerInstanceTest, NeverAnswersAStartWhoseConnectionWasLost)
{
    create(42);
    const auto started = player.submit(StartReportingSessionForID, {42});
    platform.workQueues.runAll();
    player.object()->handleConnectionError();
    platform.workQueues.runAll();
    EXPECT_EQ(player.answersTo(started), unanswered);
    EXPECT_EQ(player.connection().unansweredCalls(), 0U);
}

TEST_F(ClientServerInstanceTest, IsNotFoundAnyMoreOnceItIsGone)
{
    create(42);
    player.close();
    EXPECT_EQ(recorder.call(GetServiceNameForReporterID, 42), answeredOnce({null, 65535}));
    EXPECT_EQ(player.object(), nullptr);
}

TEST_F(ClientServerInstanceTest, CarriesOutTheCallsThatCameBeforeItsEnd)
{
    player.submit(CreateReportingSession, {42});
    player.submit(StartReportingSessionForID, {42});
    player.close();
    EXPECT_THAT(platform.log.lines("kerr"), testing::Contains(IsLine(Debug, "kerr", "starting session owned by 42")));
    EXPECT_THAT(platform.log.lines("kerr"), testing::Contains(IsLine(Debug, "kerr", "ending session 42")).Times(2));
    EXPECT_EQ(player.object(), nullptr);
}

// --- without the service

// The service object is gone. One client has the session 41, which is created, and 42, which is started; another client
// has 43. Every operation is answered, and does what is possible without the service object.
class OrphanTest : public ClientServerInstanceTest {
protected:
    OrphanTest()
    {
        create(41);
        create(42);
        start(42);
        recorder.call(CreateReportingSession, 43);
        harness.service.reset();
        platform.analytics.use("*");
        harness.forget();
    }
    void TearDown() override
    {
        EXPECT_THAT(platform.log.lines("kers"), IsEmpty());
        EXPECT_THAT(platform.analytics.asked(), IsEmpty());
    }
};

TEST_F(OrphanTest, CreatesSessions)
{
    EXPECT_EQ(create(44), answeredOnce(succeeded));
    EXPECT_NE(player.session(44), nullptr);
}

TEST_F(OrphanTest, SetsTheServiceTypeAndTheConfigurationOfItsSessions)
{
    EXPECT_EQ(player.call(SetServiceType, 3, 42), answeredOnce(succeeded));
    EXPECT_EQ(player.call(SetConfiguration, Dictionary{{"a", 1}}, 42), answeredOnce(succeeded));
    EXPECT_EQ(player.session(42)->serviceType(), 3);
    EXPECT_EQ(player.session(42)->configuration(), (Dictionary{{"a", 1}}));
}

TEST_F(OrphanTest, TellsTheServiceTypeOfItsOwnSessionsOnly)
{
    player.session(42)->setServiceType(3);
    EXPECT_EQ(player.call(GetServiceNameForReporterID, 42), answeredOnce({null, 3}));
    EXPECT_EQ(player.call(GetServiceNameForReporterID, 43), answeredOnce({null, 65535}));
}

TEST_F(OrphanTest, ValidatesItsOwnSessionsOnly)
{
    EXPECT_EQ(player.call(ValidReporterID, 42),
              answeredOnce({null, Dictionary{{"reporterID", 42}, {"serviceType", 0}}}));
    EXPECT_EQ(player.call(ValidReporterID, 43),
              answeredOnce({null, Dictionary{{"reporterID", 0}, {"serviceType", 65535}}}));
}

TEST_F(OrphanTest, StartsNoSession)
{
    EXPECT_EQ(start(41), answeredOnce(succeeded));
    EXPECT_FALSE(player.session(41)->started());
}

TEST_F(OrphanTest, DeliversNoMessage)
{
    EXPECT_EQ(player.call(SendMessage, Dictionary{{"a", 1}}, 4, 1, Array{42}), answeredOnce(delivered))
        << "reporting is not disabled";
    EXPECT_EQ(player.call(SendMessage, Dictionary{{"a", 1}}, 4, 1, null), answeredOnce(delivered));
    EXPECT_THAT(*player.session(42)->nestedAggregatedPayloadData(), IsEmpty());
    EXPECT_THAT(platform.log.lines("kerr"), IsEmpty()) << "a stand-alone session does not exist either";
}

TEST_F(OrphanTest, StopsNoSession)
{
    EXPECT_EQ(stop(42), answeredOnce(succeeded));
    EXPECT_TRUE(player.session(42)->started());
}

TEST_F(OrphanTest, DestroysSessions)
{
    EXPECT_EQ(player.call(DestroyReportingSession, 42), answeredOnce(succeeded));
    EXPECT_EQ(player.session(42), nullptr);
    EXPECT_THAT(platform.log.lines("kerr"), testing::Contains(IsLine(Debug, "kerr", "ending session 42")));
}

TEST_F(OrphanTest, ListsNoReporters)
{
    EXPECT_EQ(player.call(GetAllReporters), answeredOnce({null, Array{}}));
}

TEST_F(OrphanTest, DoesNothingWhenItsConnectionIsLost)
{
    player.object()->handleConnectionError();
    platform.workQueues.runAll();
    EXPECT_TRUE(player.session(42)->started());
    EXPECT_THAT(lines(), IsEmpty());
}

using OrphanDeathTest = OrphanTest;

TEST_F(OrphanDeathTest, EndsTheProcessWithStatusTwo)
{
    EXPECT_EXIT(player.submit(KillService, {}), testing::ExitedWithCode(2), "");
}

} // namespace
