// SPDX-License-Identifier: Apache-2.0
// Which events form intervals, and the log lines about the others.
#include "tracing/TraceInterval.h"
#include "support/TestPlatform.h"
#include "tracing/TraceEventsOf.h"

#include <cmath>
#include <gmock/gmock.h>
#include <limits>
#include <rapidcheck/gtest.h>

namespace {

using enum platform::LogLevel;
using support::eventOf;
using support::IsLine;
using testing::ElementsAre;
using testing::IsEmpty;
using Events = std::vector<trace_point>;

constexpr std::uint32_t beginCode = 0x21040000;
constexpr std::uint32_t endCode = 0x21040004;
constexpr std::uint32_t otherCode = 0x21040008;

trace_point begin(std::uint64_t timestamp, std::uint64_t thread = 1)
{
    return eventOf(beginCode, timestamp, thread);
}
trace_point end(std::uint64_t timestamp, std::uint64_t thread = 1)
{
    return eventOf(endCode, timestamp, thread);
}
trace_point other(std::uint64_t timestamp, std::uint64_t thread = 1)
{
    return eventOf(otherCode, timestamp, thread);
}

class Interval : public testing::Test {
protected:
    explicit Interval(bool byThread) : interval("mix", beginCode, endCode, byThread) { }

    std::vector<std::uint64_t> process(const Events& events)
    {
        interval.processTracepoints(*session, events);
        EXPECT_EQ(interval.getNumTimesTraced(), interval.getResults().size());
        return interval.getResults();
    }
    // The log lines about so many discarded starts and as many stops.
    [[nodiscard]] static auto starts(platform::LogLevel level, unsigned count)
    {
        return IsLine(level, "kert",
                      "DISCARDED " + std::to_string(count)
                          + " trace Start points for interval mix because no stop points found");
    }
    [[nodiscard]] static auto stops(platform::LogLevel level, unsigned count)
    {
        return IsLine(level, "kert",
                      "DISCARDED " + std::to_string(count)
                          + " trace Stop points for interval mix because no start points found");
    }

