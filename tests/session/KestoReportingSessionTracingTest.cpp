// SPDX-License-Identifier: Apache-2.0
// The trace of a session: when it starts and stops, on which thread, and its results.
#include "session/KestoReportingSession.h"
#include "support/TestPlatform.h"
#include "tracing/TraceParams.h"
#include "tracing/TraceRunner.h"

#include <gmock/gmock.h>

namespace {

using enum platform::LogLevel;
using foundation::Dictionary;
using foundation::Value;
using support::IsLine;
using testing::Contains;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

constexpr AudioServiceType test = 11;
constexpr std::string_view fileKey = "KestoReportingPellorinPlistFilePath";
constexpr std::string_view typeKey = "KestoReportingTraceType";
constexpr std::string_view file = "/traces/mix.plist";
constexpr std::string_view parameters = R"(<?xml version="1.0" encoding="UTF-8"?>
<plist version="1.0"><dict><key>Children</key><array><dict>
    <key>Name</key><string>startup</string>
    <key>Children</key><array><dict>
        <key>Name</key><string>mix</string>
        <key>Type</key><string>Interval</string>
        <key>KTraceCodeBegin</key><string>0x21040010</string>
        <key>KTraceCodeEnd</key><string>0x21040014</string>
        <key>EventsMatchedBy</key><string>Thread</string>
    </dict></array>
</dict></array></dict></plist>)";

class SessionTracing : public testing::Test {
protected:
    SessionTracing()
    {
        platform.featureFlags.enable("Sonalis", "Tracing");
        platform.fileSystem.files.emplace(file, parameters);
        session->setServiceType(test);
        session->setConfiguration(Dictionary{{fileKey, file}});
        platform.log.clear();
        platform.traceEmitter.take();
    }

    // Emits an interval of that length.
    void emit(std::uint64_t length)
    {
        platform.kernelTrace.deliver({.timestamp = now, .threadID = 1, .eventCode = 0x21040010});
        platform.kernelTrace.deliver({.timestamp = now += length, .threadID = 1, .eventCode = 0x21040014});
    }
    [[nodiscard]] std::size_t tracesStarted() const { return platform.kernelTrace.sessions().size(); }
    [[nodiscard]] std::size_t filesWritten() const { return platform.performanceWriter.files().size(); }
    // The log lines of sessions alone.
    [[nodiscard]] std::vector<support::LogLine> lines() const { return platform.log.lines("kerr"); }
    void expectNoTraceIsStarted()
    {
        session->start();
        EXPECT_TRUE(session->started());
        EXPECT_FALSE(session->startedTracing());
        EXPECT_EQ(session->traceRunner(), nullptr);
        EXPECT_EQ(tracesStarted(), 0U);
        EXPECT_THAT(lines(), ElementsAre(IsLine(Debug, "kerr", "starting session owned by 42")));
        session->stop(platform.turn);
        EXPECT_FALSE(session->started());
        EXPECT_EQ(filesWritten(), 0U);
    }

    std::uint64_t now = 1000; // on the kernel's clock
    support::TestPlatform platform;
    std::shared_ptr<KestoReportingSession> session =
        std::make_shared<KestoReportingSession>(42, std::vector<std::int32_t>{7});
};

// --- setting up

TEST_F(SessionTracing, IsNotThereAtFirst)
{
    EXPECT_FALSE(session->startedTracing());
    EXPECT_EQ(session->tracingFileName(), std::nullopt);
    EXPECT_EQ(session->traceRunner(), nullptr);
    EXPECT_EQ(session->traceParams(), nullptr);
}

TEST_F(SessionTracing, IsSetUpFromAParametersFileWithoutBeingStarted)
{
    session->setupTracing(std::string(file));
    EXPECT_EQ(session->tracingFileName(), file);
    ASSERT_NE(session->traceParams(), nullptr);
    EXPECT_EQ(session->traceParams()->name, "startup");
    ASSERT_NE(session->traceRunner(), nullptr);
    ASSERT_EQ(session->traceRunner()->getNumTraces(), 1U);
    EXPECT_EQ(session->traceRunner()->traces()[0]->name(), "startup");
    EXPECT_FALSE(session->startedTracing());
    EXPECT_EQ(tracesStarted(), 0U);
    EXPECT_THAT(lines(), ElementsAre(IsLine(Info, "kerr", "Setting up tracing for test")));
    EXPECT_EQ(lines()[0].name, "KestoReportingSession");
}

