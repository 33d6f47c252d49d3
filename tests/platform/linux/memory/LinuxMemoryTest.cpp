// SPDX-License-Identifier: Apache-2.0
// Which limits hold while limits.toml changes, when the threads have to tidy their heaps, and that each does so once.
#include "platform/linux/memory/LinuxMemory.h"

#include "platform/linux/queues/ThreadHeap.h"
#include "support/TemporaryDirectory.h"
#include "support/fakes/FakeLog.h"
#include "support/fakes/FakeWorkQueues.h"

#include <ctime>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <limits>
#include <thread>
#include <vector>

namespace platform {
namespace {

using namespace std::chrono_literals;

constexpr std::size_t megabyte = std::size_t{1} << 20;

constexpr std::size_t megabytesAtFirst = 20; // `memory` notes them when it is made
std::size_t megabytesOfTheProcess = megabytesAtFirst;
std::chrono::nanoseconds timeOfTheProcess{};

class LinuxMemoryTest : public testing::Test {
protected:
    ~LinuxMemoryTest() override { megabytesOfTheProcess = megabytesAtFirst; }

    // Waits until the condition holds; false if the time is over.
    template <typename Condition> [[nodiscard]] static bool becomesTrue(Condition condition)
    {
        const auto end = std::chrono::steady_clock::now() + 30s;
        while (!condition()) {
            if (std::chrono::steady_clock::now() > end)
                return false;
            std::this_thread::sleep_for(1ms);
        }
        return true;
    }

