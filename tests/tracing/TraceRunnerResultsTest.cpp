// SPDX-License-Identifier: Apache-2.0
// The end of a runner's work: the results file, the log, and failures of the file.
#include "tracing/RunnerFixture.h"

#include <algorithm>
#include <cstdlib>
#include <iostream>

namespace {

using enum platform::LogLevel;
using support::IsLine;
using support::measurement;
using testing::AllOf;
using testing::Contains;
using testing::Each;
using testing::ElementsAre;
using testing::Field;
using testing::IsEmpty;
using testing::Pair;
using testing::SizeIs;

class RunnerResults : public support::RunnerFixture {
protected:
    // Runs a trace with one interval of each of these lengths.
    void trace(std::initializer_list<std::uint64_t> lengths)
    {
        add(interval("trace", "mix"));
        runner->runTraces();
        for (const std::uint64_t length : lengths)
            emit(length);
        platform.log.clear();
        runner->stopTracingandProcessResults();
    }
};

TEST_F(RunnerResults, GoToAFileInADirectoryThatEverybodyMayWriteTo)
{
    trace({5});
    EXPECT_EQ(KestoReportingTracingLogsDirectory(), "/diagnostics/Audio/Traces");
    EXPECT_THAT(platform.fileSystem.directories,
                ElementsAre(Pair("/diagnostics/Audio", 0777U), Pair("/diagnostics/Audio/Traces", 0777U)));
    ASSERT_THAT(platform.performanceWriter.files(), SizeIs(1));
    EXPECT_EQ(file().path, "/diagnostics/Audio/Traces/tracing_results.qdj");
    EXPECT_EQ(file().project, "KestoReporting");
    EXPECT_EQ(file().version, 4U);
    EXPECT_TRUE(file().closed);
}

TEST_F(RunnerResults, AreWrittenInTheOrderInWhichTheyWereMeasuredAndSummedUpInTheLog)
{
    trace({5, 3, 9});
    EXPECT_THAT(file().measurements, ElementsAre(measurement("mix", 5), measurement("mix", 3), measurement("mix", 9)));
    EXPECT_THAT(platform.log.lines(),
                ElementsAre(IsLine(Info, "kert", "Tearing down trace :  trace"),
                            IsLine(Info, "kert", "Completed trace.... 1,   1 "),
                            IsLine(Info, "kert", "Completed trace....In write perf data.... 1"),
                            IsLine(Info, "kert", "Writing out 3 result for mix, min: 3, max: 9 ")));
    const auto lines = platform.log.lines();
    EXPECT_THAT(lines, Each(Field(&support::LogLine::name, "TraceRunner")));
    EXPECT_EQ(lines.front().file, "TraceRunner.cpp");
    EXPECT_EQ(lines.back().file, "TraceRunnerResults.cpp");
}

TEST_F(RunnerResults, OfATraceAreSummedUpBeforeTheyAreWritten)
{
    std::vector<std::size_t> written;
    platform.log.setObserver([&](const support::LogLine& line) {
        if (line.message.starts_with("Writing out"))
            written.push_back(file().measurements.size());
    });
    trace({5, 3, 9});
    platform.log.setObserver(nullptr);
    EXPECT_THAT(written, ElementsAre(0));
    EXPECT_THAT(file().measurements, SizeIs(3));
}

// --- what is missing in them

using Remarks = std::map<std::string, foundation::Value, std::less<>>;

TEST_F(RunnerResults, SayThatNothingIsMissing)
{
    trace({5});
    EXPECT_EQ(file().remarks, (Remarks{{"lostEvents", 0}, {"lostIntervals", 0}, {"lostPoints", 0}}));
}

TEST_F(RunnerResults, SayHowManyEventsTheTracesLost)
{
    add(interval("one", "first"));
    add(interval("two", "second"));
    runner->runTraces();
    emit(5);
    platform.kernelTrace.lose(1000);
    runner->stopTracingandProcessResults();
    EXPECT_EQ(platform.ledger.account()[ledger::Counter::TraceEventsLost], 2000U);
    EXPECT_EQ(file().remarks, (Remarks{{"lostEvents", 2000}, {"lostIntervals", 0}, {"lostPoints", 0}}));
}

TEST_F(RunnerResults, SayHowManyIntervalsWereNotMeasured)
{
    TraceParams params = interval("trace", "mix");
    params.traceDataParams.resize(600, params.traceDataParams.front());
    add(params);
    runner->runTraces();
    for (int count = 0; count < 50'000; ++count)
        emit(1);
    runner->stopTracingandProcessResults();
    // Each has 50,000 results, and reads 100,000 events.
    EXPECT_EQ(file().remarks, (Remarks{{"lostEvents", 0}, {"lostIntervals", 580}, {"lostPoints", 0}}));
    EXPECT_EQ(platform.ledger.account()[ledger::Counter::TraceIntervalsLost], 580U);
}

TEST_F(RunnerResults, SayWhatOfTheParametersWasNotRead)
{
    TraceParams params = interval("trace", "mix");
    params.leftOut = 7;
    params.problem = "Reading from plist file failed with error: Permission denied";
    add(params);
    platform.kernelTrace.startError = 24;
    runner->runTraces();
    runner->stopTracingandProcessResults();
    EXPECT_EQ(platform.ledger.account()[ledger::Counter::TracePointsLost], 7U);
    EXPECT_EQ(file().remarks,
              (Remarks{{"lostEvents", 0},
                       {"lostIntervals", 0},
                       {"lostPoints", 7},
                       {"problem", "Reading from plist file failed with error: Permission denied"}}));
}

TEST_F(RunnerResults, SayWhyATraceCouldNotBeRun)
{
    const auto problemOf = [this](std::string name) {
        runner = std::make_unique<TraceRunner>();
        add(interval(std::move(name), "mix"));
        runner->runTraces();
        runner->stopTracingandProcessResults();
        return platform.performanceWriter.files().back()->remarks["problem"];
    };
    platform.kernelTrace.startError = 24;
    EXPECT_EQ(problemOf("one"), foundation::Value("Could not start ktrace session, error: 24"));
    platform.kernelTrace.filterError = 22;
    EXPECT_EQ(problemOf("two"), foundation::Value("Could not set up ktrace range, error: 22"));
    platform.kernelTrace.available = false;
    EXPECT_EQ(problemOf("three"), foundation::Value("the kernel trace is not available; three collects no events"));
}

TEST_F(RunnerResults, OfEachTraceAreOrderedByName)
{
    add({.name = "trace",
         .traceDataParams = {{"render", TraceDataParams::interval, beginCode, endCode, false},
                             {"Mix", TraceDataParams::interval, beginCode, endCode, true},
                             {"capture", TraceDataParams::interval, beginCode, endCode, false},
                             {"render", TraceDataParams::interval, beginCode, endCode, true}}});
    runner->runTraces();
    emit(4);
    emit(2);
    runner->stopTracingandProcessResults();
    EXPECT_THAT(file().measurements,
                ElementsAre(measurement("Mix", 4), measurement("Mix", 2), measurement("capture", 4),
                            measurement("capture", 2), measurement("render", 4), measurement("render", 2),
                            measurement("render", 4), measurement("render", 2)));
    const auto lines = messages();
    EXPECT_THAT(std::vector(lines.end() - 3, lines.end()),
                ElementsAre("Writing out 2 result for Mix, min: 2, max: 4 ",
                            "Writing out 2 result for capture, min: 2, max: 4 ",
                            "Writing out 4 result for render, min: 2, max: 4 "));
}

TEST_F(RunnerResults, OfSeveralTracesAreOrderedByTheIdentityOfTheTracesNotByWhenTheyWereRun)
{
    constexpr int traces = 20;
    for (int number = 0; number < traces; ++number)
        add(interval(std::to_string(number), "of trace " + std::to_string(number)));
    std::vector<const Trace*> byIdentity;
    for (const auto& trace : runner->traces())
        byIdentity.push_back(trace.get());
    std::ranges::sort(byIdentity, std::less<>());

    runner->runTraces();
    emit(1);
    runner->stopTracingandProcessResults();
    ASSERT_THAT(file().measurements, SizeIs(traces));
    for (std::size_t place = 0; place < byIdentity.size(); ++place)
        EXPECT_EQ(file().measurements[place].name, "of trace " + byIdentity[place]->name());
}

TEST_F(RunnerResults, AreFloatsOf64Bits)
{
    trace({(std::uint64_t{1} << 53) + 1});
    EXPECT_THAT(file().measurements, ElementsAre(measurement("mix", 9'007'199'254'740'992.0)));
    EXPECT_THAT(messages(), Contains("Writing out 1 result for mix, min: 9007199254740993, max: 9007199254740993 "));
}

TEST_F(RunnerResults, MakeAFileWithoutRecordsWhenNothingWasMeasured)
{
    trace({});
    EXPECT_THAT(file().measurements, IsEmpty());
    EXPECT_TRUE(file().closed);
    EXPECT_THAT(messages(), Contains("Completed trace....In write perf data.... 1"));
}

TEST_F(RunnerResults, AreWrittenAllTheSameWhenTheDirectoryCannotBeMade)
{
    platform.fileSystem.directories = {{"/diagnostics/Audio/Traces", 0777}}; // the folder exists
    platform.fileSystem.directoryError = std::make_error_code(std::errc::permission_denied);
    trace({5});
    EXPECT_THAT(platform.log.lines(),
                Contains(IsLine(Error, "kert",
                                "can't create logging directory at /diagnostics/Audio/Traces: Permission denied")));
    EXPECT_THAT(file().measurements, SizeIs(1));
}

class RunnerResultsDeathTest : public RunnerResults {
protected:
    void traceAloud()
    {
        platform.log.setObserver([](const support::LogLine& line) {
            std::cerr << platform::name(line.level) << ' ' << line.tag << ' ' << line.message << '\n';
        });
        trace({5});
    }
};

TEST_F(RunnerResultsDeathTest, EndTheProcessWithStatusOneWhenTheFileCannotBeOpened)
{
    platform.performanceWriter.canOpen = false;
    EXPECT_EXIT(traceAloud(), testing::ExitedWithCode(1),
                "info kert Completed trace....In write perf data.... 1\ninfo kert Failed to open quilldat writer\n$");
}

TEST_F(RunnerResultsDeathTest, EndTheProcessAtOnceWithoutWhatIsLeftForItsExit)
{
    platform.performanceWriter.canOpen = false;
    const auto traceWithAnExitHandler = [this] {
        std::atexit([] { std::_Exit(7); });
        platform.analytics.setReportingObserver([] { std::cerr << "losses"; });
        trace({5});
    };
    EXPECT_EXIT(traceWithAnExitHandler(), testing::ExitedWithCode(1), "losses") << "other threads run then";
}

TEST_F(RunnerResultsDeathTest, EndTheProcessWithStatusOneAfterSayingThatTheDirectoryCannotBeMade)
{
    platform.fileSystem.directoryError = std::make_error_code(std::errc::read_only_file_system);
    EXPECT_EXIT(traceAloud(), testing::ExitedWithCode(1),
                "error kert can't create logging directory at /diagnostics/Audio/Traces: Read-only file system\n"
                "info kert Failed to open quilldat writer\n$");
}

} // namespace
