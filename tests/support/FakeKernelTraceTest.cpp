// The kernel trace of the tests delivers as the one of a device does.
#include "support/FakeKernelTrace.h"
#include "support/FakeWorkQueues.h"

#include <gmock/gmock.h>

namespace {

using platform::KernelTraceEvent;
using platform::KernelTraceWallTime;
using testing::ElementsAre;

class FakeKernelTraceTest : public testing::Test {
protected:
    std::unique_ptr<platform::KernelTraceSession> start(std::vector<KernelTraceEvent>& events, bool hasWallTimes)
    {
        auto session = trace.createTraceSession();
        session->enableWallTimes(hasWallTimes);
        session->filterEventRange(5, 9, [&events](const KernelTraceEvent& event) { events.push_back(event); });
        session->start(queue);
        return session;
    }

    support::FakeClock clock;
    support::FakeWorkQueues queues{clock};
    std::shared_ptr<platform::WorkQueue> queue = queues.makeSerialQueue("trace", platform::QualityOfService::Default);
    support::FakeKernelTrace trace;
};

TEST_F(FakeKernelTraceTest, TellsTheTimeOfDayToSessionsThatEnabledItOnly)
{
    std::vector<KernelTraceEvent> with;
    std::vector<KernelTraceEvent> without;
    const auto one = start(with, true);
    const auto other = start(without, false);
    constexpr KernelTraceWallTime noon{.seconds = 1'700'000'000, .microseconds = 250'000};
    trace.deliver({.timestamp = 7, .eventCode = 5, .wallTime = noon});
    queues.runAll();
    ASSERT_EQ(with.size(), 1U);
    ASSERT_EQ(without.size(), 1U);
    EXPECT_EQ(with[0].wallTime, noon);
    EXPECT_EQ(without[0].wallTime, KernelTraceWallTime());
    EXPECT_EQ(without[0].timestamp, 7U);
}

TEST_F(FakeKernelTraceTest, DeliversEventsOfTheSessionsCodesWhileItRuns)
{
    std::vector<KernelTraceEvent> events;
    auto session = start(events, true);
    for (const std::uint32_t code : {4U, 5U, 9U, 10U})
        trace.deliver({.eventCode = code});
    session->end();
    trace.deliver({.eventCode = 5});
    queues.runAll();
    std::vector<std::uint32_t> codes;
    for (const KernelTraceEvent& event : events)
        codes.push_back(event.eventCode);
    EXPECT_THAT(codes, ElementsAre(5U, 9U));
}

} // namespace
