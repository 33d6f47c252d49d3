// SPDX-License-Identifier: Apache-2.0
// The queue between a program's threads and the client's thread: order, room and limits, against a model, and with many
// threads at the same time.
#include "calls/CallQueue.h"

#include <deque>
#include <gtest/gtest.h>
#include <numeric>
#include <rapidcheck/gtest.h>
#include <string>
#include <thread>
#include <vector>

namespace {

using libkesto::CallQueue;

constexpr std::size_t capacity = 4096;
constexpr std::size_t headSize = 8;

std::string popped(CallQueue& queue)
{
    std::string record(queue.front().value());
    queue.popFront();
    return record;
}

TEST(CallQueue, HandsRecordsOutInTheirOrderWithTheirPartsJoined)
{
    CallQueue queue(capacity);
    ASSERT_TRUE(queue.push({"first"}));
    ASSERT_TRUE(queue.push({"sec", "", "ond"}));
    ASSERT_TRUE(queue.push({""}));
    EXPECT_EQ(popped(queue), "first");
    EXPECT_EQ(popped(queue), "second");
    EXPECT_EQ(popped(queue), "");
    EXPECT_EQ(queue.front(), std::nullopt);
    EXPECT_TRUE(queue.isEmpty());
}

TEST(CallQueue, RefusesWhatDoesNotFitAndLosesNothingOfTheRest)
{
    CallQueue queue(capacity);
    const std::string record(capacity / 4 - headSize, 'x');
    for (int count = 0; count < 4; ++count)
        ASSERT_TRUE(queue.push({record}));
    EXPECT_FALSE(queue.push({""})) << "not even the smallest fits into a full queue";
    EXPECT_EQ(popped(queue), record);
    EXPECT_TRUE(queue.push({record}));
    EXPECT_FALSE(queue.push({record}));
    for (int count = 0; count < 4; ++count)
        EXPECT_EQ(popped(queue), record);
    EXPECT_TRUE(queue.isEmpty());
}

TEST(CallQueue, TakesARecordThatFillsItAndNoneThatIsLarger)
{
    CallQueue queue(capacity);
    EXPECT_TRUE(queue.push({std::string(capacity - headSize, 'x')}));
    EXPECT_EQ(popped(queue).size(), capacity - headSize);
    EXPECT_FALSE(queue.push({std::string(capacity - headSize + 1, 'x')}));
}

TEST(CallQueue, KeepsRoomFreeForThoseWhoNeedIt)
{
    CallQueue queue(capacity);
    const std::string record(120, 'x');
    std::size_t taken = 0;
    while (queue.push({record}, 512))
        ++taken;
    EXPECT_EQ(taken, (capacity - 512) / 128);
    EXPECT_TRUE(queue.push({record})) << "a caller that keeps no room free may use it";
}

// Against a model: pushes and pops of any content, order and size, over any number of rounds.
RC_GTEST_PROP(CallQueue, IsAQueueWhateverIsPushedAndPopped, ())
{
    CallQueue queue(256);
    std::deque<std::string> model;
    const auto steps = *rc::gen::container<std::vector<int>>(500, rc::gen::inRange(-60, 90));
    char character = 'a';
    for (const int step : steps) {
        if (step >= 0) {
            const std::string record(static_cast<std::size_t>(step), character);
            character = character == 'z' ? 'a' : static_cast<char>(character + 1);
            if (queue.push({record}))
                model.push_back(record);
        } else if (!model.empty()) {
            RC_ASSERT(popped(queue) == model.front());
            model.pop_front();
        }
        RC_ASSERT(queue.isEmpty() == model.empty());
    }
    while (!model.empty()) {
        RC_ASSERT(popped(queue) == model.front());
        model.pop_front();
    }
    RC_ASSERT(queue.front() == std::nullopt);
}

// Every record names its thread and its number, and repeats one byte. In any interleaving of the threads, each record
// arrives whole, once, and after the earlier ones of its thread.
TEST(CallQueue, TakesFromManyThreadsAtOnceWithoutLosingMixingOrRepeatingAnything)
{
    constexpr std::size_t producers = 4;
    constexpr std::uint32_t recordsEach = 20'000;
    CallQueue queue(capacity);
    std::vector<std::thread> threads;
    for (std::size_t producer = 0; producer < producers; ++producer)
        threads.emplace_back([&queue, producer] {
            for (std::uint32_t number = 0; number < recordsEach; ++number) {
                const std::string body((number * 7 + producer) % 200, static_cast<char>('a' + number % 26));
                const std::string head = std::to_string(producer) + ":" + std::to_string(number) + ":";
                while (!queue.push({head, body}))
                    std::this_thread::yield();
            }
        });

    std::vector<std::uint32_t> next(producers, 0);
    std::uint64_t mistakes = 0;
    while (std::accumulate(next.begin(), next.end(), std::uint64_t{0}) < producers * recordsEach && mistakes == 0) {
        const auto record = queue.front();
        if (!record) {
            std::this_thread::yield();
            continue;
        }
        const std::string text(*record);
        const auto producer = static_cast<std::size_t>(text[0] - '0');
        const std::uint32_t number = next.at(producer)++;
        std::string expected = std::to_string(producer) + ":" + std::to_string(number) + ":";
        expected.append((number * 7 + producer) % 200, static_cast<char>('a' + number % 26));
        mistakes += text != expected ? 1 : 0;
        queue.popFront();
    }
    for (std::thread& thread : threads) // after a failure they would wait for ever
        mistakes == 0 ? thread.join() : thread.detach();
    EXPECT_EQ(mistakes, 0U);
    EXPECT_TRUE(queue.isEmpty());
}

} // namespace
