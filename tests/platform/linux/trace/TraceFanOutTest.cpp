// SPDX-License-Identifier: Apache-2.0
// Which session gets which events of the one trace, and when it is completed.
#include "platform/linux/trace/TraceFanOut.h"
#include "support/fakes/FakeLog.h"

#include <deque>
#include <gmock/gmock.h>
#include <rapidcheck/gtest.h>

namespace platform {
namespace {

using support::IsLine;
using testing::ElementsAre;
using testing::IsEmpty;

// Runs its items when the test calls `run`.
class HeldQueue final : public WorkQueue {
public:
    void submit(WorkItem item) override { items_.push_back(std::move(item)); }
    [[nodiscard]] bool isCurrent() const override { return false; }
    void run()
    {
        while (!items_.empty()) {
            WorkItem item = std::move(items_.front());
            items_.pop_front();
            item();
        }
    }

private:
    std::deque<WorkItem> items_;
};

struct Subscriber {
    explicit Subscriber(std::uint64_t start, std::uint32_t firstCode = 0, std::uint32_t lastCode = UINT32_MAX)
    {
        subscription->filters.push_back({firstCode, lastCode, [this](const KernelTraceEvent& event) {
                                             times.push_back(event.timestamp);
                                             last = event;
                                         }});
        subscription->completion = [this] { completedAfter.push_back(times.size()); };
        subscription->queue = queue;
        subscription->startTime = start;
    }
    ~Subscriber() { queue->run(); } // its items hold the queue
    Subscriber(const Subscriber&) = delete;
    Subscriber& operator=(const Subscriber&) = delete;
    void end(std::uint64_t time) const { subscription->endTime = time; }

    std::shared_ptr<HeldQueue> queue = std::make_shared<HeldQueue>();
    std::shared_ptr<TraceSubscription> subscription = std::make_shared<TraceSubscription>();
    std::vector<std::uint64_t> times;
    KernelTraceEvent last;
    std::vector<std::size_t> completedAfter; // so many events
};

std::vector<CollectedEvent> eventsAt(std::initializer_list<std::uint64_t> times, std::uint32_t code = 1)
{
    std::vector<CollectedEvent> events;
    for (const std::uint64_t time : times)
        events.push_back({.timestamp = time, .emitted = {.code = code}});
    return events;
}

class TraceFanOutTest : public testing::Test {
protected:
    void add(const Subscriber& listener) { ASSERT_TRUE(fanOut.add(listener.subscription)); }

