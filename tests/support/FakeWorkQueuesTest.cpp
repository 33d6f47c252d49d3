// The work queues of the tests are worth as much as they resemble real ones.
#include "support/FakeWorkQueues.h"

#include <gmock/gmock.h>
#include <stdexcept>

namespace {

using namespace std::chrono_literals;
using platform::QualityOfService;
using testing::ElementsAre;

class FakeWorkQueuesTest : public testing::Test {
protected:
    auto noting(std::string what)
    {
        return [this, what = std::move(what)] { noted.push_back(what); };
    }

    support::FakeClock clock;
    support::FakeWorkQueues queues{clock};
    std::shared_ptr<platform::WorkQueue> serial = queues.makeSerialQueue("one", QualityOfService::UserInteractive);
    std::shared_ptr<platform::WorkQueue> other = queues.makeSerialQueue("two", QualityOfService::Default);
    std::vector<std::string> noted;
};

TEST_F(FakeWorkQueuesTest, NothingRunsBeforeTheTestSaysSo)
{
    serial->submit(noting("a"));
    EXPECT_THAT(noted, ElementsAre());
    queues.runAll();
    EXPECT_THAT(noted, ElementsAre("a"));
}

TEST_F(FakeWorkQueuesTest, ItemsRunInTheOrderOfSubmissionAndThoseTheySubmitAfterThem)
{
    serial->submit([this] {
        noted.push_back("a");
        serial->submit(noting("c"));
    });
    other->submit(noting("b"));
    queues.runAll();
    EXPECT_THAT(noted, ElementsAre("a", "b", "c"));
}

TEST_F(FakeWorkQueuesTest, AQueueIsCurrentOnlyWhileItRunsAnItem)
{
    EXPECT_FALSE(serial->isCurrent());
    serial->submit([this] {
        EXPECT_TRUE(serial->isCurrent());
        EXPECT_FALSE(other->isCurrent());
    });
    queues.runAll();
    EXPECT_FALSE(serial->isCurrent());
}

TEST_F(FakeWorkQueuesTest, DelayedItemsRunAtTheirTimeInTheOrderOfTime)
{
    const double start = clock.secondsSince1970();
    queues.submitAfter(3s, *serial, [&] { EXPECT_DOUBLE_EQ(clock.secondsSince1970(), start + 3); });
    queues.submitAfter(3s, *serial, noting("late"));
    queues.submitAfter(1s, queues.backgroundQueue(), noting("soon"));
    EXPECT_THAT(queues.delayed(), ElementsAre(&queues.backgroundQueue(), serial.get(), serial.get()));
    queues.advance(999ms);
    EXPECT_THAT(noted, ElementsAre());
    queues.advance(4s);
    EXPECT_THAT(noted, ElementsAre("soon", "late"));
    EXPECT_DOUBLE_EQ(clock.secondsSince1970(), start + 4.999);
}

TEST_F(FakeWorkQueuesTest, AWaitingSerialQueueLetsOthersWorkAndNotItself)
{
    const auto semaphore = queues.makeSemaphore(0);
    serial->submit([&] {
        semaphore->wait();
        noted.push_back("waited");
    });
    serial->submit(noting("after"));
    other->submit([&] {
        noted.push_back("signalled");
        semaphore->signal();
    });
    queues.runAll();
    EXPECT_THAT(noted, ElementsAre("signalled", "waited", "after"));
}

TEST_F(FakeWorkQueuesTest, AWaitThatWouldNeverEndIsAnError)
{
    const auto semaphore = queues.makeSemaphore(1);
    semaphore->wait();
    EXPECT_THROW(semaphore->wait(), std::logic_error);
}

TEST_F(FakeWorkQueuesTest, WhatIsDiscardedNeverRuns)
{
    serial->submit(noting("a"));
    queues.submitAfter(1s, *serial, noting("b"));
    queues.discardAll();
    queues.advance(2s);
    queues.runAll();
    EXPECT_THAT(noted, ElementsAre());
}

} // namespace