    support::TemporaryDirectory directory;
    support::FakeLog log;
    ConfigurationWatcher watcher{directory.path(), ProviderLog(log)};
    support::FakeClock clock;
    support::FakeWorkQueues queues{clock};
    LinuxMemory memory{queues,
                       watcher,
                       ProviderLog(log),
                       {.residentBytes = [] { return megabytesOfTheProcess * megabyte; },
                        .usedTime = [] { return timeOfTheProcess; }}};
    int wakings = 0;
    ThreadHeap heap{[this] { ++wakings; }};
};

TEST_F(LinuxMemoryTest, AsksForNothingWhenLittleWasLetGo)
{
    memory.letGo(4 * megabyte - 1);
    EXPECT_TRUE(queues.delayed().empty()) << "an idle service does not wake";
    queues.advance(1h);
    EXPECT_EQ(wakings, 0);
    EXPECT_FALSE(heap.tidyIfAsked());
}

TEST_F(LinuxMemoryTest, WakesTheThreadsFiveSecondsAfterMuchWasLetGo)
{
    memory.letGo(4 * megabyte - 1);
    queues.advance(1h);
    memory.letGo(1);
    queues.advance(5s - 1ns);
    EXPECT_EQ(wakings, 0);
    EXPECT_FALSE(heap.isAsked());
    queues.advance(1ns);
    EXPECT_EQ(wakings, 1) << "small amounts add up";
    EXPECT_TRUE(heap.isAsked());
}

TEST_F(LinuxMemoryTest, WaitsForASecondInWhichTheServiceRests)
{
    memory.letGo(4 * megabyte);
    queues.advance(4s);
    timeOfTheProcess += 100ms;
    queues.advance(1s);
    EXPECT_EQ(wakings, 0) << "a client would wait for the threads that tidy";
    timeOfTheProcess += 100ms - 1ns;
    queues.advance(1s);
    EXPECT_EQ(wakings, 1);
}

TEST_F(LinuxMemoryTest, WaitsAMinuteAtMostForAServiceThatNeverRests)
{
    memory.letGo(4 * megabyte);
    queues.advance(4s);
    for (int second = 0; second < 60; ++second) {
        timeOfTheProcess += 100ms;
        queues.advance(1s);
    }
    EXPECT_EQ(wakings, 0);
    timeOfTheProcess += 100ms;
    queues.advance(1s);
    EXPECT_EQ(wakings, 1);
}

TEST_F(LinuxMemoryTest, WakesThemOnceForAllThatWasLetGoMeanwhile)
{
    memory.letGo(4 * megabyte);
    queues.advance(4s);
    memory.letGo(100 * megabyte);
    EXPECT_EQ(queues.delayed().size(), 1U);
    queues.advance(1h);
    EXPECT_EQ(wakings, 1);
}

TEST_F(LinuxMemoryTest, CountsAnewOnceTheyWereWoken)
{
    memory.letGo(100 * megabyte);
    queues.advance(6s);
    memory.letGo(4 * megabyte - 1);
    EXPECT_TRUE(queues.delayed().empty());
    memory.letGo(1);
    queues.advance(5s);
    EXPECT_EQ(wakings, 2);
}

TEST_F(LinuxMemoryTest, IsNotFooledByEnormousNumbers)
{
    memory.letGo(1);
    memory.letGo(std::numeric_limits<std::size_t>::max() - 1);
    EXPECT_EQ(queues.delayed().size(), 1U);
}

TEST_F(LinuxMemoryTest, WakesThemAfterAClientWithWhichTheProcessBecameMuchLarger)
{
    megabytesOfTheProcess = 23;
    memory.clientGone();
    EXPECT_TRUE(queues.delayed().empty()) << "an idle service does not wake";
    megabytesOfTheProcess = 24;
    memory.clientGone();
    memory.clientGone();
    queues.advance(5s);
    EXPECT_EQ(wakings, 1);
}

TEST_F(LinuxMemoryTest, ComparesWithTheSizeOnceTheThreadsHaveTidied)
{
    megabytesOfTheProcess = 100;
    memory.clientGone();
    queues.advance(5s);
    megabytesOfTheProcess = 60; // of clients that are still there
    queues.advance(1s);
    megabytesOfTheProcess = 63;
    memory.clientGone();
    EXPECT_TRUE(queues.delayed().empty());
    megabytesOfTheProcess = 64;
    memory.clientGone();
    EXPECT_EQ(queues.delayed().size(), 1U);
}

TEST_F(LinuxMemoryTest, KnowsTheSizeOfThisProcess)
{
    EXPECT_GT(LinuxMemory::thisProcess.residentBytes(), megabyte);
    EXPECT_LT(LinuxMemory::thisProcess.residentBytes(), 4096 * megabyte);
    constexpr std::size_t more = 64 * megabyte;
    const std::size_t before = LinuxMemory::thisProcess.residentBytes();
    const std::vector<char> touched(more, 'x');
    EXPECT_GT(LinuxMemory::thisProcess.residentBytes(), before + more / 2);
}

TEST_F(LinuxMemoryTest, KnowsTheTimeThatThisProcessUsed)
{
    const auto before = LinuxMemory::thisProcess.usedTime();
    timespec waste = {};
    for (const auto end = std::chrono::steady_clock::now() + 20ms; std::chrono::steady_clock::now() < end;)
        ::clock_gettime(CLOCK_MONOTONIC, &waste);
    EXPECT_GT(LinuxMemory::thisProcess.usedTime(), before);
    EXPECT_LT(LinuxMemory::thisProcess.usedTime(), 1h);
}

// --- the limits

TEST_F(LinuxMemoryTest, HasTheLimitsOfTheFileFromTheMomentThatItIsWritten)
{
    support::replaceFile(directory.path() / "limits.toml",
                         "memory_mb = 8\nmemory_part_of_user = 0.5\n"
                         "memory_part_of_client = 0.25");
    const MemoryLimits expected{.ofTheService = 8 * megabyte, .ofAUser = 4 * megabyte, .ofAClient = 2 * megabyte};
    EXPECT_TRUE(becomesTrue([&] { return memory.limits() == expected; }));
    const LinuxMemory another(queues, watcher, ProviderLog(log));
    EXPECT_EQ(another.limits(), expected) << "also of a file that is there at the start";
    EXPECT_THAT(log.lines(), testing::IsEmpty());
}

TEST_F(LinuxMemoryTest, KeepsTheDefaultsWithAFileThatIsWrongAndSaysSo)
{
    const MemoryLimits defaults = memory.limits();
    EXPECT_GE(defaults.ofTheService, 16 * megabyte);
    EXPECT_LE(defaults.ofTheService, 256 * megabyte);
    const auto file = directory.path() / "limits.toml";
    support::replaceFile(file, "memory_mb = -1");
    EXPECT_TRUE(becomesTrue([&] { return !log.lines().empty(); }));
    EXPECT_THAT(log.take(),
                testing::ElementsAre(
                    support::IsLine(LogLevel::Error, "kerl",
                                    file.string()
                                        + ": memory_mb = -1 should be a number of megabytes from 1 to 1048576; "
                                          "the default counts until this is corrected")));
    EXPECT_EQ(memory.limits(), defaults);
    support::replaceFile(file, "memory_mb = ");
    EXPECT_TRUE(becomesTrue([&] { return !log.lines().empty(); }));
    EXPECT_THAT(log.lines().front().message, testing::StartsWith(file.string() + ":1:"));
    EXPECT_EQ(memory.limits(), defaults);
}

// --- the heaps of the threads

TEST(ThreadHeap, IsTidiedOnceEachTimeItIsAsked)
{
    ThreadHeap heap([] { });
    EXPECT_FALSE(heap.tidyIfAsked());
    ThreadHeap::askAll();
    ThreadHeap::askAll();
    EXPECT_TRUE(heap.tidyIfAsked());
    EXPECT_FALSE(heap.tidyIfAsked());
    ThreadHeap::askAll();
    EXPECT_TRUE(heap.tidyIfAsked());
}

TEST(ThreadHeap, IsNotAskedOnceItIsGone)
{
    int wakings = 0;
    {
        const ThreadHeap heap([&] { ++wakings; });
        ThreadHeap::askAll();
    }
    ThreadHeap::askAll();
    EXPECT_EQ(wakings, 1);
}

} // namespace
} // namespace platform
