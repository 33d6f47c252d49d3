// When the threads have to tidy their heaps, and that each does so once.
#include "platform/linux/queues/LinuxMemory.h"
#include "platform/linux/queues/ThreadHeap.h"
#include "support/fakes/FakeWorkQueues.h"

#include <gtest/gtest.h>
#include <limits>

namespace platform {
namespace {

using namespace std::chrono_literals;

constexpr std::size_t megabyte = std::size_t{1} << 20;

class LinuxMemoryTest : public testing::Test {
protected:
    support::FakeClock clock;
    support::FakeWorkQueues queues{clock};
    LinuxMemory memory{queues};
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
    queues.advance(5s);
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