TEST_F(SessionTracing, IsNotSetUpWithoutAFileWhichIsSaid)
{
    session->setupTracing(std::string(file));
    const TraceRunner* const runner = session->traceRunner();
    platform.log.clear();
    session->setupTracing(std::nullopt);
    EXPECT_EQ(session->tracingFileName(), file) << "nothing changes";
    EXPECT_EQ(session->traceRunner(), runner);
    EXPECT_THAT(lines(), ElementsAre(IsLine(Error, "kerr", "TracefileName empty. Failed to setup tracing")));
}

TEST_F(SessionTracing, ThatIsSetUpInThePlaceOfARunningOneIsNotStarted)
{
    session->start();
    EXPECT_TRUE(session->startedTracing());
    session->setupTracing(std::string(file));
    EXPECT_FALSE(session->startedTracing());
    EXPECT_EQ(tracesStarted(), 1U);
    session->stop(platform.turn);
    EXPECT_EQ(filesWritten(), 0U) << "there is nothing to stop";
}

// --- starting

TEST_F(SessionTracing, StartsWithTheSessionWhenAllConditionsHold)
{
    session->start();
    EXPECT_TRUE(session->startedTracing());
    EXPECT_EQ(session->tracingFileName(), file);
    EXPECT_EQ(tracesStarted(), 1U);
    EXPECT_TRUE(platform.kernelTrace.sessions()[0]->started);
    EXPECT_THAT(lines(),
                ElementsAre(IsLine(Debug, "kerr", "starting session owned by 42"),
                            IsLine(Debug, "kerr", "Got the tracefile /traces/mix.plist, setting up trace"),
                            IsLine(Info, "kerr", "Setting up tracing for test")));
}

TEST_F(SessionTracing, StartsBehindTheMarkerOfTheSessionsStart)
{
    std::vector<std::string> steps;
    platform.traceEmitter.setObserver([&](std::uint32_t code) { steps.push_back(std::to_string(code)); });
    platform.log.setObserver([&](const support::LogLine& line) { steps.push_back(line.message); });
    session->start();
    platform.traceEmitter.setObserver(nullptr);
    platform.log.setObserver(nullptr);
    EXPECT_THAT(steps,
                ElementsAre("starting session owned by 42", std::to_string(0x2104482C),
                            "Got the tracefile /traces/mix.plist, setting up trace",
                            testing::StartsWith("Loading tracepoint"), "Setting up tracing for test",
                            "Number of traces to perform: 1", "Performing trace : startup",
                            "Setting up tracing: startup", "Starting tracing: startup"));
}

TEST_F(SessionTracing, StartsWithTheVeryObjectOfTheTraceType)
{
    session->setConfiguration(Dictionary{{typeKey, KestoReportingTraceTypeKtrace}});
    session->start();
    EXPECT_TRUE(session->startedTracing());
}

TEST_F(SessionTracing, DoesNotStartWithATraceTypeThatOnlyHasTheSameText)
{
    session->setConfiguration(Dictionary{{typeKey, "ktrace"}});
    EXPECT_EQ(*session->configuration().find(typeKey), Value(KestoReportingTraceTypeKtrace));
    expectNoTraceIsStarted();
}

TEST_F(SessionTracing, DoesNotStartWithATraceTypeThatIsNoText)
{
    session->setConfiguration(Dictionary{{typeKey, 7}});
    expectNoTraceIsStarted();
}

TEST_F(SessionTracing, TakesANullForNoValue)
{
    session->setConfiguration(Dictionary{{typeKey, Value()}, {fileKey, Value()}});
    expectNoTraceIsStarted();
    session->setConfiguration(Dictionary{{typeKey, Value()}, {fileKey, file}});
    session->start();
    EXPECT_TRUE(session->startedTracing());
}

TEST_F(SessionTracing, DoesNotStartWhileTheFeatureIsOff)
{
    platform.featureFlags.disable("Sonalis", "Tracing");
    expectNoTraceIsStarted();
}

TEST_F(SessionTracing, DoesNotStartOnASystemThatCannotTrace)
{
    EXPECT_TRUE(session->mayBeTraced());
    platform.kernelTrace.available = false;
    EXPECT_FALSE(session->mayBeTraced());
    expectNoTraceIsStarted();
}

TEST_F(SessionTracing, DoesNotStartInASessionOfAnotherServiceType)
{
    for (const AudioServiceType type : {0, 10, 12, 65535}) {
        session->setServiceType(type);
        platform.log.clear();
        expectNoTraceIsStarted();
    }
}

