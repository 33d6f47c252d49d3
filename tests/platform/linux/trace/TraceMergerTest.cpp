// SPDX-License-Identifier: Apache-2.0
// The events of several processors in one order.
#include "platform/linux/trace/TraceMerger.h"
#include "platform/linux/trace/ImitatedTracefs.h"

#include <algorithm>
#include <gmock/gmock.h>
#include <rapidcheck/gtest.h>

namespace platform {
namespace {

using support::asBytes;
using support::rawDataType;
using support::RingBufferPageBuilder;
using testing::ElementsAre;
using testing::IsEmpty;

class TraceMergerTest : public testing::Test {
protected:
    void take(std::uint32_t cpu, const RingBufferPageBuilder& builder) { merger.take(cpu, asBytes(builder.page())); }
    std::vector<std::uint32_t> codesUpTo(std::uint64_t time)
    {
        std::vector<std::uint32_t> codes;
        for (const CollectedEvent& event : merger.eventsUpTo(time))
            codes.push_back(event.emitted.code);
        return codes;
    }

    TraceMerger merger{{}, rawDataType};
};

TEST_F(TraceMergerTest, TellsAllThatTheKernelKnowsOfAnEvent)
{
    take(3, RingBufferPageBuilder(5).event(7, 0x21040010, 4711, {1, 2, 3, UINT64_MAX}));
    const auto events = merger.eventsUpTo(10);
    ASSERT_EQ(events.size(), 1U);
    EXPECT_EQ(events[0].timestamp, 7U);
    EXPECT_EQ(events[0].threadID, 4711U);
    EXPECT_EQ(events[0].emitted.code, 0x21040010U);
    EXPECT_EQ(events[0].cpu, 3U);
    EXPECT_THAT(events[0].emitted.arguments, ElementsAre(1U, 2U, 3U, UINT64_MAX));
}

TEST_F(TraceMergerTest, OrdersTheEventsOfAllProcessorsByTime)
{
    take(0, RingBufferPageBuilder(1).event(10, 1).event(40, 4));
    take(1, RingBufferPageBuilder(1).event(20, 2).event(30, 3).event(60, 6));
    take(2, RingBufferPageBuilder(1).event(50, 5));
    EXPECT_THAT(codesUpTo(100), ElementsAre(1, 2, 3, 4, 5, 6));
}

TEST_F(TraceMergerTest, KeepsWhatIsTooYoung)
{
    take(0, RingBufferPageBuilder(1).event(10, 1).event(11, 2).event(12, 3));
    EXPECT_THAT(codesUpTo(9), IsEmpty());
    EXPECT_THAT(codesUpTo(11), ElementsAre(1, 2));
    take(1, RingBufferPageBuilder(1).event(12, 4));
    EXPECT_THAT(codesUpTo(12), ElementsAre(3, 4)) << "at equal times, the lower processor comes first";
    EXPECT_THAT(codesUpTo(100), IsEmpty());
    EXPECT_EQ(merger.takeLosses(), 0U);
}

TEST_F(TraceMergerTest, LosesWhatComesTooLateRatherThanTellItInTheWrongOrder)
{
    EXPECT_THAT(codesUpTo(50), IsEmpty());
    take(0, RingBufferPageBuilder(1).event(49, 1).event(50, 2).event(51, 3));
    EXPECT_THAT(codesUpTo(100), ElementsAre(3));
    EXPECT_EQ(merger.takeLosses(), 2U);
    EXPECT_EQ(merger.takeLosses(), 0U) << "reported once";
}

TEST_F(TraceMergerTest, LosesWhatGoesBackInTime)
{
    take(0, RingBufferPageBuilder(50).event(50, 1).stamp(40).event(40, 2).event(60, 3));
    EXPECT_THAT(codesUpTo(100), ElementsAre(1, 3));
    EXPECT_EQ(merger.takeLosses(), 1U);
}

TEST_F(TraceMergerTest, LeavesOutWhatIsNotOurs)
{
    const auto written = [](std::uint32_t tag, std::uint16_t type) {
        return RingBufferPageBuilder::eventBytes({.tag = tag, .code = 1}, 1, type);
    };
    const std::string own = written(EmittedEvent::ownTag, rawDataType);
    take(0,
         RingBufferPageBuilder(1)
             .record(1, written(12, rawDataType))
             .record(2, written(EmittedEvent::ownTag, rawDataType + 1))
             .record(3, own.substr(0, 44))
             .record(4, own + "more")
             .record(5, std::string(3000, 'x'))
             .record(6, own));
    EXPECT_THAT(codesUpTo(100), ElementsAre(1));
    EXPECT_EQ(merger.takeLosses(), 0U);
}

TEST_F(TraceMergerTest, CountsWhatTheKernelAndBrokenPagesLost)
{
    take(0, RingBufferPageBuilder(1).event(5, 1).missed(1000));
    take(1, RingBufferPageBuilder(1).event(6, 2).bytes("?"));
    merger.take(2, {});
    EXPECT_THAT(codesUpTo(100), ElementsAre(1, 2)) << "all readable events are read";
    EXPECT_EQ(merger.takeLosses(), 1002U);
}

TEST_F(TraceMergerTest, HoldsNoMoreThanItMay)
{
    RingBufferPageBuilder builder(1);
    constexpr std::size_t perPage = 70;
    for (std::size_t event = 0; event < perPage; ++event)
        builder.event(1, 1);
    const std::string page = builder.page();
    constexpr std::size_t pages = TraceMerger::mostWaiting / perPage + 1;
    for (std::size_t count = 0; count < pages; ++count)
        merger.take(0, asBytes(page));
    EXPECT_EQ(merger.eventsUpTo(1).size(), TraceMerger::mostWaiting);
    EXPECT_EQ(merger.takeLosses(), pages * perPage - TraceMerger::mostWaiting);
    take(0, RingBufferPageBuilder(1).event(2, 7));
    EXPECT_THAT(codesUpTo(2), ElementsAre(7)) << "there is room again";
}

// Compared with sorting all events together.
TEST_F(TraceMergerTest, OrdersAnyEventsAsSortingWould)
{
    rc::check([](const std::vector<std::tuple<std::uint8_t, std::uint8_t, bool>>& steps) {
        TraceMerger tested({}, rawDataType);
        std::vector<std::pair<std::uint64_t, std::uint32_t>> expected;
        std::vector<std::pair<std::uint64_t, std::uint32_t>> merged;
        std::array<std::uint64_t, 5> times;
        std::uint64_t settled = 1000;
        times.fill(settled + 1);
        std::uint32_t code = 0;
        for (const auto& [step, cpuByte, isReading] : steps) {
            const std::uint32_t cpu = cpuByte % times.size();
            if (isReading) {
                settled = std::max(settled, *std::ranges::min_element(times) - 1);
                for (const CollectedEvent& event : tested.eventsUpTo(settled))
                    merged.emplace_back(event.timestamp, event.cpu);
                for (std::uint64_t& time : times)
                    time = std::max(time, settled + 1);
            }
            times[cpu] += step;
            tested.take(cpu, asBytes(RingBufferPageBuilder(times[cpu]).event(times[cpu], ++code).page()));
            expected.emplace_back(times[cpu], cpu);
        }
        for (const CollectedEvent& event : tested.eventsUpTo(UINT64_MAX))
            merged.emplace_back(event.timestamp, event.cpu);
        std::ranges::stable_sort(expected);
        RC_ASSERT(merged == expected);
        RC_ASSERT(tested.takeLosses() == 0U);
    });
}

} // namespace
} // namespace platform
