// SPDX-License-Identifier: Apache-2.0
// A trace and its measurements: arguments of single events, results by name, and the events in memory.
#include "tracing/Trace.h"
#include "support/TestPlatform.h"
#include "support/fakes/FakeKernelTrace.h"
#include "tracing/TraceEvents.h"
#include "tracing/TraceEventsOf.h"
#include "tracing/TracePoint.h"

#include <cmath>
#include <cstddef>
#include <gmock/gmock.h>

namespace {

using support::eventOf;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Pair;
using testing::SizeIs;
using Events = std::vector<trace_point>;

// --- points

class Point : public testing::Test {
protected:
    static constexpr std::uint32_t code = 5;

    std::vector<std::uint64_t> process(TracePoint& point)
    {
        const Events events{{.timestamp = 1, .arguments = {11, 12, 13, 14}, .eventCode = code},
                            {.timestamp = 2, .arguments = {21, 22, 23, 24}, .eventCode = code + 1},
                            {.timestamp = 3, .arguments = {31, 32, 33, 34}, .eventCode = code}};
        point.processTracepoints(*kernelTrace.createTraceSession(), events);
        return point.getResults();
    }

    support::FakeKernelTrace kernelTrace;
};

TEST_F(Point, CollectsOneArgumentOfEachEventOfItsCode)
{
    for (const std::uint32_t index : {1U, 2U, 3U, 4U}) {
        TracePoint point("level", code, index);
        EXPECT_EQ(point.beginCode(), code);
        EXPECT_EQ(point.argumentIndex(), index);
        EXPECT_THAT(process(point), ElementsAre(10 + index, 30 + index));
    }
}

TEST_F(Point, CollectsNothingWithAnyOtherIndex)
{
    for (const std::uint32_t index : {0U, 5U, 0xFFFFFFFFU}) {
        TracePoint point("level", code, index);
        EXPECT_THAT(process(point), IsEmpty());
        EXPECT_FALSE(point.hasResults());
    }
}

TEST_F(Point, CompletesNoIntervalSoThatItsAverageIsNotANumber)
{
    TracePoint point("level", code, 1);
    EXPECT_TRUE(std::isnan(point.getAverageResult()));
    process(point);
    EXPECT_EQ(point.getNumTimesTraced(), 0U);
    EXPECT_TRUE(std::isinf(point.getAverageResult()));
}

// --- traces

class TraceTest : public testing::Test {
protected:
    void add(std::string name, std::uint32_t begin, std::uint32_t end)
    {
        trace.addTraceDataToCollect(std::make_unique<TraceInterval>(std::move(name), begin, end, false));
    }
    void process(const Events& events) { trace.processTracepoints(*platform.kernelTrace.createTraceSession(), events); }

