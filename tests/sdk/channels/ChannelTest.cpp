// SPDX-License-Identifier: Apache-2.0
// The values of channels, and the content of their files.
#include "channels/Channel.h"

#include "platform/linux/channels/ChannelFile.h"

#include <atomic>
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <thread>
#include <unistd.h>

namespace {

using libkesto::Doorbell;
using libkesto::HistogramChannelValue;
using libkesto::SimpleChannelValue;
using libkesto::StateChannelValue;
using std::chrono::milliseconds;

class Channels : public testing::Test {
protected:
    std::string textOf(kesto_channel& channel, milliseconds after = milliseconds(0))
    {
        std::string text;
        channel.appendText(text, begin + after);
        EXPECT_TRUE(platform::parseChannelFile(text)) << "the service must understand " << text;
        return text;
    }
    template <typename Body> static void inThreads(Body body)
    {
        std::vector<std::thread> threads;
        for (int thread = 0; thread < 4; ++thread)
            threads.emplace_back(body, thread);
        for (std::thread& thread : threads)
            thread.join();
    }

    static void enterManyTimes(kesto_channel& channel, int thread)
    {
        for (std::size_t count = 0; count < 5'000; ++count)
            channel.enter((count + static_cast<std::size_t>(thread)) % 4, libkesto::ChannelClock::now());
    }

    // The changes since the last call.
    std::uint64_t rings()
    {
        std::uint64_t count = 0;
        return ::read(doorbell, &count, sizeof count) == sizeof count ? count : 0;
    }

    const int doorbell = ::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK);
    Doorbell bell{platform::FileDescriptor(doorbell)};
    const kesto_channel::Time begin = libkesto::ChannelClock::now();
};

// --- simple

TEST_F(Channels, ASimpleOneAddsAndIsSet)
{
    SimpleChannelValue channel(bell);
    EXPECT_EQ(textOf(channel), "simple\n0\n");
    EXPECT_EQ(channel.add(5), KESTO_OK);
    EXPECT_EQ(channel.add(-7), KESTO_OK);
    EXPECT_EQ(textOf(channel), "simple\n-2\n");
    EXPECT_EQ(channel.set(INT64_MAX), KESTO_OK);
    EXPECT_EQ(textOf(channel), "simple\n9223372036854775807\n");
}

TEST_F(Channels, ASimpleOneLosesNothingWhenManyAddAtOnce)
{
    SimpleChannelValue channel(bell);
    inThreads([&](int) {
        for (int count = 0; count < 10'000; ++count)
            channel.add(1);
    });
    EXPECT_EQ(textOf(channel), "simple\n40000\n");
}

// --- histograms

TEST_F(Channels, AHistogramCountsInTheBucketThatHoldsTheValue)
{
    HistogramChannelValue channel(bell, "ms", {0, 10, 20, 40});
    EXPECT_EQ(textOf(channel), "histogram ms\n0 0\n0 10 0\n10 20 0\n20 40 0\n");
    for (const std::int64_t value : {0, 9, 10, 19, 20, 39})
        EXPECT_EQ(channel.record(value), KESTO_OK);
    EXPECT_EQ(textOf(channel), "histogram ms\n0 39\n0 10 2\n10 20 2\n20 40 2\n");
}

TEST_F(Channels, AHistogramCountsWhatLiesOutsideInItsOutermostBuckets)
{
    HistogramChannelValue channel(bell, "", {0, 10, 20});
    for (const std::int64_t value : {INT64_MIN, std::int64_t{-1}, std::int64_t{20}, INT64_MAX})
        channel.record(value);
    EXPECT_EQ(textOf(channel), "histogram\n-9223372036854775808 9223372036854775807\n0 10 2\n10 20 2\n");
}

TEST_F(Channels, AHistogramMayHaveOneBucket)
{
    HistogramChannelValue channel(bell, "", {5, 6});
    channel.record(5);
    channel.record(100);
    EXPECT_EQ(textOf(channel), "histogram\n5 100\n5 6 2\n");
}

TEST_F(Channels, AHistogramLosesNothingWhenManyRecordAtOnce)
{
    HistogramChannelValue channel(bell, "", {0, 1, 2, 3, 4});
    inThreads([&](int thread) {
        for (int count = 0; count < 10'000; ++count)
            channel.record(thread);
    });
    EXPECT_EQ(textOf(channel), "histogram\n0 3\n0 1 10000\n1 2 10000\n2 3 10000\n3 4 10000\n");
}

// --- states

TEST_F(Channels, AStateIsEnteredOnceAtTheBeginning)
{
    StateChannelValue channel(bell, {"Idle", "Running"}, 1, begin);
    EXPECT_EQ(textOf(channel), "state\nIdle 0 0 0.000000\nRunning 1 0 0.000000\n");
}

TEST_F(Channels, AStateLastsUntilAnotherIsEntered)
{
    StateChannelValue channel(bell, {"Idle", "Running"}, 0, begin);
    EXPECT_EQ(channel.enter(1, begin + milliseconds(120)), KESTO_OK);
    EXPECT_EQ(channel.enter(0, begin + milliseconds(1000)), KESTO_OK);
    EXPECT_EQ(textOf(channel, milliseconds(1000)), "state\nIdle 2 120 0.120000\nRunning 1 880 0.880000\n");
    EXPECT_EQ(textOf(channel, milliseconds(1640)), "state\nIdle 2 760 0.463415\nRunning 1 880 0.536585\n");
}

TEST_F(Channels, AStateThatIsEnteredAgainGoesOn)
{
    StateChannelValue channel(bell, {"Idle", "Running"}, 0, begin);
    channel.enter(0, begin + milliseconds(10));
    EXPECT_EQ(textOf(channel, milliseconds(20)), "state\nIdle 1 20 1.000000\nRunning 0 0 0.000000\n");
}

TEST_F(Channels, AStateThatIsNotThereCannotBeEntered)
{
    StateChannelValue channel(bell, {"Idle", "Running"}, 0, begin);
    EXPECT_EQ(channel.enter(2, begin), KESTO_INVALID_ARGUMENT);
    EXPECT_EQ(channel.enter(SIZE_MAX, begin), KESTO_INVALID_ARGUMENT);
    EXPECT_EQ(textOf(channel), "state\nIdle 1 0 0.000000\nRunning 0 0 0.000000\n");
}

TEST_F(Channels, ATimeThatIsShownNeverBecomesLess)
{
    StateChannelValue channel(bell, {"Idle", "Running"}, 0, begin);
    EXPECT_EQ(textOf(channel, milliseconds(50)), "state\nIdle 1 50 1.000000\nRunning 0 0 0.000000\n");
    // As from a thread that read the clock before the file was written.
    channel.enter(1, begin + milliseconds(40));
    EXPECT_EQ(textOf(channel, milliseconds(50)), "state\nIdle 1 50 0.833333\nRunning 1 10 0.166667\n");
}

TEST_F(Channels, StatesLoseNoTimeWhenManyEnterAtOnce)
{
    StateChannelValue channel(bell, {"0", "1", "2", "3"}, 0, begin);
    inThreads([&](int thread) { enterManyTimes(channel, thread); });
    const auto now = std::chrono::ceil<milliseconds>(libkesto::ChannelClock::now() - begin);
    const auto after = platform::parseChannelFile(textOf(channel, now));
    std::uint64_t total = 0;
    for (const auto& state : after->states)
        total += state.residency;
    EXPECT_LE(total, static_cast<std::uint64_t>(now.count())) << "no time counts twice";
    EXPECT_GE(total + after->states.size(), static_cast<std::uint64_t>(now.count())) << "and none is lost";
}

// The shown times may run ahead of a thread that read the clock and enters its state late, so this does not check sums.
TEST_F(Channels, StatesNeverGoBackWhileManyEnterAtOnce)
{
    StateChannelValue channel(bell, {"0", "1", "2", "3"}, 0, begin);
    std::atomic<bool> isDone = false;
    std::thread reader([&] {
        std::vector<platform::StateResidency> before(4);
        while (!isDone) {
            std::string text;
            channel.appendText(text, libkesto::ChannelClock::now());
            const auto states = platform::parseChannelFile(text)->states;
            for (std::size_t place = 0; place < before.size(); ++place) {
                EXPECT_GE(states[place].residency, before[place].residency);
                EXPECT_GE(states[place].transitions, before[place].transitions);
            }
            before = states;
        }
    });
    inThreads([&](int thread) { enterManyTimes(channel, thread); });
    isDone = true;
    reader.join();
}

// --- all

TEST_F(Channels, RefuseWhatIsOfAnotherKind)
{
    SimpleChannelValue simple(bell);
    HistogramChannelValue histogram(bell, "", {0, 1});
    StateChannelValue state(bell, {"On"}, 0, begin);
    EXPECT_EQ(simple.record(1), KESTO_INVALID_ARGUMENT);
    EXPECT_EQ(simple.enter(0, begin), KESTO_INVALID_ARGUMENT);
    EXPECT_EQ(histogram.add(1), KESTO_INVALID_ARGUMENT);
    EXPECT_EQ(histogram.set(1), KESTO_INVALID_ARGUMENT);
    EXPECT_EQ(state.record(1), KESTO_INVALID_ARGUMENT);
    EXPECT_FALSE(simple.isChanged() || histogram.isChanged() || state.isChanged());
}

TEST_F(Channels, KnowWhetherTheyHaveChanged)
{
    SimpleChannelValue channel(bell);
    EXPECT_FALSE(channel.isChanged());
    channel.add(1);
    EXPECT_TRUE(channel.isChanged());
    channel.setChanged(false);
    EXPECT_FALSE(channel.isChanged());
    StateChannelValue state(bell, {"On", "Off"}, 0, begin);
    state.enter(0, begin);
    EXPECT_FALSE(state.isChanged()) << "it is in that state already";
    state.enter(1, begin);
    EXPECT_TRUE(state.isChanged());
}

TEST_F(Channels, RingOnceWhenTheThreadIsAsleepAndElseNever)
{
    SimpleChannelValue channel(bell);
    channel.add(1);
    EXPECT_EQ(rings(), 0U) << "awake";
    channel.setChanged(false);
    bell.fallAsleep();
    channel.add(1);
    EXPECT_EQ(rings(), 1U);
    channel.add(1);
    channel.setChanged(false);
    channel.add(1);
    EXPECT_EQ(rings(), 0U) << "it is on its way";
    SimpleChannelValue other(bell);
    bell.fallAsleep();
    other.add(1);
    EXPECT_EQ(rings(), 1U) << "any channel";
}

// Rounds in which each of two threads adds once, while the publisher's thread falls asleep because nothing has changed,
// and only the doorbell wakes it. One that missed the other would leave it asleep, and the last value unwritten.
TEST_F(Channels, WakeTheThreadForEveryChangeOfManyThreads)
{
    constexpr int threads = 2;
    constexpr int rounds = 20'000;
    SimpleChannelValue channel(bell);
    std::atomic<int> round = 0;
    std::vector<std::jthread> adding;
    for (int thread = 0; thread < threads; ++thread)
        adding.emplace_back([&] {
            for (int number = 1; number <= rounds; ++number) {
                while (round < number)
                    std::this_thread::yield();
                channel.add(1);
            }
        });

    int overslept = 0;
    for (int number = 1; number <= rounds; ++number) {
        round = number;
        const std::string all = "simple\n" + std::to_string(number * threads) + "\n";
        for (std::string text; text != all;) {
            bell.fallAsleep();
            if (!channel.isChanged()) {
                pollfd watched{bell.descriptor(), POLLIN, 0};
                const bool hasRung = ::poll(&watched, 1, overslept == 0 ? 10'000 : 1) > 0;
                overslept += hasRung ? 0 : 1;
                bell.wakeUp(hasRung);
            }
            bell.stayAwake();
            channel.setChanged(false);
            text.clear();
            channel.appendText(text, begin);
        }
    }
    EXPECT_EQ(overslept, 0);
}

TEST_F(Channels, OfTheMostStatesAndBucketsFitInAFileThatIsRead)
{
    std::vector<std::int64_t> bounds;
    for (std::int64_t index = 0; index <= KESTO_MOST_BUCKETS; ++index)
        bounds.push_back(INT64_MIN + index);
    HistogramChannelValue histogram(bell, std::string(KESTO_LONGEST_STATE_NAME, 'u'), bounds);
    histogram.record(INT64_MIN);
    EXPECT_LE(textOf(histogram).size(), platform::largestChannelFile);
    std::vector<std::string> names;
    for (std::size_t index = 0; index < KESTO_MOST_STATES; ++index)
        names.push_back(std::string(KESTO_LONGEST_STATE_NAME - 3, 'n') + std::to_string(index));
    StateChannelValue state(bell, names, 0, begin);
    EXPECT_LE(textOf(state).size(), platform::largestChannelFile);
}

} // namespace