    support::FakeLog log;
    TraceFanOut fanOut{ProviderLog(log)};
};

TEST_F(TraceFanOutTest, GivesASessionWhatIsBetweenItsStartAndItsEndBothIncluded)
{
    Subscriber listener(10);
    add(listener);
    fanOut.deliver(eventsAt({8, 9, 10, 11}), 15, 0);
    listener.end(20);
    fanOut.deliver(eventsAt({19, 20, 21}), 30, 0);
    listener.queue->run();
    EXPECT_THAT(listener.times, ElementsAre(10, 11, 19, 20));
    EXPECT_THAT(listener.completedAfter, ElementsAre(4));
    EXPECT_TRUE(fanOut.isEmpty());
    EXPECT_THAT(log.lines(), IsEmpty());
}

TEST_F(TraceFanOutTest, TellsASessionAllThatIsKnownOfAnEvent)
{
    Subscriber listener(1);
    add(listener);
    const CollectedEvent event{.timestamp = 7,
                               .threadID = 4711,
                               .cpu = 3,
                               .emitted = {.code = 0x21040010, .arguments = {1, 2, 3, UINT64_MAX}}};
    fanOut.deliver({&event, 1}, 10, 0);
    listener.queue->run();
    EXPECT_EQ(listener.last.timestamp, 7U);
    EXPECT_EQ(listener.last.threadID, 4711U);
    EXPECT_EQ(listener.last.eventCode, 0x21040010U);
    EXPECT_EQ(listener.last.cpu, 3U);
    EXPECT_THAT(listener.last.arguments, ElementsAre(1U, 2U, 3U, UINT64_MAX));
}

TEST_F(TraceFanOutTest, TellsTheTimeOfDayToSessionsThatWantIt)
{
    Subscriber with(1);
    Subscriber without(1);
    with.subscription->hasWallTimes = true;
    add(with);
    add(without);
    const auto wallTimeOf = [&](std::uint64_t time) {
        fanOut.deliver(eventsAt({time}), time, 0);
        with.queue->run();
        without.queue->run();
        EXPECT_EQ(without.last.timestamp, time);
        EXPECT_EQ(without.last.wallTime, KernelTraceWallTime());
        return with.last.wallTime;
    };
    EXPECT_EQ(wallTimeOf(2'000'000'999), (KernelTraceWallTime{.seconds = 2, .microseconds = 0})) << "the clocks agree";
    fanOut.setWallClock(1'700'000'000'999'998'000);
    EXPECT_EQ(wallTimeOf(3'000'001'999), (KernelTraceWallTime{.seconds = 1'700'000'003, .microseconds = 999'999}));
    EXPECT_EQ(wallTimeOf(3'000'002'000), (KernelTraceWallTime{.seconds = 1'700'000'004, .microseconds = 0}));
    fanOut.setWallClock(-5'000'000'000);
    EXPECT_EQ(wallTimeOf(4'250'000'000), (KernelTraceWallTime{.seconds = -1, .microseconds = 250'000}))
        << "before 1970, the seconds round down, too";
}

TEST_F(TraceFanOutTest, CompletesASessionOnceNothingOfItsTimeCanComeAnyMore)
{
    Subscriber listener(10);
    add(listener);
    EXPECT_EQ(fanOut.nextEnd(), TraceSubscription::never);
    EXPECT_TRUE(fanOut.isWanted());
    listener.end(20);
    EXPECT_EQ(fanOut.nextEnd(), 20U);
    EXPECT_FALSE(fanOut.isWanted());
    fanOut.deliver(eventsAt({15}), 19, 0);
    listener.queue->run();
    EXPECT_THAT(listener.completedAfter, IsEmpty());
    EXPECT_FALSE(fanOut.isEmpty());
    fanOut.deliver(eventsAt({20}), 20, 0);
    listener.queue->run();
    EXPECT_THAT(listener.completedAfter, ElementsAre(2));
}

TEST_F(TraceFanOutTest, GivesEachSessionTheCodesThatItWants)
{
    Subscriber low(1, 0, 9);
    Subscriber high(1, 10, 19);
    Subscriber both(1, 9, 10);
    for (const Subscriber* each : {&low, &high, &both})
        add(*each);
    auto events = eventsAt({1}, 0);
    for (const std::uint32_t code : {9U, 10U, 19U, 20U})
        events.push_back({.timestamp = code, .emitted = {.code = code}});
    fanOut.deliver(events, 100, 0);
    for (const Subscriber* each : {&low, &high, &both})
        each->queue->run();
    EXPECT_THAT(low.times, ElementsAre(1, 9));
    EXPECT_THAT(high.times, ElementsAre(10, 19));
    EXPECT_THAT(both.times, ElementsAre(9, 10));
}

TEST_F(TraceFanOutTest, CallsEveryFilterThatAnEventFits)
{
    Subscriber listener(1, 5, 9);
    listener.subscription->filters.push_back(
        {9, 12, [&](const KernelTraceEvent& event) { listener.times.push_back(1000 + event.timestamp); }});
    add(listener);
    auto events = eventsAt({1}, 5);
    events.push_back({.timestamp = 2, .emitted = {.code = 9}});
    events.push_back({.timestamp = 3, .emitted = {.code = 12}});
    fanOut.deliver(events, 100, 0);
    listener.queue->run();
    EXPECT_THAT(listener.times, ElementsAre(1, 2, 1002, 1003));
}

TEST_F(TraceFanOutTest, DeliversNothingMoreToASessionThatIsGone)
{
    Subscriber listener(1);
    add(listener);
    fanOut.deliver(eventsAt({1}), 10, 0);
    listener.end(11);
    fanOut.deliver({}, 20, 0);
    listener.subscription->isDestroyed = true;
    listener.queue->run();
    EXPECT_THAT(listener.times, IsEmpty());
    EXPECT_THAT(listener.completedAfter, IsEmpty());
}

TEST_F(TraceFanOutTest, ForgetsASessionThatIsRemoved)
{
    Subscriber listener(1);
    Subscriber other(1);
    add(listener);
    add(other);
    fanOut.remove(*listener.subscription);
    fanOut.deliver(eventsAt({1}), 10, 0);
    listener.queue->run();
    other.queue->run();
    EXPECT_THAT(listener.times, IsEmpty());
    EXPECT_THAT(other.times, ElementsAre(1));
}

TEST_F(TraceFanOutTest, MayLoseASessionToItsOwnCompletion)
{
    Subscriber listener(1);
    auto subscription = std::move(listener.subscription);
    std::weak_ptr<TraceSubscription> gone = subscription;
    bool isCompleted = false;
    subscription->completion = [&, keep = std::make_shared<int>(1)] {
        subscription.reset();
        isCompleted = *keep == 1; // the handler's captures exist as long as it runs
    };
    subscription->endTime = 5;
    ASSERT_TRUE(fanOut.add(subscription));
    fanOut.deliver({}, 10, 0);
    listener.queue->run();
    EXPECT_TRUE(isCompleted);
    EXPECT_TRUE(gone.expired());
}

TEST_F(TraceFanOutTest, SaysHowManyEventsASessionMayHaveLost)
{
    Subscriber before(1);
    Subscriber during(1'000'000'000);
    add(before);
    before.end(5);
    fanOut.deliver({}, 10, 0);
    add(during);
    fanOut.deliver({}, 1'100'000'000, 7);
    during.end(2'500'000'000);
    fanOut.deliver({}, 2'600'000'000, 5);
    EXPECT_THAT(log.lines(),
                ElementsAre(IsLine(LogLevel::Error, "kerl",
                                   "a trace session of 1.500 s lost up to 12 events: they came faster than the service "
                                   "read them")));
}

TEST_F(TraceFanOutTest, LosesWhatAQueueIsTooFarBehindWith)
{
    Subscriber listener(1);
    Subscriber other(1);
    add(listener);
    std::vector<CollectedEvent> events(TraceFanOut::mostOnTheirWay - 1, {.timestamp = 1});
    fanOut.deliver(events, 1, 0);
    add(other);
    fanOut.deliver(eventsAt({2, 3, 4}), 10, 0);
    listener.queue->run();
    other.queue->run();
    EXPECT_EQ(listener.times.size(), TraceFanOut::mostOnTheirWay);
    EXPECT_THAT(other.times, IsEmpty());
    EXPECT_EQ(listener.subscription->lost, 2U);
    EXPECT_EQ(other.subscription->lost, 3U);
    fanOut.deliver(eventsAt({5}), 10, 0);
    other.queue->run();
    EXPECT_THAT(other.times, ElementsAre(5)) << "there is room again";
}

TEST_F(TraceFanOutTest, TakesSoManySessions)
{
    for (std::size_t count = 0; count < TraceFanOut::mostSessions; ++count)
        EXPECT_TRUE(fanOut.add(std::make_shared<TraceSubscription>()));
    EXPECT_FALSE(fanOut.add(std::make_shared<TraceSubscription>()));
}

// Compared with a check of every event against every session.
TEST_F(TraceFanOutTest, GivesAnySessionsWhatIsTheirs)
{
    rc::check([this](std::vector<std::uint8_t> times, const std::vector<std::tuple<std::uint8_t, std::uint8_t>>& spans,
                     const std::vector<std::uint8_t>& readings) {
        std::ranges::sort(times);
        std::deque<Subscriber> listeners;
        for (const auto& [start, length] : spans) {
            const Subscriber& listener = listeners.emplace_back(start, start % 3, 3);
            listener.end(std::uint64_t{start} + length);
            RC_ASSERT(fanOut.add(listener.subscription));
        }
        std::vector<std::uint64_t> cuts(readings.begin(), readings.end());
        std::ranges::sort(cuts);
        cuts.push_back(1000);
        std::size_t done = 0;
        for (const std::uint64_t cut : cuts) {
            std::vector<CollectedEvent> events;
            for (; done < times.size() && times[done] <= cut; ++done)
                events.push_back({.timestamp = times[done], .emitted = {.code = times[done] % 4U}});
            fanOut.deliver(events, cut, 0);
        }
        for (const Subscriber& listener : listeners) {
            listener.queue->run();
            std::vector<std::uint64_t> expected;
            for (const std::uint64_t time : times)
                if (time >= listener.subscription->startTime && time <= listener.subscription->endTime
                    && time % 4 >= listener.subscription->startTime % 3)
                    expected.push_back(time);
            RC_ASSERT(listener.times == expected);
            RC_ASSERT(listener.completedAfter == std::vector{expected.size()});
        }
        RC_ASSERT(fanOut.isEmpty());
    });
}

} // namespace
} // namespace platform