    support::TestPlatform platform;
    std::unique_ptr<platform::KernelTraceSession> session = platform.kernelTrace.createTraceSession();
    TraceInterval interval;
};

// --- start and stop on the same thread

class SingleThreadInterval : public Interval {
protected:
    SingleThreadInterval() : Interval(true) { }
};

TEST_F(SingleThreadInterval, IsMadeEmpty)
{
    EXPECT_EQ(interval.name(), "mix");
    EXPECT_EQ(interval.beginCode(), beginCode);
    EXPECT_EQ(interval.endCode(), endCode);
    EXPECT_TRUE(interval.matchByThread());
    EXPECT_FALSE(interval.hasResults());
    EXPECT_EQ(interval.getNumTimesTraced(), 0U);
    EXPECT_THAT(process({}), IsEmpty());
    EXPECT_THAT(platform.log.lines(), IsEmpty());
}

TEST_F(SingleThreadInterval, IsMeasuredFromItsStartToTheStopOfItsThread)
{
    EXPECT_THAT(process({begin(10, 1), begin(20, 2), other(25, 1), end(40, 2), end(100, 1)}), ElementsAre(20, 90));
    EXPECT_TRUE(interval.hasResults());
    EXPECT_THAT(platform.log.lines(), IsEmpty());
}

TEST_F(SingleThreadInterval, IsMeasuredFromTheSecondOfTwoStartsAndTheFirstIsDiscarded)
{
    EXPECT_THAT(process({begin(10), begin(20), end(50)}), ElementsAre(30));
    EXPECT_THAT(platform.log.lines(), ElementsAre(starts(Debug, 1)));
    EXPECT_EQ(platform.log.lines()[0].name, "TraceInterval");
}

TEST_F(SingleThreadInterval, DiscardsAStopWithoutAStartOnItsThreadAndSaysHowManyStartsWere)
{
    EXPECT_THAT(process({begin(10, 1), end(20, 2), end(30, 3)}), IsEmpty());
    EXPECT_THAT(platform.log.lines(), ElementsAre(stops(Debug, 0)));
}

TEST_F(SingleThreadInterval, NamesTheNumberOfDiscardedStartsInBothLines)
{
    EXPECT_THAT(process({begin(1), begin(2), begin(3), end(4), end(5), end(6), end(7)}), ElementsAre(1));
    EXPECT_THAT(platform.log.lines(), ElementsAre(starts(Debug, 2), stops(Debug, 2)));
}

TEST_F(SingleThreadInterval, EndsWithItsFirstStop)
{
    EXPECT_THAT(process({begin(1), end(5), end(9), begin(10), end(12)}), ElementsAre(4, 2));
    EXPECT_THAT(platform.log.lines(), ElementsAre(stops(Debug, 0)));
}

TEST_F(SingleThreadInterval, DropsStartsThatStillWaitAtTheEndWithoutCountingThem)
{
    EXPECT_THAT(process({begin(1, 1), begin(2, 2), begin(3, 3)}), IsEmpty());
    EXPECT_THAT(platform.log.lines(), IsEmpty());
    EXPECT_THAT(process({end(10, 1)}), IsEmpty()) << "no start is carried over to the next list";
}

TEST_F(SingleThreadInterval, StartsAtTimeZeroToo)
{
    EXPECT_THAT(process({begin(0), end(5)}), ElementsAre(5));
}

TEST_F(SingleThreadInterval, IsMeasuredOnThreadsOfAnyNumberAndAnyNumberOfThreads)
{
    Events events;
    for (const std::uint64_t thread : {std::uint64_t{0}, std::numeric_limits<std::uint64_t>::max()})
        for (const auto& event : {begin(1, thread), end(3, thread)})
            events.push_back(event);
    constexpr std::uint64_t threads = 5000;
    for (std::uint64_t thread = 1; thread <= threads; ++thread)
        events.push_back(begin(thread, thread));
    for (std::uint64_t thread = threads; thread >= 1; --thread)
        events.push_back(end(3 * thread, thread));

    std::vector<std::uint64_t> expected{2, 2};
    for (std::uint64_t thread = threads; thread >= 1; --thread)
        expected.push_back(2 * thread);
    EXPECT_EQ(process(events), expected);
    EXPECT_THAT(platform.log.lines(), IsEmpty());
}

// --- start and stop on any threads

class AnyThreadInterval : public Interval {
protected:
    AnyThreadInterval() : Interval(false) { }
};

TEST_F(AnyThreadInterval, IsMeasuredFromAStartToTheNextStopWhicheverThreadsTheyAreOf)
{
    EXPECT_THAT(process({begin(10, 1), other(15, 1), end(30, 2), begin(40, 3), end(41, 3)}), ElementsAre(20, 1));
    EXPECT_THAT(platform.log.lines(), IsEmpty());
}

TEST_F(AnyThreadInterval, IsMeasuredFromTheSecondOfTwoStartsOnDifferentThreads)
{
    EXPECT_THAT(process({begin(10, 1), begin(20, 2), end(50, 1)}), ElementsAre(30));
    EXPECT_THAT(platform.log.lines(), ElementsAre(starts(Default, 1)));
}

TEST_F(AnyThreadInterval, EndsWithItsFirstStopAndTheSecondIsDiscarded)
{
    EXPECT_THAT(process({begin(10), end(20), end(30)}), ElementsAre(10));
    EXPECT_THAT(platform.log.lines(), ElementsAre(stops(Default, 0)));
}

TEST_F(AnyThreadInterval, NamesTheNumberOfDiscardedStartsInBothLines)
{
    EXPECT_THAT(process({end(1), begin(2), begin(3), begin(4), end(5), end(6)}), ElementsAre(1));
    EXPECT_THAT(platform.log.lines(), ElementsAre(starts(Default, 2), stops(Default, 2)));
}

TEST_F(AnyThreadInterval, TakesAStartAtTimeZeroForNone)
{
    EXPECT_THAT(process({begin(0), end(5), begin(0), begin(7), end(9)}), ElementsAre(2));
    EXPECT_THAT(platform.log.lines(), ElementsAre(stops(Default, 0)));
}

TEST_F(AnyThreadInterval, ForgetsAStartForOneAtTimeZero)
{
    EXPECT_THAT(process({begin(3), begin(0), end(5)}), IsEmpty());
    EXPECT_THAT(platform.log.lines(), ElementsAre(starts(Default, 1), stops(Default, 1)));
}

TEST_F(AnyThreadInterval, DropsAStartThatStillWaitsAtTheEndWithoutCountingIt)
{
    EXPECT_THAT(process({begin(1), end(2), begin(3)}), ElementsAre(1));
    EXPECT_THAT(platform.log.lines(), IsEmpty());
    EXPECT_THAT(process({end(10)}), ElementsAre(1)) << "no start is carried over to the next list";
}

// --- both

TEST_F(AnyThreadInterval, NeverCompletesWhereOneCodeBeginsAndEndsIt)
{
    for (const bool byThread : {true, false}) {
        TraceInterval impulse("impulse", beginCode, beginCode, byThread);
        impulse.processTracepoints(*session, Events{begin(1), begin(2), begin(3)});
        EXPECT_FALSE(impulse.hasResults());
        EXPECT_EQ(impulse.getNumTimesTraced(), 0U);
    }
    constexpr auto line = "DISCARDED 2 trace Start points for interval impulse because no stop points found";
    EXPECT_THAT(platform.log.lines(), ElementsAre(IsLine(Debug, "kert", line), IsLine(Default, "kert", line)));
}

TEST_F(AnyThreadInterval, WrapsAroundWhenItsEndIsEarlierThanItsStart)
{
    constexpr std::uint64_t minusThree = std::numeric_limits<std::uint64_t>::max() - 2;
    EXPECT_THAT(process({begin(5), end(2)}), ElementsAre(minusThree));
    TraceInterval byThread("mix", beginCode, endCode, true);
    byThread.processTracepoints(*session, Events{begin(5), end(2)});
    EXPECT_THAT(byThread.getResults(), ElementsAre(minusThree));
}

TEST_F(AnyThreadInterval, IsInNanosecondsForEveryUnitOfTheSessionsTime)
{
    platform.kernelTrace.toNanoseconds = [](std::uint64_t timestamp) { return timestamp * 125 / 3; };
    TraceInterval byThread("mix", beginCode, endCode, true);
    byThread.processTracepoints(*session, Events{begin(1), end(2)});
    EXPECT_THAT(byThread.getResults(), ElementsAre(83 - 41)) << "start and end are converted separately";
    EXPECT_THAT(process({begin(1), end(2)}), ElementsAre(83 - 41));
}

TEST_F(AnyThreadInterval, AddsToItsResultsWithEveryListOfEvents)
{
    process({begin(1), end(2)});
    EXPECT_THAT(process({begin(1), end(5)}), ElementsAre(1, 4));
}

TEST_F(AnyThreadInterval, HasAnAverageInThePrecisionOfAFloat)
{
    process({begin(1), end(2), begin(10), end(14), begin(20), end(24)});
    EXPECT_EQ(interval.getAverageResult(), 3.0F);
    process({begin(1), end(16'777'218)}); // a float cannot hold 2^24 + 1, nor the sums
    EXPECT_EQ(interval.getAverageResult(), (16'777'216.0F + 8.0F) / 4);
}

TEST_F(AnyThreadInterval, HasAnAverageWhoseSumIsAFloatAtEveryStep)
{
    EXPECT_THAT(
        process({begin(1), end(16'777'217), begin(20'000'000), end(20'000'001), begin(20'000'002), end(20'000'003)}),
        ElementsAre(16'777'216, 1, 1));
    EXPECT_EQ(interval.getAverageResult(), 5'592'405.5F) << "neither of the ones changes a sum of 2^24";
}

TEST_F(AnyThreadInterval, HasNoNumberForItsAverageWithoutResults)
{
    EXPECT_TRUE(std::isnan(interval.getAverageResult()));
}

// --- compared with a formulation that only looks backwards

struct Measured {
    std::vector<std::uint64_t> results;
    unsigned startDiscards = 0;
    unsigned stopDiscards = 0;
};

// Each start or stop is decided by the previous one among those with which it could pair.
Measured measureNaively(const Events& events, std::uint32_t first, std::uint32_t last, bool byThread)
{
    Measured measured;
    for (std::size_t at = 0; at < events.size(); ++at) {
        const trace_point& event = events[at];
        if (event.eventCode != first && event.eventCode != last)
            continue;
        const trace_point* before = nullptr;
        for (std::size_t earlier = 0; earlier < at; ++earlier)
            if ((events[earlier].eventCode == first || events[earlier].eventCode == last)
                && (!byThread || events[earlier].threadID == event.threadID))
                before = &events[earlier];
        const bool isOpen = before != nullptr && before->eventCode == first && (byThread || before->timestamp != 0);
        if (event.eventCode == first)
            measured.startDiscards += isOpen ? 1 : 0;
        else if (isOpen)
            measured.results.push_back(event.timestamp - before->timestamp);
        else
            ++measured.stopDiscards;
    }
    return measured;
}

rc::Gen<trace_point> generatedEvent()
{
    const auto time = rc::gen::weightedOneOf<std::uint64_t>({{1, rc::gen::just<std::uint64_t>(0)},
                                                             {4, rc::gen::inRange<std::uint64_t>(1, 50)},
                                                             {1, rc::gen::arbitrary<std::uint64_t>()}});
    const auto thread = rc::gen::weightedOneOf<std::uint64_t>(
        {{4, rc::gen::inRange<std::uint64_t>(0, 3)}, {1, rc::gen::inRange<std::uint64_t>(0, 100)}});
    return rc::gen::map(rc::gen::tuple(rc::gen::element(beginCode, endCode, otherCode), time, thread),
                        [](const auto& parts) { return std::apply(eventOf, parts); });
}

RC_GTEST_PROP(IntervalProperty, PairsWhatANaiveFormulationPairs, ())
{
    const support::TestPlatform platform;
    const auto events = *rc::gen::container<Events>(generatedEvent());
    const bool byThread = *rc::gen::arbitrary<bool>();
    const std::uint32_t last = *rc::gen::element(endCode, endCode, endCode, beginCode);
    TraceInterval interval("mix", beginCode, last, byThread);
    support::FakeKernelTrace trace;
    interval.processTracepoints(*trace.createTraceSession(), events);

    const Measured expected = measureNaively(events, beginCode, last, byThread);
    RC_ASSERT(interval.getResults() == expected.results);
    RC_ASSERT(interval.getNumTimesTraced() == expected.results.size());
    std::vector<std::string> lines;
    const auto discarded = [&](std::string_view which, std::string_view missing) {
        lines.push_back("DISCARDED " + std::to_string(expected.startDiscards) + " trace " + std::string(which)
                        + " points for interval mix because no " + std::string(missing) + " points found");
    };
    if (expected.startDiscards != 0)
        discarded("Start", "stop");
    if (expected.stopDiscards != 0)
        discarded("Stop", "start");
    std::vector<std::string> written;
    for (const auto& line : platform.log.lines())
        written.push_back(line.message);
    RC_ASSERT(written == lines);
}

} // namespace
