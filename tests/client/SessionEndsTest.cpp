// SPDX-License-Identifier: Apache-2.0
// A long stop holds up the client that makes it, and no other; for everyone else the session is stopped at once. Many
// sessions end one after the other.
#include "client/SessionEnds.h"
#include "support/EmittedCodes.h"
#include "support/ServiceHarness.h"
#include "tracing/TraceRunner.h"

#include <algorithm>
#include <gmock/gmock.h>

namespace {

using namespace support;
using enum platform::LogLevel;
using foundation::Array;
using foundation::Dictionary;
using foundation::Value;
using ledger::Counter;
using testing::Contains;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::SizeIs;

constexpr int tooManyMessages = 600; // to stop a session on the server queue

class SessionEndsTest : public testing::Test {
protected:
    explicit SessionEndsTest(bool isInternal = false)
        : harness([isInternal](TestPlatform& device) { device.deviceProperties.setInternalBuild(isInternal); })
    {
        platform.analytics.use("*");
    }

    // A started session that takes long to stop.
    void play(TestClient& client, std::int64_t reporterID)
    {
        client.call(CreateReportingSession, reporterID);
        client.call(SetServiceType, 7, reporterID);
        client.call(StartReportingSessionForID, reporterID);
        for (int message = 0; message < tooManyMessages; ++message)
            client.call(SendMessage, Dictionary{{"a", message}}, 4, 1, Array{reporterID});
        platform.analytics.clear(); // the fake keeps the session with each event
    }
    std::uint64_t submitStop(TestClient& client, std::int64_t reporterID)
    {
        return client.submit(StopReportingSessionForID, {reporterID});
    }
    // How often the log has such a line.
    [[nodiscard]] auto count(std::string_view text) const
    {
        return std::ranges::count_if(platform.log.lines(), [&](const LogLine& line) { return line.message == text; });
    }
    [[nodiscard]] ledger::Account account() const { return platform.ledger.account(); }
    void expectTheSumsToHold() const
    {
        const ledger::Account sums = account();
        EXPECT_EQ(sums[Counter::SessionsStarted], sums[Counter::SessionsStopped]);
        EXPECT_EQ(sums[Counter::Deliveries],
                  sums[Counter::Recorded] + sums[Counter::Repeated] + sums[Counter::Inert]
                      + sums[Counter::RefusedForMemory] + sums[Counter::RefusedForSize]);
    }

