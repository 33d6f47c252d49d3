// SPDX-License-Identifier: Apache-2.0
// The contract of platform/WorkQueue.h: the order of items, their threads, and waiting.
#include "platform/contract/Contract.h"
#include "platform/linux/NoThreads.h"
#include "platform/linux/queues/LinuxWorkQueues.h"
#include "support/fakes/FakeWorkQueues.h"

#include <gmock/gmock.h>
#include <optional>
#include <string>
#include <system_error>
#include <vector>

namespace contract {
namespace {

using namespace std::chrono_literals;
using platform::QualityOfService;
using platform::WorkQueue;
using testing::ElementsAre;
using Seconds = std::chrono::duration<double>;

class WorkQueuesSubject {
public:
    virtual ~WorkQueuesSubject() = default;
    [[nodiscard]] virtual platform::WorkQueues& queues() = 0;
    // Runs waiting items, if the queues have no threads.
    virtual void work() { }
    // Advances the time by so much, if it does not pass anyway.
    virtual void letPass(std::chrono::nanoseconds) { }
    [[nodiscard]] virtual Seconds now() const = 0;
    // Whether the process can start another thread.
    virtual void setThreads(bool areThere) = 0;
};

class FakeWorkQueuesSubject final : public WorkQueuesSubject {
public:
    [[nodiscard]] platform::WorkQueues& queues() override { return queues_; }
    void work() override { queues_.runAll(); }
    void letPass(std::chrono::nanoseconds duration) override { queues_.advance(duration); }
    [[nodiscard]] Seconds now() const override { return Seconds(clock_.systemUptime()); }
    void setThreads(bool areThere) override { queues_.hasThreads = areThere; }

private:
    support::FakeClock clock_;
    support::FakeWorkQueues queues_{clock_};
};

class LinuxWorkQueuesSubject final : public WorkQueuesSubject {
public:
    [[nodiscard]] platform::WorkQueues& queues() override { return queues_; }
    [[nodiscard]] Seconds now() const override { return std::chrono::steady_clock::now().time_since_epoch(); }
    void setThreads(bool areThere) override
    {
        noThreads_.reset();
        if (!areThere)
            noThreads_.emplace();
    }

private:
    std::optional<support::NoThreads> noThreads_;
    platform::LinuxWorkQueues queues_;
};

class WorkQueuesContract : public Suite<WorkQueuesSubject> {
protected:
    std::shared_ptr<WorkQueue> makeQueue(QualityOfService quality = QualityOfService::Default)
    {
        return subject->queues().makeSerialQueue("com.quarn.kesto.test", {.quality = quality});
    }
    void note(const std::string& what)
    {
        progress.change([&] { noted.push_back(what); });
    }
    auto noting(std::string what)
    {
        return [this, what = std::move(what)] { note(what); };
    }
    // Waits for so many notes and returns them.
    std::vector<std::string> waitForNotes(std::size_t count)
    {
        subject->work();
        EXPECT_TRUE(progress.waitFor([&] { return noted.size() >= count; }));
        return progress.look([&] { return noted; });
    }