    support::TestPlatform platform;
    Trace trace{"startup", true};
};

TEST_F(TraceTest, HasNoResultsWithoutAnythingToMeasure)
{
    EXPECT_EQ(trace.name(), "startup");
    EXPECT_TRUE(trace.collectKernelTrace());
    EXPECT_FALSE(Trace("signpost", false).collectKernelTrace());
    process({eventOf(1, 1), eventOf(2, 2)});
    EXPECT_THAT(trace.getResults(), IsEmpty());
}

TEST_F(TraceTest, LetsEachReadAllEventsAndListsTheirResultsByName)
{
    add("render", 1, 2);
    add("capture", 1, 3);
    process({eventOf(1, 10), eventOf(2, 15), eventOf(3, 17), eventOf(1, 20), eventOf(2, 21), eventOf(3, 28)});
    EXPECT_THAT(trace.data(), SizeIs(2));
    EXPECT_THAT(trace.getResults(), ElementsAre(Pair("capture", ElementsAre(7, 8)), Pair("render", ElementsAre(5, 1))));
    EXPECT_EQ(trace.intervalsLeftOut(), 0U);
}

TEST_F(TraceTest, ListsTheResultsOfEqualNamesInTheOrderInWhichTheyWereAdded)
{
    add("render", 3, 4);
    add("render", 1, 2);
    process({eventOf(1, 10), eventOf(2, 11), eventOf(3, 12), eventOf(4, 14), eventOf(1, 20), eventOf(2, 23)});
    EXPECT_THAT(trace.getResults(), ElementsAre(Pair("render", ElementsAre(2, 1, 3))));
}

TEST_F(TraceTest, LeavesOutTheNamesOfWhatWasNeverMeasured)
{
    add("never", 8, 9);
    add("once", 1, 2);
    process({eventOf(1, 1), eventOf(2, 2)});
    EXPECT_THAT(trace.getResults(), ElementsAre(Pair("once", ElementsAre(1))));
}

TEST_F(TraceTest, ReturnsEveryValueOnceMoreWithEachCall)
{
    add("render", 1, 2);
    process({eventOf(1, 1), eventOf(2, 6), eventOf(1, 10), eventOf(2, 13)});
    EXPECT_THAT(trace.getResults(), ElementsAre(Pair("render", ElementsAre(5, 3))));
    EXPECT_THAT(trace.getResults(), ElementsAre(Pair("render", ElementsAre(5, 3, 5, 3))));
}

TEST_F(TraceTest, LeavesOutWhatItWouldMeasureBeyondAMillionResultsAndSaysSo)
{
    constexpr std::size_t each = Trace::mostResults / 2;
    for (int number = 0; number < 5; ++number)
        add(std::to_string(number), 1, 2);
    Events events;
    for (std::uint64_t number = 1; number <= each; ++number)
        for (const auto& event : {eventOf(1, number), eventOf(2, number)})
            events.push_back(event);
    process(events);
    EXPECT_THAT(trace.getResults(), ElementsAre(Pair("0", SizeIs(each)), Pair("1", SizeIs(each))));
    EXPECT_EQ(trace.intervalsLeftOut(), 3U);
    EXPECT_THAT(platform.log.lines(),
                ElementsAre(support::IsLine(platform::LogLevel::Error, "kert",
                                            "trace startup has read 2000000 events and has 1000000 results; 3 of its "
                                            "intervals are left out")));
}

TEST_F(TraceTest, LeavesOutIntervalsThatWouldReadMoreEventsThanTheServiceMayWaitFor)
{
    constexpr std::size_t count = 1'000'000;
    constexpr std::size_t read = Trace::mostEventsRead / count;
    for (std::size_t number = 0; number < read + 2; ++number)
        add(std::to_string(number), 1, 2);
    process(Events(count, eventOf(3, 1)));
    EXPECT_EQ(trace.intervalsLeftOut(), 2U);
    EXPECT_THAT(platform.log.lines(),
                ElementsAre(support::IsLine(platform::LogLevel::Error, "kert",
                                            "trace startup has read 50000000 events and has 0 results; 2 of its "
                                            "intervals are left out")));
}

// --- the events of a trace

void fill(TraceEvents& events, std::size_t count)
{
    for (std::size_t number = 0; number < count; ++number)
        events.append(eventOf(1, number));
}

TEST(TraceEventsTest, AreKeptInOrder)
{
    constexpr std::size_t count = 3 * TraceEvents::firstRoom + 1;
    TraceEvents events;
    fill(events, count);
    ASSERT_THAT(events.all(), SizeIs(count));
    for (std::size_t number = 0; number < count; ++number)
        ASSERT_EQ(events.all()[number].timestamp, number);
    EXPECT_EQ(events.lost(), 0U);
}

TEST(TraceEventsTest, HaveRoomForTenThousandFromTheBeginning)
{
    TraceEvents events;
    fill(events, 1);
    const trace_point* const first = &events.all().front();
    fill(events, 9'999);
    ASSERT_THAT(events.all(), SizeIs(10'000));
    EXPECT_EQ(&events.all().front(), first) << "nothing had to be moved";
}

// Providers and readers agree on it byte by byte.
TEST(TraceEvent, IsARecordOf96BytesWithEachFieldInItsPlace)
{
    EXPECT_EQ(sizeof(trace_point), 96U);
    EXPECT_EQ(offsetof(trace_point, timestamp), 0U);
    EXPECT_EQ(offsetof(trace_point, arguments), 8U);
    EXPECT_EQ(sizeof(trace_point::arguments), 32U);
    EXPECT_EQ(offsetof(trace_point, threadID), 40U);
    EXPECT_EQ(offsetof(trace_point, eventCode), 48U);
    EXPECT_EQ(sizeof(trace_point::eventCode), 4U);
    EXPECT_EQ(offsetof(trace_point, cpu), 52U);
    EXPECT_EQ(sizeof(trace_point::cpu), 4U);
    EXPECT_EQ(offsetof(trace_point, wallTime.seconds), 56U);
    EXPECT_EQ(offsetof(trace_point, wallTime.microseconds), 64U);
    EXPECT_EQ(sizeof(trace_point::wallTime), 16U);
    EXPECT_EQ(offsetof(trace_point, texts), 72U);
    EXPECT_EQ(sizeof(trace_point::texts), 16U);
    EXPECT_EQ(offsetof(trace_point, value), 88U);
    EXPECT_EQ(sizeof(trace_point::value), 4U);
}

TEST(TraceEventsTest, AreLostAndCountedWhenTheMemoryOfAllTracesIsUsedUp)
{
    auto greedy = std::make_unique<TraceEvents>();
    fill(*greedy, TraceEvents::firstRoom + TraceEvents::mostOfAllTraces + 5);
    EXPECT_THAT(greedy->all(), SizeIs(TraceEvents::firstRoom + TraceEvents::mostOfAllTraces));
    EXPECT_EQ(greedy->lost(), 5U);

    TraceEvents other;
    fill(other, TraceEvents::firstRoom + 1);
    EXPECT_THAT(other.all(), SizeIs(TraceEvents::firstRoom)) << "its first room is its own";
    EXPECT_EQ(other.lost(), 1U);

    greedy.reset();
    fill(other, 1);
    EXPECT_THAT(other.all(), SizeIs(TraceEvents::firstRoom + 1)) << "freed room is there for others";
    EXPECT_EQ(other.lost(), 1U);
}

} // namespace