    ServiceHarness harness;
    TestPlatform& platform = harness.platform;
    TestClient player = harness.connect("player");
    TestClient recorder = harness.connect("recorder");
};

TEST_F(SessionEndsTest, LetsTheCallsOfOthersGoFirst)
{
    play(player, 42);
    const auto stopped = submitStop(player, 42);
    const auto behind = player.submit(SetServiceType, {8, 42});
    const auto other = recorder.submit(GetServiceNameForReporterID, {42});
    ASSERT_TRUE(platform.workQueues.runOne()); // the stop
    ASSERT_TRUE(platform.workQueues.runOne());
    EXPECT_EQ(recorder.answersTo(other), answeredOnce({null, 7}));
    EXPECT_EQ(player.answersTo(stopped), unanswered);
    EXPECT_EQ(player.answersTo(behind), unanswered);

    platform.workQueues.runAll();
    EXPECT_EQ(player.answersTo(stopped), answeredOnce(succeeded));
    EXPECT_EQ(player.answersTo(behind), answeredOnce(succeeded));
    EXPECT_EQ(player.session(42)->serviceType(), 8);
}

TEST_F(SessionEndsTest, LeavesTheSessionStoppedForOthersAtOnce)
{
    play(player, 42);
    submitStop(player, 42);
    ASSERT_TRUE(platform.workQueues.runOne());
    EXPECT_FALSE(player.session(42)->started());
    harness.forget();

    const auto before = account();
    recorder.submit(SendMessage, {Dictionary{{"b", 1}}, 4, 1, Array{42}});
    recorder.submit(SendMessage, {Dictionary{{"b", 1}}, 4, 1, null});
    platform.workQueues.runAll();
    EXPECT_THAT(platform.log.lines("kerc"), Contains(IsLine(Default, "kerc", "active reporting sessions 0 : []")));
    const auto after = account();
    EXPECT_EQ(after[Counter::Inert] - before[Counter::Inert], 2U) << "one of the standalone session";
    EXPECT_EQ(after[Counter::Recorded] - before[Counter::Recorded], 1U) << "the summary";
    expectTheSumsToHold();
}

TEST_F(SessionEndsTest, AnswersTheStartBeforeTheStopAndBothWhenTheMemoryIsFree)
{
    const std::size_t before = session::StorageBudget::service()->taken();
    player.call(CreateReportingSession, 42);
    const auto started = player.submit(StartReportingSessionForID, {42});
    for (int message = 0; message < tooManyMessages; ++message)
        player.call(SendMessage, Dictionary{{"a", message}}, 4, 1, Array{42});
    const auto stopped = submitStop(player, 42);
    ASSERT_TRUE(platform.workQueues.runOne());
    EXPECT_GT(session::StorageBudget::service()->taken(), before + 10'000);
    ASSERT_TRUE(platform.workQueues.runOne());
    EXPECT_LE(session::StorageBudget::service()->taken(), before + 1000) << "freed by the thread of the ends";
    EXPECT_EQ(player.answersTo(started), unanswered);
    EXPECT_EQ(player.answersTo(stopped), unanswered);
    ASSERT_TRUE(platform.workQueues.runOne());
    EXPECT_EQ(player.answersTo(started), answeredOnce(succeeded));
    EXPECT_EQ(player.answersTo(stopped), answeredOnce(succeeded));
    const auto& frames = player.connection().received();
    EXPECT_EQ(frames[frames.size() - 2][0], Value(started));
    EXPECT_EQ(frames[frames.size() - 1][0], Value(stopped));
}

TEST_F(SessionEndsTest, StopsAShortSessionInItsTurn)
{
    player.call(CreateReportingSession, 42);
    player.call(StartReportingSessionForID, 42);
    player.call(SendMessage, Dictionary{{"a", 1}}, 4, 1, Array{42});
    const auto stopped = submitStop(player, 42);
    ASSERT_TRUE(platform.workQueues.runOne());
    EXPECT_EQ(player.answersTo(stopped), answeredOnce(succeeded));
    EXPECT_EQ(platform.workQueues.pending(), 0U);
}

TEST_F(SessionEndsTest, MakesItsThreadForTheFirstLongSessionOnly)
{
    const FakeWorkQueues::MadeQueue ends{"com.quarn.kesto.reporting.ends", {}, false};
    EXPECT_THAT(platform.workQueues.made(), testing::Not(Contains(ends)));
    for (const std::int64_t reporterID : {42, 43}) {
        play(player, reporterID);
        player.call(StopReportingSessionForID, reporterID);
    }
    EXPECT_THAT(platform.workQueues.made(), Contains(ends).Times(1));
}

TEST_F(SessionEndsTest, StopsASessionOnTheServerQueueWhereTheSystemRefusesAThread)
{
    platform.workQueues.hasThreads = false;
    for (const std::int64_t reporterID : {42, 43}) {
        play(player, reporterID);
        EXPECT_EQ(player.call(StopReportingSessionForID, reporterID), answeredOnce(succeeded));
        EXPECT_EQ(count("sending summary event for reporter " + std::to_string(reporterID)), 1);
    }
    EXPECT_EQ(count("no thread for the ends of long sessions (Resource temporarily unavailable): all calls wait while "
                    "one stops"),
              1);
    expectTheSumsToHold();

    platform.workQueues.hasThreads = true;
    play(player, 44);
    player.call(StopReportingSessionForID, 44);
    EXPECT_EQ(platform.workQueues.made().back().name, "com.quarn.kesto.reporting.ends") << "it tries again";
}

TEST_F(SessionEndsTest, EndsOneSessionAfterTheOther)
{
    play(player, 42);
    play(recorder, 43);
    harness.forget();
    std::vector<std::string> steps;
    platform.log.setObserver([&](const LogLine& line) {
        if (line.message.starts_with("entering") || line.message.starts_with("sending summary")
            || line.message.starts_with("stopping 4"))
            steps.push_back(line.message.substr(0, line.message.find(" +[")));
    });
    submitStop(player, 42);
    submitStop(recorder, 43);
    ASSERT_TRUE(platform.workQueues.runOne());
    ASSERT_TRUE(platform.workQueues.runOne() && platform.workQueues.runOne());
    EXPECT_FALSE(recorder.session(43)->started()) << "it waits, but is stopped";
    platform.workQueues.runAll();
    platform.log.setObserver(nullptr);
    EXPECT_THAT(steps,
                ElementsAre("entering createVolumeMessages", "sending summary event for reporter 42", "stopping 42",
                            "entering createVolumeMessages", "sending summary event for reporter 43", "stopping 43"));
    EXPECT_EQ(count("43 is already started"), 0);
    expectTheSumsToHold();
}

TEST_F(SessionEndsTest, LetsTheUsersTakeTurns)
{
    TestClient stranger = harness.connect("stranger", 77);
    TestClient third = harness.connect("third", 5);
    for (const std::int64_t reporterID : {41, 42})
        play(player, reporterID);
    for (const std::int64_t reporterID : {43, 44})
        play(recorder, reporterID);
    play(stranger, 71);
    play(stranger, 72);
    play(third, 51);
    std::vector<std::string> stopped;
    platform.log.setObserver([&](const LogLine& line) {
        if (line.level == Default && line.message.starts_with("stopping "))
            stopped.push_back(line.message.substr(9));
    });
    submitStop(player, 41);
    submitStop(player, 42);
    submitStop(recorder, 43);
    submitStop(recorder, 44);
    submitStop(stranger, 71);
    submitStop(stranger, 72);
    submitStop(third, 51);
    platform.workQueues.runAll();
    platform.log.setObserver(nullptr);
    EXPECT_THAT(stopped, ElementsAre("41", "51", "71", "43", "72", "42", "44"));
    expectTheSumsToHold();
}

TEST_F(SessionEndsTest, CarriesOutTheCallsBehindALongStopInTheirOrder)
{
    play(player, 42);
    const auto first = submitStop(player, 42);
    const auto second = submitStop(player, 42);
    const auto again = player.submit(StartReportingSessionForID, {42});
    const auto destroyed = player.submit(DestroyReportingSession, {42});
    platform.workQueues.runAll();
    EXPECT_EQ(player.answersTo(first), answeredOnce(succeeded));
    EXPECT_EQ(player.answersTo(second), answeredOnce(succeeded));
    EXPECT_EQ(player.answersTo(again), unanswered) << "a destroyed session does not answer its start";
    EXPECT_EQ(player.answersTo(destroyed), answeredOnce(succeeded));
    EXPECT_EQ(count("ending session 42"), 4) << "each stop says it twice";
    EXPECT_EQ(player.session(42), nullptr);
    EXPECT_EQ(player.connection().unansweredCalls(), 0U);
    expectTheSumsToHold();
}

TEST_F(SessionEndsTest, DestroysALongSessionWhenItHasEnded)
{
    play(player, 42);
    const std::weak_ptr<KestoReportingSession> session = player.session(42);
    harness.forget();
    std::vector<std::string> steps;
    platform.log.setObserver([&](const LogLine& line) {
        if (line.level != Debug && line.tag != "kers")
            steps.push_back(line.message);
    });
    const auto destroyed = player.submit(DestroyReportingSession, {42});
    ASSERT_TRUE(platform.workQueues.runOne());
    EXPECT_NE(player.session(42), nullptr);
    EXPECT_EQ(player.answersTo(destroyed), unanswered);
    platform.workQueues.runAll();
    platform.log.setObserver(nullptr);
    EXPECT_EQ(player.answersTo(destroyed), answeredOnce(succeeded));
    EXPECT_TRUE(session.expired());
    EXPECT_THAT(steps,
                ElementsAre("sending summary event for reporter 42", "deallocing this session 42", "destroying 42"));
    expectTheSumsToHold();
}

TEST_F(SessionEndsTest, StopsTheLongSessionsOfALostClientOneAfterTheOtherAndThenLetsItGo)
{
    for (const std::int64_t reporterID : {42, 41, 43})
        play(player, reporterID);
    player.call(CreateReportingSession, 40);
    player.call(StartReportingSessionForID, 40);
    harness.forget();
    std::vector<std::string> steps;
    platform.log.setObserver([&](const LogLine& line) {
        if (line.level != Debug && line.tag != "kers")
            steps.push_back(line.message);
    });
    player.connection().breakOff();
    const auto other = recorder.submit(GetServiceNameForReporterID, {43});
    ASSERT_TRUE(platform.workQueues.runOne());
    while (recorder.answersTo(other) == unanswered)
        ASSERT_TRUE(platform.workQueues.runOne());
    EXPECT_EQ(recorder.answersTo(other), answeredOnce({null, 7})) << "it is still there";
    EXPECT_THAT(harness.service->getAllClients(), SizeIs(2));
    steps.clear();
    platform.workQueues.runAll();
    platform.log.setObserver(nullptr);
    EXPECT_THAT(steps,
                ElementsAre("sending summary event for reporter 42", "sending summary event for reporter 41",
                            "sending summary event for reporter 43", "deallocing this session 42",
                            "deallocing this session 41", "deallocing this session 43", "deallocing this session 40",
                            "removing 1001 from the server client list", "dealloc 1001 from the server client list"));
    EXPECT_THAT(harness.service->getAllClients(), SizeIs(1));
    EXPECT_EQ(player.object(), nullptr);
    EXPECT_EQ(account()[Counter::SessionsGone], 4U);
    expectTheSumsToHold();
}

// The clock goes on by a slice with each of these codes.
void letTimePassWithEach(std::uint32_t code, TestPlatform& platform)
{
    platform.traceEmitter.setObserver([code, &platform](std::uint32_t emitted) {
        if (emitted == code)
            platform.clock.advance(0.001);
    });
}

TEST_F(SessionEndsTest, StopsTheManyShortSessionsOfALostClientInSlices)
{
    for (std::int64_t reporterID = 1; reporterID <= 5; ++reporterID) {
        player.call(CreateReportingSession, reporterID);
        player.call(StartReportingSessionForID, reporterID);
    }
    player.connection().breakOff();
    const auto other = recorder.submit(GetServiceNameForReporterID, {0});
    letTimePassWithEach(sessionStopping, platform);
    while (recorder.answersTo(other) == unanswered)
        ASSERT_TRUE(platform.workQueues.runOne());
    platform.traceEmitter.setObserver(nullptr);
    EXPECT_EQ(account()[Counter::SessionsStopped], 1U) << "and the first slice ended with it";
    platform.workQueues.runAll();
    EXPECT_EQ(player.object(), nullptr);
    EXPECT_EQ(account()[Counter::SessionsGone], 5U);
    expectTheSumsToHold();
}

TEST_F(SessionEndsTest, EndsASessionWhoseServiceObjectHasGone)
{
    play(player, 42);
    const auto stopped = submitStop(player, 42);
    ASSERT_TRUE(platform.workQueues.runOne());
    harness.service.reset();
    platform.workQueues.runAll();
    EXPECT_EQ(count("sending summary event for reporter 42"), 1);
    EXPECT_EQ(player.answersTo(stopped), answeredOnce(succeeded));
    expectTheSumsToHold();
}

TEST_F(SessionEndsTest, LetsGoOfASessionWhoseQueuesRunNoMore)
{
    play(player, 42);
    const std::weak_ptr<KestoReportingSession> session = player.session(42);
    submitStop(player, 42);
    ASSERT_TRUE(platform.workQueues.runOne());
    platform.workQueues.discardAll();
    harness.service.reset();
    player.connection().close();
    platform.workQueues.discardAll();
    EXPECT_TRUE(session.expired());
}

// --- traces

class TracedSessionEndsTest : public SessionEndsTest {
protected:
    TracedSessionEndsTest()
    {
        platform.featureFlags.enable("Sonalis", "Tracing");
        platform.fileSystem.files.emplace(file, R"(<plist version="1.0"><dict><key>Children</key><array><dict>
            <key>Name</key><string>startup</string>
            <key>Children</key><array><dict>
                <key>Name</key><string>mix</string>
                <key>Type</key><string>Interval</string>
                <key>KTraceCodeBegin</key><string>0x21040010</string>
                <key>KTraceCodeEnd</key><string>0x21040014</string>
                <key>EventsMatchedBy</key><string>Thread</string>
            </dict></array></dict></array></dict></plist>)");
        started = startTraced(player, 42);
        platform.kernelTrace.deliver({.timestamp = 5000, .threadID = 1, .eventCode = 0x21040010});
        platform.kernelTrace.deliver({.timestamp = 5007, .threadID = 1, .eventCode = 0x21040014});
        platform.workQueues.runAll();
        EXPECT_EQ(player.answersTo(started), answeredOnce(succeeded));
    }

    // Returns the call of the start.
    std::uint64_t startTraced(TestClient& client, std::int64_t reporterID)
    {
        client.call(CreateReportingSession, reporterID);
        client.call(SetServiceType, 11, reporterID);
        client.call(SetConfiguration, Dictionary{{"KestoReportingPellorinPlistFilePath", file}}, reporterID);
        const auto start = client.submit(StartReportingSessionForID, {reporterID});
        platform.workQueues.runAll();
        return start;
    }
    // The kernel has delivered all that it had for the trace.
    void complete(std::size_t number)
    {
        const auto& trace = *platform.kernelTrace.sessions()[number];
        trace.queue->submit(platform::WorkItem(trace.completion));
    }
    [[nodiscard]] std::size_t filesWritten() const { return platform.performanceWriter.files().size(); }

    static constexpr std::string_view file = "/traces/mix.plist";
    std::uint64_t started = 0;
};

TEST_F(TracedSessionEndsTest, EndWhatATraceCollectsWhileAnotherTraceEnds)
{
    startTraced(recorder, 43);
    platform.kernelTrace.completes = false;
    const auto first = submitStop(player, 42);
    const auto second = submitStop(recorder, 43);
    ASSERT_TRUE(platform.workQueues.runOne());
    ASSERT_TRUE(platform.workQueues.runOne());
    bool isChecked = false;
    platform.workQueues.backgroundQueue().submit([&] {
        isChecked = true;
        EXPECT_TRUE(platform.kernelTrace.sessions()[0]->ended);
        EXPECT_TRUE(platform.kernelTrace.sessions()[1]->ended);
        EXPECT_EQ(filesWritten(), 0U);
        complete(0);
        complete(1);
    });
    platform.workQueues.runAll();
    EXPECT_TRUE(isChecked);
    EXPECT_EQ(filesWritten(), 2U);
    EXPECT_EQ(player.answersTo(first), answeredOnce(succeeded));
    EXPECT_EQ(recorder.answersTo(second), answeredOnce(succeeded));
    expectTheSumsToHold();
}

TEST_F(TracedSessionEndsTest, LetTheCallsOfOthersGoOnWhileTheTraceEnds)
{
    const auto stopped = submitStop(player, 42);
    const auto other = recorder.submit(GetServiceNameForReporterID, {42});
    ASSERT_TRUE(platform.workQueues.runOne()); // the stop
    EXPECT_FALSE(player.session(42)->startedTracing());
    EXPECT_EQ(filesWritten(), 0U);
    ASSERT_TRUE(platform.workQueues.runOne());
    EXPECT_EQ(recorder.answersTo(other), answeredOnce({null, 11}));
    EXPECT_EQ(filesWritten(), 0U);
    EXPECT_EQ(player.answersTo(stopped), unanswered);

    platform.workQueues.runAll();
    ASSERT_EQ(filesWritten(), 1U);
    EXPECT_THAT(platform.performanceWriter.files()[0]->measurements,
                ElementsAre(FakePerformanceWriter::Measurement{"mix", 7.0, platform::PerformanceUnit::Nanoseconds}));
    EXPECT_EQ(player.answersTo(started), (Answers{succeeded, succeeded}));
    EXPECT_EQ(player.answersTo(stopped), answeredOnce(succeeded));
    EXPECT_EQ(TraceRunner::numberOfRunners(), 0U);
    expectTheSumsToHold();
}

TEST_F(TracedSessionEndsTest, HoldUpNoOtherEnd)
{
    auto other = harness.connect("other");
    for (int message = 0; message < tooManyMessages; ++message)
        player.call(SendMessage, Dictionary{{"a", message}}, 4, 1, Array{42});
    play(recorder, 43);
    play(other, 44);
    platform.kernelTrace.completes = false;
    platform.log.setObserver([this](const LogLine& line) {
        if (line.message != "stopping 44") // it begins to end when the trace does so already
            return;
        EXPECT_EQ(filesWritten(), 0U);
        complete(0);
    });
    const auto traced = submitStop(player, 42);
    const auto next = submitStop(recorder, 43);
    const auto last = submitStop(other, 44);
    platform.workQueues.runAll(); // or the wait for the trace finds nothing left that could end it
    platform.log.setObserver(nullptr);
    EXPECT_EQ(filesWritten(), 1U);
    EXPECT_EQ(player.answersTo(traced), answeredOnce(succeeded));
    EXPECT_EQ(recorder.answersTo(next), answeredOnce(succeeded));
    EXPECT_EQ(other.answersTo(last), answeredOnce(succeeded));
    expectTheSumsToHold();
}

// On internal builds a session has volume events, and a file.
class InternalSessionEndsTest : public SessionEndsTest {
protected:
    InternalSessionEndsTest() : SessionEndsTest(true) { }

    static void playAtThreeVolumes(TestClient& client, std::int64_t reporterID)
    {
        client.call(CreateReportingSession, reporterID);
        client.call(SetServiceType, 7, reporterID);
        client.call(StartReportingSessionForID, reporterID);
        for (int change = 0; change <= 3; ++change)
            client.call(SendMessage,
                        Dictionary{{"session_output_running", change < 3},
                                   {"PomoSessionVolume", change},
                                   {"kestoreporting_timestamp", 10 * change}},
                        4, 1, Array{reporterID});
    }
    // So many that not only the file goes aside.
    static void addManyMessages(TestClient& client, std::int64_t reporterID)
    {
        constexpr int many = 513;
        for (int number = 0; number < many; ++number)
            client.call(SendMessage, Dictionary{{"n", number}}, 4, 1, Array{reporterID});
    }
};

TEST_F(InternalSessionEndsTest, KeepTheOrderOfAStop)
{
    playAtThreeVolumes(player, 42);
    std::vector<std::string> steps;
    platform.log.setObserver([&](const LogLine& line) {
        if (line.level != Debug)
            steps.push_back(line.message.substr(0, line.message.find(": /")));
    });
    platform.analytics.setObserver([&](const std::string& name) { steps.push_back(name); });
    EXPECT_EQ(player.call(StopReportingSessionForID, 42), answeredOnce(succeeded));
    platform.log.setObserver(nullptr);
    platform.analytics.setObserver(nullptr);
    const std::string forAll = "com.quarn.kesto.Volume.Summary";
    const std::string forTheService = "com.quarn.longformaudio.Volume.Summary";
    EXPECT_THAT(steps,
                ElementsAre("sending volume event for reporter 42", forAll, forTheService, forAll, forTheService,
                            forAll, forTheService, "jsonOutput writeToURL", "sending summary event for reporter 42",
                            HasSubstr("sessions for client 1001 : "), HasSubstr("sessions for client 1002 : "),
                            "0 active reporting session(s) []", "stopping 42"));
    expectTheSumsToHold();
}

TEST_F(InternalSessionEndsTest, SendVolumeEventsInSlices)
{
    playAtThreeVolumes(player, 42);
    addManyMessages(player, 42);
    platform.analytics.clear();
    submitStop(player, 42);
    std::vector<std::size_t> sent; // before each answer
    letTimePassWithEach(sessionMessageAccepted, platform);
    auto other = recorder.submit(GetServiceNameForReporterID, {42});
    while (platform.workQueues.runOne())
        if (recorder.answersTo(other) != unanswered && sent.size() < 6) {
            sent.push_back(platform.analytics.payloads("com.quarn.kesto.Volume.Summary").size());
            other = recorder.submit(GetServiceNameForReporterID, {42});
        }
    platform.traceEmitter.setObserver(nullptr);
    EXPECT_THAT(sent, testing::IsSupersetOf({1, 2, 3})) << "the other was served behind each";
    EXPECT_THAT(platform.analytics.payloads("com.quarn.kesto.Volume.Summary"), SizeIs(3));
    EXPECT_THAT(platform.fileSystem.files, SizeIs(1));
}

TEST_F(InternalSessionEndsTest, SendVolumeEventsTogetherWhileItIsQuick)
{
    playAtThreeVolumes(player, 42);
    platform.analytics.clear();
    submitStop(player, 42);
    while (platform.analytics.payloads("com.quarn.kesto.Volume.Summary").empty())
        ASSERT_TRUE(platform.workQueues.runOne());
    EXPECT_THAT(platform.analytics.payloads("com.quarn.kesto.Volume.Summary"), SizeIs(3));
}

TEST_F(InternalSessionEndsTest, KeepTheOrderOfALongStopToo)
{
    playAtThreeVolumes(player, 42);
    addManyMessages(player, 42);
    std::vector<std::string> steps;
    platform.log.setObserver([&](const LogLine& line) {
        if (line.level != Debug)
            steps.push_back(line.message.substr(0, line.message.find_first_of(":,0123456789")));
    });
    EXPECT_EQ(player.call(StopReportingSessionForID, 42), answeredOnce(succeeded));
    platform.log.setObserver(nullptr);
    EXPECT_THAT(steps,
                ElementsAre("sending volume event for reporter ", "jsonOutput writeToURL",
                            "sending summary event for reporter ", "sessions for client ", "sessions for client ", "",
                            "stopping "));
}

TEST_F(InternalSessionEndsTest, GoAsideForEveryFile)
{
    playAtThreeVolumes(player, 42);
    submitStop(player, 42);
    ASSERT_TRUE(platform.workQueues.runOne());
    EXPECT_THAT(platform.fileSystem.files, IsEmpty());
    platform.workQueues.runAll();
    EXPECT_THAT(platform.fileSystem.files, SizeIs(1));
}

// The first 64 KiB of an end's volume events take memory that no budget pays for.
TEST_F(InternalSessionEndsTest, NeedTheMemoryOfAnEndOnlyOnce)
{
    playAtThreeVolumes(player, 42);
    playAtThreeVolumes(recorder, 43);
    addManyMessages(player, 42);
    addManyMessages(recorder, 43);
    int analysed = 0;
    int summarised = 0;
    int most = 0;
    platform.log.setObserver([&](const LogLine& line) {
        analysed += line.message.starts_with("entering createVolumeMessages") ? 1 : 0;
        summarised += line.message.starts_with("jsonOutput writeToURL") ? 1 : 0;
        most = std::max(most, analysed - summarised);
    });
    submitStop(player, 42);
    submitStop(recorder, 43);
    platform.workQueues.runAll();
    platform.log.setObserver(nullptr);
    EXPECT_EQ(summarised, 2);
    EXPECT_EQ(most, 1);
}

} // namespace