TEST_F(SessionTracing, DoesNotStartWithoutAParametersFile)
{
    session = std::make_shared<KestoReportingSession>(42, std::vector<std::int32_t>{7});
    session->setServiceType(test);
    platform.log.clear();
    expectNoTraceIsStarted();
    EXPECT_EQ(session->tracingFileName(), std::nullopt);
}

TEST_F(SessionTracing, StartsWithoutIntervalsWhenTheFileCannotBeRead)
{
    session->setConfiguration(Dictionary{{fileKey, "/traces/missing.plist"}});
    session->start();
    EXPECT_TRUE(session->startedTracing());
    EXPECT_EQ(tracesStarted(), 1U);
    EXPECT_EQ(session->traceParams()->name, "");
    emit(5);
    session->stop(platform.turn);
    ASSERT_EQ(filesWritten(), 1U);
    EXPECT_THAT(platform.performanceWriter.files()[0]->measurements, IsEmpty());
}

TEST_F(SessionTracing, StartsWithAPathAsLongAsPathsMayBe)
{
    session->setConfiguration(Dictionary{{fileKey, std::string(4095, '/')}});
    session->start();
    EXPECT_TRUE(session->startedTracing());
}

TEST_F(SessionTracing, DoesNotStartWithATextThatIsTooLongForAPathWhichIsSaid)
{
    session->setConfiguration(Dictionary{{fileKey, std::string(4096, '/')}});
    platform.log.clear();
    session->start();
    EXPECT_FALSE(session->startedTracing());
    EXPECT_EQ(session->tracingFileName(), std::nullopt);
    EXPECT_EQ(tracesStarted(), 0U);
    EXPECT_THAT(lines(),
                ElementsAre(IsLine(Debug, "kerr", "starting session owned by 42"),
                            IsLine(Error, "kerr",
                                   "session 42 is not traced: the path of its parameters file has 4096 bytes; a path "
                                   "has at most 4095")));
}

TEST_F(SessionTracing, IsNotStartedAnewByASecondStart)
{
    session->start();
    session->start();
    EXPECT_EQ(tracesStarted(), 1U);
}

TEST_F(SessionTracing, DoesNotStartWhenTooManyOthersRunWhichIsSaid)
{
    std::vector<std::shared_ptr<KestoReportingSession>> others;
    for (std::size_t number = 0; number < TraceRunner::mostAtOnce; ++number) {
        others.push_back(std::make_shared<KestoReportingSession>(number, std::vector<std::int32_t>{8}));
        others.back()->setServiceType(test);
        others.back()->setConfiguration(Dictionary{{fileKey, file}});
        others.back()->start();
        ASSERT_TRUE(others.back()->startedTracing());
    }
    platform.log.clear();
    session->start();
    EXPECT_FALSE(session->startedTracing());
    EXPECT_THAT(lines(),
                ElementsAre(IsLine(Debug, "kerr", "starting session owned by 42"),
                            IsLine(Error, "kerr", "session 42 is not traced: 64 other sessions are")));
    session->stop(platform.turn);

    others.pop_back();
    session->start();
    EXPECT_TRUE(session->startedTracing());
}

TEST_F(SessionTracing, DoesNotStartWithoutAThreadForItWhichIsSaid)
{
    platform.workQueues.hasThreads = false;
    session->start();
    EXPECT_TRUE(session->started());
    EXPECT_FALSE(session->startedTracing());
    EXPECT_EQ(session->tracingFileName(), std::nullopt);
    EXPECT_EQ(session->traceParams(), nullptr);
    EXPECT_EQ(session->traceRunner(), nullptr);
    EXPECT_EQ(TraceRunner::numberOfRunners(), 0U);
    EXPECT_EQ(tracesStarted(), 0U);
    EXPECT_THAT(lines(),
                ElementsAre(IsLine(Debug, "kerr", "starting session owned by 42"),
                            IsLine(Debug, "kerr", "Got the tracefile /traces/mix.plist, setting up trace"),
                            IsLine(Error, "kerr", "session 42 is not traced: Resource temporarily unavailable")));
    platform.log.clear();
    session->stop(platform.turn);
    EXPECT_FALSE(session->started());
    EXPECT_EQ(filesWritten(), 0U);
    for (const support::LogLine& line : lines())
        EXPECT_NE(line.level, Error) << line.message;

    platform.workQueues.hasThreads = true;
    session->start();
    EXPECT_TRUE(session->startedTracing()) << "the next run may have one";
}

// --- stopping

