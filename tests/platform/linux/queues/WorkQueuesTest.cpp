// SPDX-License-Identifier: Apache-2.0
// Real threads. They wait for each other, and so meet at the important moments; no test waits for a fixed time.
#include "foundation/Mutex.h"
#include "platform/Turn.h"
#include "platform/linux/NoThreads.h"
#include "platform/linux/process/Thread.h"
#include "platform/linux/queues/LinuxWorkQueues.h"
#include "platform/linux/queues/SerialQueue.h"
#include "platform/linux/queues/ThreadHeap.h"
#include "support/ProcessThreads.h"
#include "support/WatchedThread.h"

#include <algorithm>
#include <array>
#include <atomic>
#include <future>
#include <gtest/gtest.h>
#include <latch>
#include <optional>
#include <pthread.h>
#include <set>
#include <string>
#include <sys/resource.h>
#include <thread>
#include <unistd.h>
#include <vector>

namespace platform {
namespace {

using namespace std::chrono_literals;
using support::threadsOfTheProcess;

class WorkQueuesTest : public testing::Test {
protected:
    std::shared_ptr<WorkQueue> makeQueue(QualityOfService quality = QualityOfService::Default)
    {
        return queues.makeSerialQueue("com.quarn.kesto.test", {.quality = quality});
    }

    // Returns when everything that was submitted to the serial queue earlier has run.
    void drain(WorkQueue& queue)
    {
        const auto done = queues.makeSemaphore(0);
        queue.submit([&] { done->signal(); });
        done->wait();
    }

    LinuxWorkQueues queues{24h}; // turns do not end before their items, however slow the machine is
};

std::string nameOfThisThread()
{
    std::array<char, 16> name = {};
    pthread_getname_np(pthread_self(), name.data(), name.size());
    return name.data();
}

int niceValue(id_t id)
{
    return getpriority(PRIO_PROCESS, id);
}

TEST_F(WorkQueuesTest, SerialQueueRunsOneItemAtATimeInTheOrderOfEachSubmitter)
{
    constexpr int submitters = 4;
    constexpr int items = 2000;
    const auto queue = makeQueue(QualityOfService::UserInteractive);
    std::vector<std::vector<int>> ran(submitters); // no lock: only the queue uses it
    {
        std::vector<std::jthread> threads;
        for (int submitter = 0; submitter < submitters; ++submitter) {
            threads.emplace_back([&, submitter] {
                for (int item = 0; item < items; ++item)
                    queue->submit(
                        [&ran, submitter, item] { ran[static_cast<std::size_t>(submitter)].push_back(item); });
            });
        }
    }
    drain(*queue);
    for (const auto& ofOne : ran) {
        EXPECT_EQ(ofOne.size(), static_cast<std::size_t>(items));
        EXPECT_TRUE(std::ranges::is_sorted(ofOne));
    }
}

// The history of a queue with turns: numbers are items, 0 is the end of a turn.
class TurnsTest : public WorkQueuesTest {
protected:
    TurnsTest()
    {
        queues.setTurnEndHandler([this](Turn&) {
            history.push_back(0);
            threads.push_back(std::this_thread::get_id());
        });
        queue = queues.makeTurnQueue("com.quarn.kesto.test", {.mayBeHelped = true});
        waitUntilAsleep();
    }
    ~TurnsTest() override { queue.reset(); }

    // Waits until the queue's thread sleeps, so that it runs nothing until it is woken.
    void waitUntilAsleep()
    {
        queue->submit([&] { queueThread = gettid(); });
        drain(*queue);
        while (!support::isAsleep(queueThread))
            std::this_thread::yield();
        SerialQueue::Helper helper;
        queue->submit([] { });
        helper.help(); // from now on this thread sees the other thread's changes
        history.clear();
        threads.clear();
    }

    void submit(int item)
    {
        queue->submit([this, item] {
            history.push_back(item);
            threads.push_back(std::this_thread::get_id());
        });
    }

