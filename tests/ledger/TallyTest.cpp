// SPDX-License-Identifier: Apache-2.0
// Counts on their way to the ledger.
#include "ledger/Tally.h"

#include <gmock/gmock.h>

namespace ledger {
namespace {

const Culprit player{.user = 1000, .process = "player", .application = "org.example.player"};

TEST(Tally, IsEmptyUntilSomethingIsCounted)
{
    Tally tally;
    EXPECT_TRUE(tally.empty());
    tally.add(Counter::Recorded);
    EXPECT_FALSE(tally.empty());
    EXPECT_EQ(tally[Counter::Recorded], 1U);
    EXPECT_EQ(tally[Counter::Repeated], 0U);
    tally.clear();
    EXPECT_TRUE(tally.empty());
    EXPECT_EQ(tally[Counter::Recorded], 0U);
}

TEST(Tally, TakesAllOfAnother)
{
    Tally tally;
    tally.add(Counter::Recorded, 2);
    tally.add(Counter::RefusedForMemory, player, 3);
    Tally other;
    other.add(Counter::Recorded, 40);
    other.add(Counter::RefusedForMemory, player, 50);
    other.add(Counter::LostToDiskFull, player, 60);
    tally.takeFrom(other);
    EXPECT_EQ(tally[Counter::Recorded], 42U);
    EXPECT_EQ(tally[Counter::RefusedForMemory], 53U);
    ASSERT_EQ(tally.charged().size(), 2U);
    EXPECT_EQ(tally.charged()[0].count, 53U);
    EXPECT_EQ(tally.charged()[1].charge, Charge::Lost);
    EXPECT_TRUE(other.empty());
    EXPECT_TRUE(other.charged().empty());
}

TEST(Tally, DoesNotChargeAnyoneWithNothing)
{
    Tally tally;
    tally.add(Counter::LostToDiskFull, player, 0);
    EXPECT_TRUE(tally.empty());
    EXPECT_TRUE(tally.charged().empty());
}

TEST(Tally, CountsMoreCulpritsThanItCanNameWithoutTheirNames)
{
    Tally tally;
    for (std::uint32_t user = 0; user < 300; ++user)
        tally.add(Counter::RefusedForMemory, {.user = user, .process = "", .application = ""});
    EXPECT_EQ(tally[Counter::RefusedForMemory], 300U);
    EXPECT_EQ(tally.charged().size(), 256U);
}

} // namespace
} // namespace ledger
