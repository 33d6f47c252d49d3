// SPDX-License-Identifier: Apache-2.0
// The fake work queues behave like real ones.
#include "support/fakes/FakeWorkQueues.h"

#include "support/fakes/FakeConnection.h"

#include <gmock/gmock.h>
#include <stdexcept>

namespace {

using namespace std::chrono_literals;
using testing::ElementsAre;

class FakeWorkQueuesTest : public testing::Test {
protected:
    auto noting(std::string what)
    {
        return [this, what = std::move(what)] { noted.push_back(what); };
    }

    support::FakeClock clock;
    support::FakeWorkQueues queues{clock};
    std::shared_ptr<platform::TurnQueue> serial = queues.makeTurnQueue("one", {});
    std::shared_ptr<platform::WorkQueue> other = queues.makeSerialQueue("two", {});
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

TEST_F(FakeWorkQueuesTest, ABackgroundItemThatWaitsForMoreOthersThanThereAreThreadsWaitsForEver)
{
    const auto semaphore = queues.makeSemaphore(0);
    for (int item = 0; item < 3; ++item)
        queues.backgroundQueue().submit([&] { semaphore->wait(); });
    queues.backgroundQueue().submit([&] {
        for (int item = 0; item < 3; ++item)
            semaphore->signal();
    });
    queues.runAll(); // the fourth runs beside three
    for (int item = 0; item < 4; ++item)
        queues.backgroundQueue().submit([&] { semaphore->wait(); });
    queues.backgroundQueue().submit([&] { semaphore->signal(); });
    EXPECT_THROW(queues.runAll(), std::logic_error) << "the fifth does not run beside four";
}

TEST_F(FakeWorkQueuesTest, EachItemIsATurnWhoseLettersLeaveBeforeTheNextRuns)
{
    const auto connection = std::make_shared<support::FakeConnection>(1001);
    const auto sendAndCount = [&](platform::Turn& turn) {
        std::string frame;
        foundation::appendCbor(foundation::Value(foundation::Array{1}), frame);
        connection->send(turn, std::move(frame));
        noted.push_back(std::to_string(connection->received().size()));
    };
    serial->submit(sendAndCount);
    serial->submit(sendAndCount);
    queues.runAll();
    EXPECT_THAT(noted, ElementsAre("0", "1"));
    EXPECT_EQ(connection->received().size(), 2U);
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