    std::vector<int> history;
    std::vector<std::thread::id> threads;
    pid_t queueThread = 0;
    std::shared_ptr<TurnQueue> queue;
};

TEST_F(TurnsTest, WhatGatheredWhileATurnRanIsTheNextTurn)
{
    const auto begun = queues.makeSemaphore(0);
    const auto gathered = queues.makeSemaphore(0);
    queue->submit([&] {
        begun->signal();
        gathered->wait();
        history.push_back(1);
    });
    begun->wait();
    for (int item = 2; item <= 5; ++item)
        submit(item);
    gathered->signal();
    queue.reset(); // runs everything
    EXPECT_EQ(history, (std::vector<int>{1, 0, 2, 3, 4, 5, 0}));
}

TEST_F(TurnsTest, ATurnEndsWhenAllThatItsItemsHeldIsGone)
{
    class Note {
    public:
        explicit Note(std::vector<int>& history) : history_(history) { }
        ~Note() { history_.push_back(7); }

    private:
        std::vector<int>& history_;
    };
    queue->submit([note = std::make_shared<Note>(history)] { });
    queue.reset();
    EXPECT_EQ(history, (std::vector<int>{7, 0}));
}

// The events that turns gathered and handed over: their numbers, turn by turn.
class GatheringTurns : public WorkQueuesTest {
protected:
    GatheringTurns()
    {
        queues.setTurnEndHandler([this](Turn& turn) {
            std::vector<double> numbers;
            for (const EventRow& event : turn.events.rows())
                numbers.push_back(event.time);
            gathered.push_back(std::move(numbers));
            wasCurrent = queueOfHandler == nullptr || queueOfHandler->isCurrent();
            turn.events.clear();
        });
    }
    auto adding(int number)
    {
        return [number](Turn& turn) { turn.events.add(number, "event", {}); };
    }

    std::vector<std::vector<double>> gathered;
    WorkQueue* queueOfHandler = nullptr;
    bool wasCurrent = false;
};

TEST_F(GatheringTurns, HandOverAllThatTheirItemsAddedAndBeginEmpty)
{
    auto queue = queues.makeTurnQueue("com.quarn.kesto.test", {});
    const auto begun = queues.makeSemaphore(0);
    const auto submitted = queues.makeSemaphore(0);
    queue->submit([&](Turn& turn) {
        begun->signal();
        submitted->wait();
        turn.events.add(1, "event", {});
    });
    begun->wait();
    queue->submit(adding(2));
    queue->submit([] { }); // gathers nothing
    queue->submit(adding(3));
    submitted->signal();
    queue.reset();
    EXPECT_EQ(gathered, (std::vector<std::vector<double>>{{1}, {2, 3}}));
}

TEST_F(GatheringTurns, HandOverWhatTheyGatheredOnTheirQueue)
{
    auto queue = queues.makeTurnQueue("com.quarn.kesto.test", {});
    queueOfHandler = queue.get();
    queue->submit(adding(1));
    queue.reset();
    EXPECT_TRUE(wasCurrent);
}

TEST_F(GatheringTurns, OfTwoQueuesAreTwo)
{
    auto one = queues.makeTurnQueue("one", {});
    auto other = queues.makeTurnQueue("other", {});
    one->submit([&](Turn& turn) {
        turn.events.add(1, "event", {});
        other->submit(adding(2));
        other.reset(); // returns at the end of that turn
        turn.events.add(3, "event", {});
    });
    one.reset();
    EXPECT_EQ(gathered, (std::vector<std::vector<double>>{{2}, {1, 3}}));
}

TEST_F(GatheringTurns, AreTheSameWhenAHelperRunsThem)
{
    auto queue = queues.makeTurnQueue("com.quarn.kesto.test", {.mayBeHelped = true});
    {
        const SerialQueue::Helper helper;
        queue->submit(adding(1));
        queue->submit(adding(2));
    }
    queue.reset();
    EXPECT_EQ(gathered, (std::vector<std::vector<double>>{{1, 2}}));
}

TEST_F(TurnsTest, AHelperRunsATurnItselfWithItsEnd)
{
    SerialQueue::Helper helper;
    submit(1);
    submit(2);
    EXPECT_TRUE(history.empty()); // no thread was woken, so this is not a race
    helper.help();
    EXPECT_EQ(history, (std::vector<int>{1, 2, 0}));
    EXPECT_EQ(std::set(threads.begin(), threads.end()), std::set{std::this_thread::get_id()});
    helper.help();
    EXPECT_EQ(history.size(), 3U) << "there was no other turn";
    submit(3);
    helper.help();
    EXPECT_EQ(history, (std::vector<int>{1, 2, 0, 3, 0}));
}

// What a helper leaves to the queue's thread.
class LeftTurnsTest : public testing::Test {
protected:
    std::shared_ptr<TurnQueue> makeQueue(std::chrono::nanoseconds longestTurn, bool wouldWait)
    {
        queues.emplace(longestTurn);
        queues->setTurnEndHandler([this](Turn&) { note("end"); }, [wouldWait] { return wouldWait; });
        return queues->makeTurnQueue("com.quarn.kesto.test", {.mayBeHelped = true});
    }
    void note(const std::string& event)
    {
        history.push_back(event + (std::this_thread::get_id() == helperThread ? " helped" : ""));
    }