TEST_F(SessionTracing, WritesItsResultsWhenTheSessionStops)
{
    session->start();
    emit(5);
    emit(7);
    session->stop(platform.turn);
    EXPECT_FALSE(session->startedTracing());
    ASSERT_EQ(filesWritten(), 1U);
    const auto& results = *platform.performanceWriter.files()[0];
    ASSERT_THAT(results.measurements, SizeIs(2));
    EXPECT_EQ(results.measurements[0].name, "mix");
    EXPECT_EQ(results.measurements[0].value, 5);
    EXPECT_EQ(results.measurements[1].value, 7);
    EXPECT_TRUE(results.closed);
    EXPECT_EQ(TraceRunner::numberOfRunners(), 0U) << "nothing of it is left";
    EXPECT_EQ(session->tracingFileName(), std::nullopt);
}

TEST_F(SessionTracing, StopsBehindTheSummaryAndBeforeTheMessagesAreDropped)
{
    session->start();
    session->sendMessage(platform.turn.tally, Dictionary{{"session_output_running", true}}, AudioEventCategory{4},
                         AudioEventType{1}, nullptr);
    platform.log.clear();
    std::vector<std::string> steps;
    platform.log.setObserver([&](const support::LogLine& line) {
        if (line.level != Debug)
            steps.push_back(line.message + (session->nestedAggregatedPayloadData() ? "" : " without messages"));
    });
    session->stop(platform.turn);
    platform.log.setObserver(nullptr);
    EXPECT_THAT(steps,
                ElementsAre("sending summary event for reporter 42", "Tearing down trace :  startup",
                            "Completed trace.... 1,   1 ", "Completed trace....In write perf data.... 1"));
}

TEST_F(SessionTracing, RunsAnewInEveryRunOfTheSession)
{
    for (const std::uint64_t length : {5U, 7U}) {
        session->start();
        EXPECT_TRUE(session->startedTracing());
        emit(length);
        session->stop(platform.turn);
    }
    ASSERT_EQ(filesWritten(), 2U);
    EXPECT_EQ(platform.performanceWriter.files()[0]->measurements.at(0).value, 5);
    EXPECT_EQ(platform.performanceWriter.files()[1]->measurements.at(0).value, 7);
    EXPECT_THAT(platform.performanceWriter.files()[1]->measurements, SizeIs(1));
}

class SessionTracingThatIsNotStopped : public SessionTracing {
protected:
    // It goes on after the session's stop, and after its next start.
    void expectItGoesOn()
    {
        for (int run = 0; run < 2; ++run) {
            session->stop(platform.turn);
            EXPECT_FALSE(session->started());
            EXPECT_TRUE(session->startedTracing());
            EXPECT_FALSE(platform.kernelTrace.sessions()[0]->ended);
            EXPECT_EQ(filesWritten(), 0U);
            session->start();
        }
        EXPECT_EQ(tracesStarted(), 1U);
    }
};

TEST_F(SessionTracingThatIsNotStopped, GoesOnWhenTheTraceTypeHasBecomeAnother)
{
    session->start();
    session->setConfiguration(Dictionary{{typeKey, "ktrace"}});
    expectItGoesOn();
}

TEST_F(SessionTracingThatIsNotStopped, GoesOnWhenTheFeatureHasBeenSwitchedOffAndStopsOnceItIsOnAgain)
{
    session->start();
    platform.featureFlags.disable("Sonalis", "Tracing");
    expectItGoesOn();
    platform.featureFlags.enable("Sonalis", "Tracing");
    session->stop(platform.turn);
    EXPECT_FALSE(session->startedTracing());
    EXPECT_EQ(filesWritten(), 1U);
}

TEST_F(SessionTracingThatIsNotStopped, GoesOnWhenTheServiceTypeHasChangedAndStopsOnceItIsTestAgain)
{
    session->start();
    session->setServiceType(3);
    expectItGoesOn();
    session->setServiceType(test);
    session->stop(platform.turn);
    EXPECT_FALSE(session->startedTracing());
    EXPECT_EQ(filesWritten(), 1U);
}

TEST_F(SessionTracing, GoesWithTheSessionAndWritesNothingThen)
{
    session->start();
    emit(5);
    session.reset();
    EXPECT_TRUE(platform.kernelTrace.sessions()[0]->destroyed);
    EXPECT_EQ(TraceRunner::numberOfRunners(), 0U);
    platform.workQueues.runAll();
    EXPECT_EQ(filesWritten(), 0U);
}

} // namespace
