// SPDX-License-Identifier: Apache-2.0
// What connections hold together: when they are read, who has to wait, and what lets them go on.
#include "platform/linux/connection/TransitMemory.h"

#include <gtest/gtest.h>
#include <limits>

namespace platform {
namespace {

using Share = std::shared_ptr<TransitMemory::Share>;
using enum TransitMemory::Excess;

constexpr std::uint32_t alice = 1000;
constexpr std::uint32_t bob = 1001;
constexpr std::size_t ample = std::numeric_limits<std::size_t>::max();

// Limits of 160,000 bytes for all, 120,000 for a user and 80,000 for a client: reading pauses beyond half of each.
class TransitMemoryTest : public testing::Test {
protected:
    TransitMemoryTest()
    {
        memory.setLimits([this] { return limits; });
    }

    // A connection of the user that holds so much, of which 2,048 bytes do not count.
    Share holding(std::uint32_t user, std::size_t bytes)
    {
        auto share = memory.makeShare(user);
        memory.add(*share, bytes);
        return share;
    }

    MemoryLimits limits{.ofTheService = 160'000, .ofAUser = 120'000, .ofAClient = 80'000};
    int woken = 0;
    TransitMemory memory{[this] { ++woken; }};
};

TEST_F(TransitMemoryTest, HasNoLimitsUntilItGetsSome)
{
    TransitMemory unlimited([] { });
    const Share share = unlimited.makeShare(alice);
    unlimited.add(*share, std::numeric_limits<std::size_t>::max() / 16);
    EXPECT_EQ(unlimited.roomFor(*share, 0), ample);
    EXPECT_EQ(unlimited.excess(*share), None);
}

TEST_F(TransitMemoryTest, AClientIsReadUpToHalfOfItsLimit)
{
    const Share share = holding(alice, 40'000);
    EXPECT_EQ(memory.roomFor(*share, 0), ample);
    memory.add(*share, 1);
    EXPECT_EQ(memory.roomFor(*share, 0), 0U);
    EXPECT_EQ(memory.roomFor(*holding(alice, 20'000), 0), ample) << "the others of the user are read";
}

TEST_F(TransitMemoryTest, TheClientsOfAUserAreReadUpToHalfOfItsLimit)
{
    const Share one = holding(alice, 32'048);
    const Share other = holding(alice, 32'048);
    EXPECT_EQ(memory.roomFor(*one, 0), ample) << "30,000 bytes of each count: 60,000 together";
    memory.add(*other, 1);
    EXPECT_EQ(memory.roomFor(*one, 0), 0U);
    EXPECT_EQ(memory.roomFor(*other, 0), 0U);
    EXPECT_EQ(memory.roomFor(*holding(bob, 10'000), 0), ample) << "another user is read";
}

TEST_F(TransitMemoryTest, AllClientsAreReadUpToHalfOfTheWholeLimit)
{
    const Share first = holding(alice, 32'048);
    const Share second = holding(alice, 32'048);
    const Share third = holding(bob, 22'048);
    EXPECT_EQ(memory.roomFor(*third, 0), ample) << "80,000 bytes count";
    memory.add(*third, 1);
    for (const Share& share : {first, second, third})
        EXPECT_EQ(memory.roomFor(*share, 0), 0U);
}

TEST_F(TransitMemoryTest, AClientThatHoldsNextToNothingIsReadALittleInAnyCase)
{
    const Share greedy = holding(alice, 75'000);
    const Share modest = holding(alice, 2'048);
    EXPECT_EQ(memory.roomFor(*modest, 0), 1'024U);
    memory.add(*modest, 1);
    EXPECT_EQ(memory.roomFor(*modest, 0), 0U);
}

TEST_F(TransitMemoryTest, ReadingGoesOnWhenAQuarterIsFreeAgain)
{
    limits = {.ofTheService = 1'000'000, .ofAUser = 120'000, .ofAClient = 160'000};
    const Share one = holding(alice, 39'000);
    const Share other = holding(alice, 39'000);
    EXPECT_EQ(memory.roomFor(*other, 0), 0U);
    memory.remove(*one, 28'903);
    EXPECT_EQ(memory.roomFor(*other, 0), 0U) << "8,049 and 36,952 bytes count: one more than 45,000";
    EXPECT_EQ(woken, 0);
    memory.remove(*one, 1);
    EXPECT_EQ(woken, 1) << "the connection thread looks again";
    EXPECT_EQ(memory.roomFor(*other, 0), ample);
    memory.remove(*one, 5'000);
    EXPECT_EQ(woken, 1) << "but only once";
}

TEST_F(TransitMemoryTest, AClientThatHoldsNextToNothingAgainWakesTheConnectionThread)
{
    const Share greedy = holding(alice, 75'000);
    const Share modest = holding(alice, 3'000);
    EXPECT_EQ(memory.roomFor(*modest, 0), 0U);
    memory.remove(*modest, 951);
    EXPECT_EQ(woken, 0) << "2,049 bytes are left";
    memory.remove(*modest, 1);
    EXPECT_EQ(woken, 1);
    EXPECT_EQ(memory.roomFor(*modest, 0), 1'024U);
}

TEST_F(TransitMemoryTest, OneClientOfAUserAtATimeMayCompleteItsFrame)
{
    const Share greedy = holding(alice, 75'000);
    const Share first = holding(alice, 20'000);
    const Share second = holding(alice, 20'000);
    EXPECT_EQ(memory.roomFor(*first, 20'000), ample);
    EXPECT_EQ(memory.roomFor(*second, 20'000), 0U);
    EXPECT_EQ(memory.roomFor(*first, 20'000), ample) << "it goes on to the end";
    const Share ofBob = holding(bob, 20'000);
    EXPECT_EQ(memory.roomFor(*ofBob, 20'000), ample) << "another user has the same right";

    memory.completed(*second);
    EXPECT_EQ(woken, 0) << "it was not its turn";
    memory.completed(*first);
    EXPECT_EQ(woken, 1);
    EXPECT_EQ(memory.roomFor(*second, 20'000), ample);
}

TEST_F(TransitMemoryTest, AClientThatHoldsMoreThanAPartOfAFrameMustLetThatGoFirst)
{
    const Share greedy = holding(alice, 75'000);
    const Share share = holding(alice, 20'000);
    EXPECT_EQ(memory.roomFor(*share, 17'951), 0U) << "2,049 bytes are something else";
    EXPECT_EQ(memory.roomFor(*share, 17'952), ample);
}

TEST_F(TransitMemoryTest, ChangedLimitsCountAtTheNextLook)
{
    const Share share = holding(alice, 50'000);
    EXPECT_FALSE(memory.mayHaveRoom(*share, 0));
    limits.ofAClient = 160'000;
    EXPECT_TRUE(memory.mayHaveRoom(*share, 0));
}

TEST_F(TransitMemoryTest, ALimitIsExceededOnlyBeyondItsWhole)
{
    const Share share = holding(alice, 80'000);
    EXPECT_EQ(memory.excess(*share), None);
    memory.add(*share, 1);
    EXPECT_EQ(memory.excess(*share), OfTheClient);

    const Share other = holding(alice, 44'095);
    EXPECT_EQ(memory.excess(*other), None) << "77,953 and 42,047 bytes count";
    memory.add(*other, 1);
    EXPECT_EQ(memory.excess(*other), OfTheUser);

    const Share ofBob = holding(bob, 42'047);
    EXPECT_EQ(memory.excess(*ofBob), None);
    memory.add(*ofBob, 1);
    EXPECT_EQ(memory.excess(*ofBob), OfTheService);
    EXPECT_EQ(memory.largestUser(), share->user);
}

TEST_F(TransitMemoryTest, SaysWhetherWhatWasAddedCounts)
{
    const Share share = memory.makeShare(alice);
    EXPECT_FALSE(memory.add(*share, 2'048));
    EXPECT_TRUE(memory.add(*share, 1));
}

} // namespace
} // namespace platform