    const std::thread::id helperThread = std::this_thread::get_id();
    std::vector<std::string> history;
    std::optional<LinuxWorkQueues> queues;
};

TEST_F(LeftTurnsTest, ATurnThatHasTakenLongEnoughEndsAndTheRestIsTheNextOne)
{
    auto queue = makeQueue(0ns, false);
    const auto slow = [this](const char* name) { // so that it is taken alone
        return [this, name] {
            std::this_thread::sleep_for(1ms);
            note(name);
        };
    };
    SerialQueue::Helper helper;
    queue->submit(slow("first"));
    queue->submit(slow("second"));
    queue->submit(slow("third"));
    helper.help();
    queue.reset();
    EXPECT_EQ(history, (std::vector<std::string>{"first helped", "end helped", "second", "end", "third", "end"}));
}

TEST_F(LeftTurnsTest, AHelperRunsASingleItemHoweverShortATurnMayBe)
{
    auto queue = makeQueue(0ns, false);
    SerialQueue::Helper helper;
    queue->submit([&] { note("first"); });
    helper.help();
    queue->submit([&] { note("second"); });
    helper.help();
    queue.reset();
    EXPECT_EQ(history, (std::vector<std::string>{"first helped", "end helped", "second helped", "end helped"}));
}

TEST_F(LeftTurnsTest, AHelperLeavesTheEndIfThatWouldWait)
{
    auto queue = makeQueue(24h, true);
    SerialQueue::Helper helper;
    queue->submit([&] { note("first"); });
    queue->submit([&] { note("second"); });
    helper.help();
    queue.reset();
    EXPECT_EQ(history, (std::vector<std::string>{"first helped", "second helped", "end"}));
}

TEST_F(LeftTurnsTest, NoHelperRunsAnItemThatMayTakeLong)
{
    constexpr int rounds = 200; // because the queue's thread may be faster than the helper
    auto queue = makeQueue(24h, false);
    {
        SerialQueue::Helper helper;
        for (int round = 0; round < rounds; ++round) {
            queue->submit([&] { note("short"); });
            queue->submitLong([&](Turn&) { note("long"); });
            queue->submit([&] { note("short"); });
            helper.help();
        }
    }
    queue.reset();
    EXPECT_EQ(std::ranges::count(history, "long"), rounds);
    EXPECT_FALSE(std::ranges::count(history, "long helped"));
    std::erase_if(history, [](const std::string& event) { return event.starts_with("end"); });
    for (std::size_t place = 0; place < history.size(); ++place)
        EXPECT_EQ(history[place].starts_with("long"), place % 3 == 1) << "they keep their order";
}

TEST_F(LeftTurnsTest, AnItemThatMayTakeLongDoesNotWaitForHelp)
{
    auto queue = makeQueue(24h, false);
    const auto done = queues->makeSemaphore(0);
    const SerialQueue::Helper helper;
    queue->submitLong([&](Turn&) { done->signal(); });
    done->wait();
    queue.reset();
}

TEST_F(LeftTurnsTest, WhatIsSubmittedWhileATurnIsLeftComesBehindIt)
{
    constexpr int items = 3000;
    auto queue = makeQueue(0ns, false);
    std::vector<int> ran;
    {
        SerialQueue::Helper helper;
        for (int item = 0; item < items; ++item) {
            queue->submit([&ran, item] { ran.push_back(item); });
            if (item % 5 == 4)
                helper.help();
        }
    }
    queue.reset();
    EXPECT_EQ(ran.size(), 3000U);
    EXPECT_TRUE(std::ranges::is_sorted(ran));
}

// A queue with lanes. The names of the items that ran, in order.
class LanesTest : public WorkQueuesTest {
protected:
    // Holds the queue up until `go`, so that all that is submitted meanwhile waits.
    void hold()
    {
        holder->submit([this] {
            begun->signal();
            mayGo->wait();
        });
        begun->wait();
    }
    void go() { mayGo->signal(); }
    void submit(Lane& lane, const std::string& name, std::chrono::milliseconds time = 0ms)
    {
        lane.submit([this, name, time] {
            for (const auto end = std::chrono::steady_clock::now() + time; std::chrono::steady_clock::now() < end;) { }
            ran.push_back(name);
        });
    }