    support::Progress progress;
    std::vector<std::string> noted;
};
KESTO_CONTRACT(WorkQueuesContract, (provider<WorkQueuesSubject, FakeWorkQueuesSubject>("Fake")),
               (provider<WorkQueuesSubject, LinuxWorkQueuesSubject>("Linux")));

// --- serial queues

TEST_P(WorkQueuesContract, SerialQueuesRunOneItemAtATimeInTheOrderOfSubmission)
{
    for (const auto quality :
         {QualityOfService::UserInteractive, QualityOfService::Default, QualityOfService::Background}) {
        const auto queue = makeQueue(quality);
        const std::size_t before = progress.look([&] { return noted.size(); });
        std::vector<int> ran; // no lock: one item at a time uses it
        for (int item = 0; item < 1000; ++item)
            queue->submit([&, item] { ran.push_back(item); });
        queue->submit(noting("done"));
        waitForNotes(before + 1);
        ASSERT_EQ(ran.size(), 1000U);
        EXPECT_TRUE(std::ranges::is_sorted(ran));
    }
}

TEST_P(WorkQueuesContract, WhatAnItemSubmitsToItsQueueRunsBehindWhatWaitsThereAlready)
{
    const auto queue = makeQueue();
    const auto begin = subject->queues().makeSemaphore(0);
    queue->submit([&] { begin->wait(); });
    queue->submit([&] {
        note("a");
        queue->submit(noting("c"));
    });
    queue->submit(noting("b"));
    begin->signal();
    EXPECT_THAT(waitForNotes(3), ElementsAre("a", "b", "c"));
}

TEST_P(WorkQueuesContract, TheItemsOfALaneRunOnItsQueueInTheirOrder)
{
    const auto queue = subject->queues().makeTurnQueue("com.quarn.kesto.test", {});
    const auto lane = queue->makeLane({1000, 1});
    EXPECT_FALSE(lane->isCurrent());
    lane->submit([&] { note(queue->isCurrent() && lane->isCurrent() ? "current" : "not current"); });
    lane->submitLong([&](platform::Turn&) { note("long"); });
    lane->submit([&](platform::Turn&) { note("with its turn"); });
    EXPECT_THAT(waitForNotes(3), ElementsAre("current", "long", "with its turn"));
}

TEST_P(WorkQueuesContract, TheItemsOfAllLanesRunOneAtATime)
{
    const auto queue = subject->queues().makeTurnQueue("com.quarn.kesto.test", {});
    std::vector<std::shared_ptr<platform::Lane>> lanes;
    for (std::uint32_t user = 0; user < 4; ++user)
        lanes.push_back(queue->makeLane({user / 2, 1}));
    int ran = 0; // no lock: one item at a time uses it
    for (int item = 0; item < 1000; ++item)
        lanes[static_cast<std::size_t>(item) % lanes.size()]->submit([&] {
            if (++ran == 1000)
                note("done");
        });
    waitForNotes(1);
    EXPECT_EQ(ran, 1000);
}

TEST_P(WorkQueuesContract, AnItemOfALaneMaySubmitToAnother)
{
    const auto queue = subject->queues().makeTurnQueue("com.quarn.kesto.test", {});
    const auto one = queue->makeLane({1000, 1});
    const auto other = queue->makeLane({1001, 1});
    int seen = 0;
    one->submit([&] {
        seen = 1;
        other->submit([&] { note(std::to_string(seen)); });
    });
    EXPECT_THAT(waitForNotes(1), ElementsAre("1"));
}

TEST_P(WorkQueuesContract, ALaneThatPausesHoldsBackItsItemsAndNoOthers)
{
    const auto queue = subject->queues().makeTurnQueue("com.quarn.kesto.test", {});
    const auto elsewhere = makeQueue();
    const auto lane = queue->makeLane({1000, 1});
    const auto other = queue->makeLane({1000, 1});
    platform::Lane::Resume resume;
    lane->submitLong([&](platform::Turn&) {
        resume = lane->pause();
        note("pauses");
    });
    lane->submit(noting("held back"));
    waitForNotes(1);
    lane->submit(noting("held back, too"));
    other->submit(noting("of another lane"));
    queue->submit(noting("of the queue"));
    EXPECT_THAT(waitForNotes(3), testing::UnorderedElementsAre("pauses", "of another lane", "of the queue"));
    elsewhere->submit([&] { resume([&](platform::Turn&) { note(queue->isCurrent() ? "goes on" : "not current"); }); });
    const auto all = waitForNotes(6);
    EXPECT_THAT(std::vector(all.begin() + 3, all.end()), ElementsAre("goes on", "held back", "held back, too"));
}

TEST_P(WorkQueuesContract, ALaneMayGoOnBeforeTheItemThatPausedItIsOver)
{
    const auto queue = subject->queues().makeTurnQueue("com.quarn.kesto.test", {});
    const auto lane = queue->makeLane({1000, 1});
    lane->submitLong([&](platform::Turn&) {
        lane->pause()([&](platform::Turn&) { note("goes on"); });
        note("pauses");
    });
    lane->submit(noting("behind"));
    EXPECT_THAT(waitForNotes(3), ElementsAre("pauses", "goes on", "behind"));
}

TEST_P(WorkQueuesContract, ALaneMayPauseAgainAndAgain)
{
    const auto queue = subject->queues().makeTurnQueue("com.quarn.kesto.test", {});
    const auto elsewhere = makeQueue();
    const auto lane = queue->makeLane({1000, 1});
    for (int item = 0; item < 100; ++item)
        lane->submitLong([&, item](platform::Turn&) {
            elsewhere->submit([&, item, resume = lane->pause()]() mutable {
                resume([&, item](platform::Turn&) { note(std::to_string(item)); });
            });
        });
    const auto all = waitForNotes(100);
    ASSERT_EQ(all.size(), 100U);
    for (int item = 0; item < 100; ++item)
        EXPECT_EQ(all[static_cast<std::size_t>(item)], std::to_string(item));
}

TEST_P(WorkQueuesContract, ALaneWithFewItemsIsNotFull)
{
    const auto queue = subject->queues().makeTurnQueue("com.quarn.kesto.test", {});
    const auto lane = queue->makeLane({1000, 1});
    lane->setRoomHandler([] { ADD_FAILURE() << "it was never full"; });
    lane->submit(noting("a"));
    EXPECT_FALSE(lane->isFull(0));
    waitForNotes(1);
}

TEST_P(WorkQueuesContract, ALaneReleasesWhatItsItemsHoldWhenAllOfThemHaveRun)
{
    const auto queue = subject->queues().makeTurnQueue("com.quarn.kesto.test", {});
    const auto lane = queue->makeLane({1000, 1});
    std::atomic<std::size_t> released = 0;
    lane->setReleaseHandler([&](std::size_t bytes) {
        released = bytes;
        note("released");
    });
    lane->submit(noting("a"));
    lane->submit([&] { note(released == 0 ? "b" : "b, after the release"); });
    static_cast<void>(lane->isFull(700));
    EXPECT_THAT(waitForNotes(3), ElementsAre("a", "b", "released"));
    EXPECT_EQ(released, 700U);
}

TEST_P(WorkQueuesContract, AQueueIsCurrentWhileItRunsAnItemAndNowhereElse)
{
    const auto queue = makeQueue();
    const auto other = makeQueue();
    EXPECT_FALSE(queue->isCurrent());
    queue->submit([&] {
        note(queue->isCurrent() ? "current" : "not current");
        note(other->isCurrent() || subject->queues().backgroundQueue().isCurrent() ? "another, too" : "no other");
    });
    EXPECT_THAT(waitForNotes(2), ElementsAre("current", "no other"));
    EXPECT_FALSE(queue->isCurrent());
}

TEST_P(WorkQueuesContract, AnItemThatWaitsHoldsUpItsQueueAndNoOther)
{
    const auto queue = makeQueue();
    const auto other = makeQueue();
    const auto semaphore = subject->queues().makeSemaphore(0);
    queue->submit([&] {
        semaphore->wait();
        note("waited");
    });
    queue->submit(noting("after"));
    other->submit([&] {
        note(queue->isCurrent() ? "on the queue that waits" : "on its own");
        semaphore->signal();
    });
    EXPECT_THAT(waitForNotes(3), ElementsAre("on its own", "waited", "after"));
}

TEST_P(WorkQueuesContract, WhatAnItemHoldsIsLetGoOnItsQueueBeforeTheNextItemRuns)
{
    const auto queue = makeQueue();
    std::shared_ptr<void> held(
        nullptr, [this, &queue](void*) { note(queue->isCurrent() ? "let go on the queue" : "let go elsewhere"); });
    queue->submit([this, held = std::move(held)] { note("ran"); });
    queue->submit(noting("next"));
    EXPECT_THAT(waitForNotes(3), ElementsAre("ran", "let go on the queue", "next"));
}

TEST_P(WorkQueuesContract, AQueueThatIsLetGoRunsWhatWasSubmittedBefore)
{
    auto queue = makeQueue();
    for (const char* item : {"a", "b", "c"})
        queue->submit(noting(item));
    queue.reset();
    EXPECT_THAT(waitForNotes(3), ElementsAre("a", "b", "c"));
}

TEST_P(WorkQueuesContract, AQueueMayBeLetGoByItsOwnItem)
{
    auto queue = makeQueue();
    WorkQueue& submitting = *queue;
    const auto begin = subject->queues().makeSemaphore(0);
    submitting.submit([&] {
        begin->wait();
        queue.reset();
        note("let go");
    });
    submitting.submit(noting("after"));
    begin->signal();
    EXPECT_THAT(waitForNotes(2), ElementsAre("let go", "after"));
}

// --- the background queue

TEST_P(WorkQueuesContract, BackgroundItemsDoNotWaitForEachOther)
{
    WorkQueue& background = subject->queues().backgroundQueue();
    const auto semaphore = subject->queues().makeSemaphore(0);
    background.submit([&] {
        semaphore->wait();
        note(background.isCurrent() ? "waited in the background" : "waited elsewhere");
    });
    background.submit([&] {
        note("signalled");
        semaphore->signal();
    });
    EXPECT_THAT(waitForNotes(2), ElementsAre("signalled", "waited in the background"));
    EXPECT_FALSE(background.isCurrent());
}

TEST_P(WorkQueuesContract, BackgroundItemsMaySubmitOthers)
{
    WorkQueue& background = subject->queues().backgroundQueue();
    background.submit([&] {
        note("a");
        background.submit(noting("b"));
    });
    EXPECT_THAT(waitForNotes(2), ElementsAre("a", "b"));
}

// --- later

TEST_P(WorkQueuesContract, DelayedItemsRunOnTheirQueueNotBeforeTheirTimeAndInItsOrder)
{
    const auto queue = makeQueue();
    const Seconds begin = subject->now();
    const auto later = [&](std::chrono::milliseconds delay, const std::string& item) {
        subject->queues().submitAfter(delay, *queue, [&, delay, item] {
            EXPECT_TRUE(queue->isCurrent());
            EXPECT_GE(subject->now() - begin, Seconds(delay) - Seconds(1us)); // a double is less exact
            note(item);
        });
    };
    later(30ms, "d");
    later(10ms, "b");
    later(10ms, "c");
    later(60ms, "e");
    later(0ms, "a");
    subject->letPass(60ms);
    EXPECT_THAT(waitForNotes(5), ElementsAre("a", "b", "c", "d", "e"));
}

TEST_P(WorkQueuesContract, AnItemWhoseTimeHasPassedRunsSoon)
{
    const auto queue = makeQueue();
    subject->queues().submitAfter(-1h, *queue, noting("ran"));
    subject->letPass(0ms);
    EXPECT_THAT(waitForNotes(1), ElementsAre("ran"));
}

TEST_P(WorkQueuesContract, AnItemThatIsDelayedForEverHoldsUpNothing)
{
    const auto queue = makeQueue();
    subject->letPass(1s); // so that no time on the way is later than the longest delay
    subject->queues().submitAfter(std::chrono::nanoseconds::max(), *queue, [] { ADD_FAILURE(); });
    subject->queues().submitAfter(1ms, *queue, noting("soon"));
    subject->letPass(1ms);
    EXPECT_THAT(waitForNotes(1), ElementsAre("soon"));
}

// --- semaphores

TEST_P(WorkQueuesContract, ASemaphoreLetsAsManyPassAsItCounts)
{
    const auto semaphore = subject->queues().makeSemaphore(2);
    semaphore->wait();
    semaphore->wait();
    semaphore->signal();
    semaphore->signal();
    semaphore->signal();
    semaphore->wait();
    semaphore->wait();
    const auto queue = makeQueue();
    queue->submit([&] {
        semaphore->wait();
        note("third");
        semaphore->wait();
        note("fourth");
    });
    const auto other = makeQueue();
    other->submit([&] {
        note("signalled");
        semaphore->signal();
    });
    const auto notes = waitForNotes(3);
    EXPECT_THAT(notes, testing::UnorderedElementsAre("third", "signalled", "fourth"));
    EXPECT_EQ(notes.back(), "fourth");
}

// --- without threads

TEST_P(WorkQueuesContract, MakingAQueueThrowsWithoutAThreadForItAndWorksAgainAfterwards)
{
    subject->setThreads(false);
    EXPECT_THROW(makeQueue(), std::system_error);
    subject->setThreads(true);
    makeQueue()->submit(noting("ran"));
    EXPECT_THAT(waitForNotes(1), ElementsAre("ran"));
}

TEST_P(WorkQueuesContract, WorkIsTakenWithoutAThreadForItTooAndRunsWithTheNext)
{
    WorkQueue& background = subject->queues().backgroundQueue();
    const auto queue = makeQueue();
    subject->setThreads(false);
    EXPECT_NO_THROW(background.submit(noting("background")));
    EXPECT_NO_THROW(subject->queues().submitAfter(0ms, *queue, noting("delayed")));
    subject->setThreads(true);
    background.submit(noting("next"));
    subject->queues().submitAfter(0ms, *queue, noting("next delayed"));
    subject->letPass(0ms);
    EXPECT_THAT(waitForNotes(4), testing::UnorderedElementsAre("background", "next", "delayed", "next delayed"));
}

} // namespace
} // namespace contract
