// SPDX-License-Identifier: Apache-2.0
// Running traces: their set-up, their events, and the order of the steps.
#include "tracing/RunnerFixture.h"

namespace {

using enum platform::LogLevel;
using support::eventOf;
using support::IsLine;
using support::measurement;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;
using testing::UnorderedElementsAre;

class Runner : public support::RunnerFixture { };

TEST_F(Runner, IsMadeWithoutTracesAndWithAQueueOfItsOwn)
{
    EXPECT_EQ(runner->getNumTraces(), 0U);
    EXPECT_EQ(runner->completedTraceCount(), 0U);
    EXPECT_EQ(runner->getResultsVersion(), 4U);
    EXPECT_EQ(TraceRunner::resultsFileName, "tracing_results.qdj");
    EXPECT_EQ(TraceRunner::projectName, "KestoReporting");
    EXPECT_THAT(platform.workQueues.made(),
                ElementsAre(support::FakeWorkQueues::MadeQueue{"Tracing Queue", {}, false}));
    EXPECT_THAT(platform.log.lines(), IsEmpty());
}

TEST_F(Runner, IsCountedAsLongAsItLives)
{
    EXPECT_EQ(TraceRunner::numberOfRunners(), 1U);
    {
        const TraceRunner other;
        EXPECT_EQ(TraceRunner::numberOfRunners(), 2U);
    }
    EXPECT_EQ(TraceRunner::numberOfRunners(), 1U);
}

// --- making traces

TEST_F(Runner, MakesNoTraceWithoutParametersAndSaysSo)
{
    runner->createTraceFromTraceParams(nullptr);
    EXPECT_EQ(runner->getNumTraces(), 0U);
    EXPECT_THAT(platform.log.lines(), ElementsAre(IsLine(Default, "kert", "Attempted to add nullptr to trace runner")));
    EXPECT_EQ(platform.log.lines()[0].name, "TraceRunner");
}

TEST_F(Runner, MakesAnIntervalOfEveryPointOfAnyType)
{
    add({.name = "all",
         .traceDataParams = {{"interval", TraceDataParams::interval, 1, 2, true},
                             {"impulse", TraceDataParams::impulse, 3, 99, false},
                             {"level", TraceDataParams::level, 4, 2, true}}});
    ASSERT_EQ(runner->getNumTraces(), 1U);
    const Trace& trace = *runner->traces()[0];
    EXPECT_EQ(trace.name(), "all");
    EXPECT_TRUE(trace.collectKernelTrace());
    ASSERT_THAT(trace.data(), SizeIs(3));

    struct Expected {
        std::string name;
        std::uint32_t begin;
        std::uint32_t end;
        bool byThread;
    };
    const std::vector<Expected> expected{{"interval", 1, 2, true}, {"impulse", 3, 3, false}, {"level", 4, 2, true}};
    for (std::size_t number = 0; number < expected.size(); ++number) {
        const auto* const interval = dynamic_cast<const TraceInterval*>(trace.data()[number].get());
        ASSERT_NE(interval, nullptr);
        EXPECT_EQ(interval->name(), expected[number].name);
        EXPECT_EQ(interval->beginCode(), expected[number].begin);
        EXPECT_EQ(interval->endCode(), expected[number].end);
        EXPECT_EQ(interval->matchByThread(), expected[number].byThread);
    }
}

TEST_F(Runner, CollectsKernelEventsForTracesOfAnyTypeButSignpost)
{
    add(interval("kernel", "interval"));
    add(signpost("signpost"));
    EXPECT_TRUE(runner->traces()[0]->collectKernelTrace());
    EXPECT_FALSE(runner->traces()[1]->collectKernelTrace());
}

// --- running

TEST_F(Runner, SetsUpAndStartsEachKernelTraceInOrderAndSaysSo)
{
    add(interval("one", "interval"));
    add(signpost("two"));
    add(interval("three", "interval"));
    runner->runTraces();
    EXPECT_THAT(
        platform.log.lines(),
        ElementsAre(IsLine(Info, "kert", "Number of traces to perform: 3"),
                    IsLine(Info, "kert", "Performing trace : one"), IsLine(Info, "kert", "Setting up tracing: one"),
                    IsLine(Info, "kert", "Starting tracing: one"), IsLine(Info, "kert", "Performing trace : two"),
                    IsLine(Info, "kert", "Performing trace : three"), IsLine(Info, "kert", "Setting up tracing: three"),
                    IsLine(Info, "kert", "Starting tracing: three")));
    ASSERT_THAT(platform.kernelTrace.sessions(), SizeIs(2)) << "none for the signpost trace";
    for (const auto& each : platform.kernelTrace.sessions()) {
        EXPECT_TRUE(each->wallTimes);
        EXPECT_TRUE(each->started);
        ASSERT_THAT(each->filters, SizeIs(1));
        EXPECT_EQ(each->filters[0].firstCode, 0x21040000U);
        EXPECT_EQ(each->filters[0].lastCode, 0x2104408AU);
    }
}

TEST_F(Runner, MeasuresEventsOfBothEndsOfTheRangeAndNoneBeyond)
{
    add({.name = "range",
         .traceDataParams = {{"within", TraceDataParams::interval, 0x21040000, 0x2104408A, false},
                             {"below", TraceDataParams::interval, 0x2103FFFF, 0x2104408A, false},
                             {"above", TraceDataParams::interval, 0x21040000, 0x2104408B, false}}});
    runner->runTraces();
    for (const auto& event :
         {eventOf(0x2103FFFF, 1), eventOf(0x21040000, 2), eventOf(0x2104408A, 5), eventOf(0x2104408B, 9)})
        platform.kernelTrace.deliver(event);
    runner->stopTracingandProcessResults();
    EXPECT_THAT(file().measurements, ElementsAre(measurement("within", 3)));
}

TEST_F(Runner, DeliversEveryEventToEachOfItsTraces)
{
    add(interval("one", "first"));
    add(interval("two", "second"));
    runner->runTraces();
    emit(5);
    runner->stopTracingandProcessResults();
    EXPECT_THAT(file().measurements, UnorderedElementsAre(measurement("first", 5), measurement("second", 5)));
}

TEST_F(Runner, ProcessesAllEventsThatWereDeliveredBeforeItsTraceEnded)
{
    constexpr std::uint64_t count = 20'000; // more than the first room
    add(interval("long", "interval"));
    runner->runTraces();
    for (std::uint64_t length = 1; length <= count; ++length)
        emit(length);
    runner->stopTracingandProcessResults();
    ASSERT_THAT(file().measurements, SizeIs(count));
    EXPECT_EQ(file().measurements.front(), measurement("interval", 1));
    EXPECT_EQ(file().measurements.back(), measurement("interval", count));
}

TEST_F(Runner, ConvertsTimesByTheSessionThatDeliveredThem)
{
    platform.kernelTrace.toNanoseconds = [](std::uint64_t timestamp) { return 10 * timestamp; };
    add(interval("ticks", "interval"));
    runner->runTraces();
    emit(5);
    runner->stopTracingandProcessResults();
    EXPECT_THAT(file().measurements, ElementsAre(measurement("interval", 50)));
}

// --- stopping

TEST_F(Runner, TearsDownOneTraceAfterTheOtherAndSaysHowManyAreComplete)
{
    add(interval("one", "interval"));
    add(interval("two", "interval"));
    runner->runTraces();
    platform.log.clear();

    std::vector<std::string> steps;
    platform.log.setObserver([&](const support::LogLine& line) {
        steps.push_back(line.message + " ended " + std::to_string(session(0).ended) + std::to_string(session(1).ended)
                        + " destroyed " + std::to_string(session(0).destroyed) + std::to_string(session(1).destroyed));
    });
    runner->stopTracingandProcessResults();
    platform.log.setObserver(nullptr);
    EXPECT_THAT(steps,
                ElementsAre("Tearing down trace :  one ended 00 destroyed 00",
                            "Completed trace.... 1,   2  ended 10 destroyed 10",
                            "Tearing down trace :  two ended 10 destroyed 10",
                            "Completed trace.... 2,   2  ended 11 destroyed 11",
                            "Completed trace....In write perf data.... 2 ended 11 destroyed 11"));
    for (const support::LogLine& line : platform.log.lines())
        EXPECT_EQ(line.level, Info);
    EXPECT_EQ(runner->completedTraceCount(), 2U);
}

TEST_F(Runner, CompletesASignpostTraceAtOnceAndStoresNoResultsForIt)
{
    add(signpost("signpost"));
    runner->runTraces();
    EXPECT_THAT(platform.kernelTrace.sessions(), IsEmpty());
    runner->stopTracingandProcessResults();
    EXPECT_EQ(runner->completedTraceCount(), 1U);
    EXPECT_THAT(messages(),
                ElementsAre("Number of traces to perform: 1", "Performing trace : signpost",
                            "Tearing down trace :  signpost", "Completed trace.... 1,   1 ",
                            "Completed trace....In write perf data.... 0"));
    EXPECT_THAT(file().measurements, IsEmpty());
}

TEST_F(Runner, WritesAnEmptyFileWithoutTraces)
{
    runner->runTraces();
    runner->stopTracingandProcessResults();
    EXPECT_THAT(platform.log.lines(),
                ElementsAre(IsLine(Info, "kert", "Number of traces to perform: 0"),
                            IsLine(Info, "kert", "Completed trace....In write perf data.... 0")));
    EXPECT_THAT(file().measurements, IsEmpty());
    EXPECT_TRUE(file().closed);
}

TEST_F(Runner, CompletesATraceThatWasNeverRun)
{
    add(interval("one", "interval"));
    runner->stopTracingandProcessResults();
    EXPECT_EQ(runner->completedTraceCount(), 1U);
    EXPECT_THAT(platform.kernelTrace.sessions(), IsEmpty());
    EXPECT_THAT(messages(),
                ElementsAre("Tearing down trace :  one", "Completed trace.... 1,   1 ",
                            "Completed trace....In write perf data.... 1"));
    EXPECT_THAT(file().measurements, IsEmpty());
    EXPECT_TRUE(file().closed);
}

// --- failures

TEST_F(Runner, SaysThatARangeCannotBeSetUpAndStartsAllTheSame)
{
    platform.kernelTrace.filterError = 22;
    add(interval("one", "interval"));
    runner->runTraces();
    EXPECT_THAT(platform.log.lines().back(), IsLine(Error, "kert", "Could not set up ktrace range, error: 22"));
    EXPECT_TRUE(session(0).started);
    runner->stopTracingandProcessResults();
    EXPECT_EQ(runner->completedTraceCount(), 1U);
}

TEST_F(Runner, SaysThatATraceCannotBeStartedAndEndsItAllTheSame)
{
    platform.kernelTrace.startError = 16;
    add(interval("one", "interval"));
    runner->runTraces();
    EXPECT_THAT(platform.log.lines().back(), IsLine(Error, "kert", "Could not start ktrace session, error: 16"));
    emit(5);
    runner->stopTracingandProcessResults();
    EXPECT_TRUE(session(0).ended);
    EXPECT_TRUE(session(0).destroyed);
    EXPECT_EQ(runner->completedTraceCount(), 1U);
    EXPECT_THAT(file().measurements, IsEmpty());
}

TEST_F(Runner, WaitsForeverForATraceThatIsNeverCompleted)
{
    platform.kernelTrace.completes = false;
    add(interval("one", "interval"));
    runner->runTraces();
    EXPECT_THROW(runner->stopTracingandProcessResults(), std::logic_error) << "the fake's way to wait forever";
    EXPECT_THAT(platform.performanceWriter.files(), IsEmpty());
}

TEST_F(Runner, CompletesATraceWithoutAKernelTrace)
{
    platform.kernelTrace.available = false;
    add(interval("one", "interval"));
    runner->runTraces();
    EXPECT_THAT(platform.log.lines().at(3),
                IsLine(Error, "kert", "the kernel trace is not available; one collects no events"));
    runner->stopTracingandProcessResults();
    EXPECT_EQ(runner->completedTraceCount(), 1U);
    EXPECT_THAT(file().measurements, IsEmpty());
}

TEST_F(Runner, SaysHowManyEventsThereWasNoMemoryFor)
{
    add(interval("one", "interval"));
    runner->runTraces();
    TraceEvents greedy;
    while (greedy.lost() == 0)
        greedy.append({});
    for (std::size_t count = 0; count < TraceEvents::firstRoom / 2 + 3; ++count)
        emit(1);
    runner->stopTracingandProcessResults();
    EXPECT_THAT(file().measurements, SizeIs(TraceEvents::firstRoom / 2));
    EXPECT_THAT(platform.log.lines(),
                testing::Contains(IsLine(Error, "kert", "trace one lost 6 events for lack of memory")));
    EXPECT_EQ(file().remarks.at("lostEvents"), foundation::Value(6));
}

TEST_F(Runner, LetsGoOfItsTracesWhenItIsDestroyedWhileTheyRun)
{
    add(interval("one", "interval"));
    runner->runTraces();
    platform.log.clear();
    emit(5);
    runner.reset();
    EXPECT_TRUE(session(0).destroyed);
    platform.workQueues.runAll(); // events that were delivered before still come
    EXPECT_THAT(platform.log.lines(), IsEmpty());
    EXPECT_THAT(platform.performanceWriter.files(), IsEmpty());
}

} // namespace