    const std::unique_ptr<Semaphore> begun = queues.makeSemaphore(0);
    const std::unique_ptr<Semaphore> mayGo = queues.makeSemaphore(0);
    std::vector<std::string> ran;
    std::shared_ptr<TurnQueue> queue = queues.makeTurnQueue("com.quarn.kesto.test", {.mayBeHelped = true});
    const std::shared_ptr<Lane> holder = queue->makeLane({});
};

TEST_F(LanesTest, AnItemDoesNotWaitForTheManyOfAnotherLane)
{
    const auto flood = queue->makeLane({1000, 1});
    const auto other = queue->makeLane({1000, 1});
    hold();
    for (int item = 0; item < 100; ++item)
        submit(*flood, "flood", 1ms);
    submit(*other, "other", 1ms);
    go();
    queue.reset();
    ASSERT_EQ(ran.size(), 101U);
    EXPECT_LE(std::ranges::find(ran, "other") - ran.begin(), 2);
}

TEST_F(LanesTest, AUserDoesNotWaitForTheManyLanesOfAnother)
{
    std::vector<std::shared_ptr<Lane>> flood;
    const auto other = queue->makeLane({1001, 1});
    hold();
    for (int lane = 0; lane < 20; ++lane) {
        flood.push_back(queue->makeLane({1000, 1}));
        for (int item = 0; item < 5; ++item)
            submit(*flood.back(), "flood", 1ms);
    }
    for (int item = 0; item < 5; ++item)
        submit(*other, "other", 1ms);
    go();
    queue.reset();
    EXPECT_EQ(std::ranges::count(ran.begin(), ran.begin() + 20, "other"), 5) << "10 would be enough on a quiet machine";
}

// As when other programs keep the thread from its processor.
TEST_F(LanesTest, ALanePaysForNoTimeInWhichTheThreadWaits)
{
    const auto unlucky = queue->makeLane({1000, 1});
    const auto other = queue->makeLane({1001, 1});
    hold();
    unlucky->submit([] { std::this_thread::sleep_for(50ms); });
    submit(*unlucky, "unlucky");
    for (int item = 0; item < 100; ++item)
        submit(*other, "other", 1ms);
    go();
    queue.reset();
    ASSERT_EQ(ran.size(), 101U);
    EXPECT_LE(std::ranges::find(ran, "unlucky") - ran.begin(), 10) << "it pays for the sleep if it comes after 50";
}

TEST_F(LanesTest, TheQueueItselfIsALaneOfItsOwnUser)
{
    const auto flood = queue->makeLane({1000, 1});
    hold();
    for (int item = 0; item < 100; ++item)
        submit(*flood, "flood", 1ms);
    queue->submit([this] { ran.emplace_back("queue"); });
    go();
    queue.reset();
    EXPECT_LE(std::ranges::find(ran, "queue") - ran.begin(), 1);
}

TEST_F(LanesTest, AnItemOfALaneIsCurrentOnItsQueue)
{
    const auto lane = queue->makeLane({1000, 1});
    bool isCurrent = false;
    lane->submit([&] { isCurrent = queue->isCurrent() && lane->isCurrent(); });
    drain(*lane);
    EXPECT_TRUE(isCurrent);
}

TEST_F(LanesTest, TheTimeThatItsItemsTakeCountsInALanesWorkload)
{
    ledger::Workloads workloads;
    const auto busy = workloads.open(1000);
    const auto idle = workloads.open(1000);
    const auto lane = queue->makeLane({1000, 1});
    const auto other = queue->makeLane({1000, 1});
    lane->setWorkload(busy);
    other->setWorkload(idle);
    const auto begin = std::chrono::steady_clock::now();
    for (int item = 0; item < 3; ++item)
        submit(*lane, "a", 5ms);
    queue.reset();
    EXPECT_GE(busy->work().time, 15ms);
    EXPECT_LE(busy->work().time, std::chrono::steady_clock::now() - begin);
    EXPECT_EQ(idle->work().time, 0ms);
}

TEST_F(LanesTest, ItsItemsWriteToTheLogForTheirLanesShare)
{
    const auto share = std::make_shared<LogShare>("client 7");
    const auto lane = queue->makeLane({1000, 1});
    const auto other = queue->makeLane({1000, 1});
    lane->setLogShare(share);
    LogShare* ofLane = nullptr;
    LogShare* ofOther = share.get();
    lane->submit([&] { ofLane = LogShare::ofThisThread(); });
    other->submit([&] { ofOther = LogShare::ofThisThread(); });
    queue.reset();
    EXPECT_EQ(ofLane, share.get());
    EXPECT_EQ(ofOther, nullptr);
}

TEST_F(LanesTest, AFullLaneSaysOnceWhenItHasRoomAgain)
{
    const auto lane = queue->makeLane({1000, 1});
    std::atomic<int> calls = 0;
    lane->setRoomHandler([&] { ++calls; });
    hold();
    for (int item = 0; item < 511; ++item)
        submit(*lane, "a");
    EXPECT_FALSE(lane->isFull(0));
    submit(*lane, "a");
    EXPECT_TRUE(lane->isFull(0));
    EXPECT_EQ(calls, 0);
    go();
    queue.reset();
    EXPECT_EQ(calls, 1);
    EXPECT_EQ(ran.size(), 512U);
}

TEST_F(LanesTest, AQueueThatEndsWaitsForLanesThatPause)
{
    const auto elsewhere = queues.makeSerialQueue("com.quarn.kesto.test", {});
    const auto lane = queue->makeLane({1000, 1});
    lane->submitLong([&](Turn&) {
        begun->signal();
        elsewhere->submit([this, resume = lane->pause()]() mutable {
            mayGo->wait();
            resume([this](Turn&) { ran.emplace_back("goes on"); });
        });
    });
    submit(*lane, "behind");
    begun->wait();
    elsewhere->submit([] { });
    go();
    queue.reset();
    EXPECT_EQ(ran, (std::vector<std::string>{"goes on", "behind"}));
}

TEST_F(LanesTest, AHelperServesLanesInTheSameOrder)
{
    const auto flood = queue->makeLane({1000, 1});
    const auto other = queue->makeLane({1001, 1});
    hold();
    for (int item = 0; item < 10; ++item)
        submit(*flood, "flood", 1ms);
    submit(*other, "other");
    {
        const SerialQueue::Helper helper;
        go();
        submit(*flood, "flood", 1ms);
    }
    queue.reset();
    EXPECT_LE(std::ranges::find(ran, "other") - ran.begin(), 1);
}

TEST_F(TurnsTest, AHelpedTurnIsTheQueues)
{
    SerialQueue::Helper helper;
    bool isCurrent = false;
    queue->submit([&] { isCurrent = queue->isCurrent(); });
    helper.help();
    EXPECT_TRUE(isCurrent);
    EXPECT_FALSE(queue->isCurrent());
}

TEST_F(TurnsTest, AHelperThatLeavesRunsWhatItHasSubmitted)
{
    {
        const SerialQueue::Helper helper;
        submit(1);
    }
    EXPECT_EQ(history, (std::vector<int>{1, 0}));
}

TEST_F(TurnsTest, WhatIsSubmittedDuringAHelpedTurnGoesToTheQueuesThread)
{
    SerialQueue::Helper helper;
    const auto done = queues.makeSemaphore(0);
    queue->submit([&] {
        history.push_back(1);
        submit(2); // on the turn's own thread
        std::jthread([&] { queue->submit([&] { done->signal(); }); }); // and on another thread
    });
    helper.help();
    done->wait(); // without help
    queue.reset();
    EXPECT_EQ(history, (std::vector<int>{1, 0, 2, 0}));
    EXPECT_NE(threads.back(), std::this_thread::get_id());
}

TEST_F(TurnsTest, TheQueuesThreadWaitsUntilAHelpedTurnHasEnded)
{
    SerialQueue::Helper helper;
    std::jthread other;
    queue->submit([&] {
        submit(2);
        std::atomic<pid_t> otherThread = 0;
        other = std::jthread([&] {
            otherThread = gettid();
            queue.reset(); // wakes the queue's thread, which has work
        });
        while (otherThread == 0 || !support::isAsleep(otherThread) || !support::isAsleep(queueThread))
            std::this_thread::yield();
        history.push_back(1);
    });
    helper.help();
    other.join();
    EXPECT_EQ(history, (std::vector<int>{1, 0, 2, 0}));
}

TEST_F(TurnsTest, ABurstGoesToTheQueuesThread)
{
    const SerialQueue::Helper helper;
    const auto done = queues.makeSemaphore(0);
    for (std::size_t item = 0; item < SerialQueue::mostItemsHelpedWith; ++item)
        submit(1);
    EXPECT_TRUE(history.empty());
    queue->submit([&] { done->signal(); });
    done->wait(); // without help
    queue.reset();
    EXPECT_EQ(std::ranges::count(history, 1), SerialQueue::mostItemsHelpedWith);
    EXPECT_FALSE(std::ranges::count(threads, std::this_thread::get_id()));
}

TEST_F(TurnsTest, NobodyHelpsWithAQueueThatIsBusy)
{
    const auto begun = queues.makeSemaphore(0);
    const auto proceed = queues.makeSemaphore(0);
    queue->submit([&] {
        begun->signal();
        proceed->wait();
    });
    begun->wait();
    SerialQueue::Helper helper;
    submit(1);
    helper.help();
    EXPECT_TRUE(history.empty());
    proceed->signal();
    queue.reset();
    EXPECT_EQ(history, (std::vector<int>{0, 1, 0}));
}

TEST_F(TurnsTest, TurnsOfHelpersAndOfTheQueuesThreadNeverOverlap)
{
    constexpr int items = 3000;
    int ran = 0; // no lock: only turns use it
    {
        std::vector<std::jthread> threadsOfHelpers;
        for (int helpers = 0; helpers < 2; ++helpers) {
            threadsOfHelpers.emplace_back([&] {
                SerialQueue::Helper helper;
                for (int item = 0; item < items; ++item) {
                    queue->submit([&] { ++ran; });
                    if (item % 3 == 0)
                        helper.help();
                }
            });
        }
        for (int item = 0; item < items; ++item)
            queue->submit([&] { ++ran; });
    }
    queue.reset();
    EXPECT_EQ(ran, 3 * items);
}

TEST_F(TurnsTest, TheQueuesThreadWakesToTidyItsHeap)
{
    const std::uint64_t before = support::timesAsleep(queueThread);
    ThreadHeap::askAll();
    const auto deadline = std::chrono::steady_clock::now() + 20s;
    while (support::timesAsleep(queueThread) == before && std::chrono::steady_clock::now() < deadline)
        std::this_thread::yield();
    EXPECT_GT(support::timesAsleep(queueThread), before);
}

TEST_F(TurnsTest, AQueueMayBeDroppedByAnItemThatAHelperRuns)
{
    SerialQueue::Helper helper;
    queue->submit([&] {
        history.push_back(1);
        queue.reset();
    });
    helper.help();
    EXPECT_EQ(history, (std::vector<int>{1, 0}));
}

TEST_F(WorkQueuesTest, OnlyQueuesThatMayBeHelpedAre)
{
    const auto queue = makeQueue(QualityOfService::UserInteractive);
    const SerialQueue::Helper helper;
    const auto done = queues.makeSemaphore(0);
    queue->submit([&] { done->signal(); });
    done->wait(); // its own thread has run the item
}

TEST_F(WorkQueuesTest, AThreadThatHelpsHoldsNoLockWhileItSubmits)
{
    GTEST_FLAG_SET(death_test_style, "threadsafe");
    foundation::Mutex mutex;
    {
        const auto helpedByOthers = queues.makeTurnQueue("com.quarn.kesto.test", {.mayBeHelped = true});
        const foundation::Lock lock(mutex);
        helpedByOthers->submit([] { }); // this thread never runs the item
    }
    EXPECT_DEBUG_DEATH(
        {
            const auto helped = queues.makeTurnQueue("com.quarn.kesto.test", {.mayBeHelped = true});
            const SerialQueue::Helper helper;
            const foundation::Lock lock(mutex);
            helped->submit([] { });
        },
        "isAnyHeld");
}

TEST_F(WorkQueuesTest, AThreadThatHelpsHoldsNoLockWhenItWouldSleep)
{
    GTEST_FLAG_SET(death_test_style, "threadsafe");
    foundation::Mutex mutex;
    EXPECT_DEBUG_DEATH(
        {
            SerialQueue::Helper helper;
            const foundation::Lock lock(mutex);
            helper.help(); // even though there is nothing to help with
        },
        "isAnyHeld");
}

TEST_F(WorkQueuesTest, AQueueThatGoesRunsWhatWasSubmittedBefore)
{
    int ran = 0;
    auto queue = makeQueue();
    for (int item = 0; item < 1000; ++item)
        queue->submit([&] { ++ran; });
    queue.reset();
    EXPECT_EQ(ran, 1000);
}

TEST_F(WorkQueuesTest, QueuesOutliveTheirMaker)
{
    auto maker = std::make_unique<LinuxWorkQueues>();
    const auto queue = maker->makeSerialQueue("left", {});
    maker.reset();
    drain(*queue);
}

TEST_F(WorkQueuesTest, ThreadsHaveTheLastWordsOfTheirQueuesName)
{
    EXPECT_EQ(threadName("Tracing Queue"), "Tracing Queue");
    EXPECT_EQ(threadName("com.quarn.kesto.reporting.server"), "server");
    EXPECT_EQ(threadName("com.short"), "com.short");
    EXPECT_EQ(threadName("com.fifteen.abc"), "com.fifteen.abc");
    EXPECT_EQ(threadName("a-name-without-any-dot"), "a-name-without-");

    const auto queue = makeQueue();
    std::string name;
    queue->submit([&] { name = nameOfThisThread(); });
    drain(*queue);
    EXPECT_EQ(name, "kesto.test");
}

TEST_F(WorkQueuesTest, PrioritiesFollowTheQualityOfServiceAsFarAsTheProcessMay)
{
    const int ofTheProcess = niceValue(0);
    int interactive = 99;
    int ordinary = 99;
    int background = 99;
    const auto interactiveQueue = makeQueue(QualityOfService::UserInteractive);
    interactiveQueue->submit([&] {
        interactive = niceValue(static_cast<id_t>(gettid()));
        const auto ordinaryQueue = makeQueue(QualityOfService::Default); // this thread has another priority
        ordinaryQueue->submit([&] { ordinary = niceValue(static_cast<id_t>(gettid())); });
        drain(*ordinaryQueue);
    });
    drain(*interactiveQueue);
    const auto done = queues.makeSemaphore(0);
    queues.backgroundQueue().submit([&] {
        background = niceValue(static_cast<id_t>(gettid()));
        done->signal();
    });
    done->wait();
    EXPECT_TRUE(interactive == ofTheProcess - 10 || interactive == ofTheProcess) << interactive;
    EXPECT_EQ(ordinary, ofTheProcess);
    EXPECT_EQ(background, std::min(ofTheProcess + 10, 19));
}

TEST_F(WorkQueuesTest, WhatDelaysWorkIsNoNicerThanTheProcess)
{
    queues.submitAfter(1h, queues.backgroundQueue(), [] { });
    EXPECT_EQ(support::nicenessBeyondOwn("delayed work"), 0);
}

TEST_F(WorkQueuesTest, AHelperHasThePriorityOfTheQueuesThatItHelpsAsLongAsItDoes)
{
    const int ofTheProcess = niceValue(0);
    int ofTheQueue = 99;
    const auto queue = makeQueue(QualityOfService::UserInteractive);
    queue->submit([&] { ofTheQueue = niceValue(static_cast<id_t>(gettid())); });
    drain(*queue);
    if (ofTheQueue == ofTheProcess)
        GTEST_SKIP() << "this process may not raise priorities";
    {
        const SerialQueue::Helper helper;
        EXPECT_EQ(niceValue(0), ofTheQueue);
        int ordinary = 99;
        const auto ordinaryQueue = makeQueue(QualityOfService::Default);
        ordinaryQueue->submit([&] { ordinary = niceValue(static_cast<id_t>(gettid())); });
        drain(*ordinaryQueue);
        EXPECT_EQ(ordinary, ofTheProcess) << "a new thread does not get its helper's priority";
    }
    EXPECT_EQ(niceValue(0), ofTheProcess);
}

TEST_F(WorkQueuesTest, BackgroundItemsRunSideBySideOnAFewThreads)
{
    constexpr std::size_t items = 40;
    const std::size_t threadsBefore = threadsOfTheProcess();
    std::latch together(BackgroundQueue::mostThreads + 1); // reached only if so many run at the same time
    std::latch done(items);
    for (std::size_t item = 0; item < items; ++item) {
        queues.backgroundQueue().submit([&, item] {
            if (item < BackgroundQueue::mostThreads)
                together.arrive_and_wait();
            EXPECT_TRUE(queues.backgroundQueue().isCurrent());
            done.count_down();
        });
    }
    EXPECT_EQ(threadsOfTheProcess() - threadsBefore, BackgroundQueue::mostThreads);
    together.count_down();
    done.wait();
    EXPECT_FALSE(queues.backgroundQueue().isCurrent());
}

TEST_F(WorkQueuesTest, NoThreadIsStartedBeforeThereIsWorkForIt)
{
    const std::size_t threadsBefore = threadsOfTheProcess();
    LinuxWorkQueues others;
    EXPECT_EQ(threadsOfTheProcess(), threadsBefore);
    const auto done = queues.makeSemaphore(0);
    others.backgroundQueue().submit([&] { done->signal(); });
    done->wait();
    EXPECT_EQ(threadsOfTheProcess(), threadsBefore + 1);
}

TEST_F(WorkQueuesTest, BackgroundItemsMaySubmitAndAllRunBeforeTheQueueGoes)
{
    std::atomic<int> ran = 0;
    {
        BackgroundQueue queue;
        for (int item = 0; item < 500; ++item) {
            queue.submit([&] {
                ++ran;
                queue.submit([&] { ++ran; });
            });
        }
    }
    EXPECT_EQ(ran, 1000);
}

TEST_F(WorkQueuesTest, BackgroundItemsThatNoThreadCameForRunBeforeTheQueueGoes)
{
    const support::NoThreads none;
    int ran = 0;
    {
        BackgroundQueue queue;
        queue.submit([&] {
            ++ran;
            EXPECT_TRUE(queue.isCurrent());
            queue.submit([&] { ++ran; });
        });
    }
    EXPECT_EQ(ran, 2);
}

TEST_F(TurnsTest, AQueueIsFinishedWhenTheEndOfItsLastTurnHasReturned)
{
    std::promise<void> begun;
    std::promise<void> goesOn;
    queue->submit([&] {
        queue->submit([&] { history.push_back(2); });
        begun.set_value();
        goesOn.get_future().wait();
        history.push_back(1);
    });
    begun.get_future().wait();
    EXPECT_EQ(queues.unfinished().ofTurnQueues, 2U) << "the one that runs, and the one that waits";
    goesOn.set_value();
    queues.finish();
    EXPECT_EQ(history, (std::vector{1, 0, 2, 0}));
    EXPECT_EQ(queues.unfinished().ofTurnQueues, 0U);
}

TEST_F(TurnsTest, AnItemIsUnfinishedUntilItsTurnIsOver)
{
    std::promise<void> begun;
    std::promise<void> goesOn;
    queue->submit([&] { // these three are one turn
        queue->submit([] { });
        queue->submit([] { });
        queue->submit([&] {
            begun.set_value();
            goesOn.get_future().wait();
        });
    });
    begun.get_future().wait();
    EXPECT_EQ(queues.unfinished().ofTurnQueues, 3U);
    goesOn.set_value();
    queues.finish();
}

TEST_F(WorkQueuesTest, TheQueuesFinishWhenBackgroundItemsThatTurnsSubmittedHaveRun)
{
    std::atomic<int> ran = 0;
    const auto queue = queues.makeTurnQueue("com.quarn.kesto.test", {});
    queue->submit([&] {
        queues.backgroundQueue().submit([&] {
            queues.backgroundQueue().submit([&] { ++ran; });
            ++ran;
        });
    });
    queues.finish();
    EXPECT_EQ(ran, 2);
    EXPECT_EQ(queues.unfinished().ofBackgroundQueue, 0U);
}

TEST_F(WorkQueuesTest, BackgroundItemsAreUnfinishedWhileTheyWaitAndRun)
{
    constexpr std::size_t waiting = 3;
    std::latch begun(BackgroundQueue::mostThreads);
    std::latch goesOn(1);
    for (std::size_t item = 0; item < BackgroundQueue::mostThreads + waiting; ++item)
        queues.backgroundQueue().submit([&, item] {
            if (item < BackgroundQueue::mostThreads)
                begun.count_down();
            goesOn.wait();
        });
    begun.wait();
    EXPECT_EQ(queues.unfinished().ofBackgroundQueue, BackgroundQueue::mostThreads + waiting);
    goesOn.count_down();
    queues.finish();
    EXPECT_EQ(queues.unfinished().ofBackgroundQueue, 0U);
}

TEST_F(WorkQueuesTest, DelayedItemsFromManyThreadsAllRun)
{
    constexpr int items = 500;
    const auto queue = makeQueue();
    std::latch done(4 * items);
    {
        std::vector<std::jthread> threads;
        for (int submitter = 0; submitter < 4; ++submitter) {
            threads.emplace_back([&] {
                for (int item = 0; item < items; ++item)
                    queues.submitAfter(std::chrono::microseconds(item % 7 * 100), *queue, [&] { done.count_down(); });
            });
        }
    }
    done.wait();
}

TEST_F(WorkQueuesTest, WhatIsNotDueYetIsDroppedAndHoldsNothingUp)
{
    const auto queue = makeQueue();
    auto held = std::make_shared<int>(1);
    const std::weak_ptr<int> watched = held;
    {
        LinuxWorkQueues others;
        others.submitAfter(24h, *queue, [held = std::move(held)] { ADD_FAILURE() << *held; });
        others.submitAfter(std::chrono::nanoseconds::max(), *queue, [] { ADD_FAILURE(); });
    }
    EXPECT_TRUE(watched.expired());
}

TEST_F(WorkQueuesTest, SemaphoreWakesEveryoneItLetsThrough)
{
    constexpr int waiters = 8;
    constexpr int rounds = 300;
    const auto semaphore = queues.makeSemaphore(0);
    std::atomic<int> passed = 0;
    {
        std::vector<std::jthread> threads;
        for (int waiter = 0; waiter < waiters; ++waiter) {
            threads.emplace_back([&] {
                for (int round = 0; round < rounds; ++round) {
                    semaphore->wait();
                    ++passed;
                }
            });
        }
        for (int signals = 0; signals < waiters * rounds; ++signals)
            semaphore->signal();
    }
    EXPECT_EQ(passed, waiters * rounds);
}

} // namespace
} // namespace platform
