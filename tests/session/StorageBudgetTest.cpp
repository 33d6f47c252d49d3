// SPDX-License-Identifier: Apache-2.0
// Neither one client nor one user nor all of them together may fill the device's memory with messages.
#include "session/StorageBudget.h"

#include "support/TestPlatform.h"

#include <gtest/gtest.h>
#include <limits>
#include <rapidcheck/gtest.h>
#include <vector>

namespace {

TEST(StorageBudget, GivesUpToItsLimit)
{
    session::StorageBudget budget(100);
    EXPECT_TRUE(budget.take(60));
    EXPECT_FALSE(budget.take(41));
    EXPECT_EQ(budget.taken(), 60U);
    EXPECT_TRUE(budget.take(40));
    EXPECT_FALSE(budget.take(1));
    EXPECT_TRUE(budget.take(0));
}

TEST(StorageBudget, GivesAgainWhatWasGivenBack)
{
    session::StorageBudget budget(100);
    EXPECT_TRUE(budget.take(100));
    budget.giveBack(30);
    EXPECT_EQ(budget.taken(), 70U);
    EXPECT_TRUE(budget.take(30));
}

TEST(StorageBudget, IsNotFooledByEnormousNumbers)
{
    session::StorageBudget budget(100);
    EXPECT_TRUE(budget.take(50));
    EXPECT_FALSE(budget.take(std::numeric_limits<std::size_t>::max()));
    EXPECT_FALSE(budget.take(std::numeric_limits<std::size_t>::max() - 49));
    EXPECT_EQ(budget.taken(), 50U);
}

TEST(StorageBudget, TakesFromTheEnclosingOneToo)
{
    const auto whole = std::make_shared<session::StorageBudget>(100);
    session::StorageBudget first(80, whole);
    session::StorageBudget second(80, whole);
    EXPECT_TRUE(first.take(70));
    EXPECT_FALSE(second.take(31)) << "the whole has 30 left";
    EXPECT_EQ(second.taken(), 0U) << "if the whole refuses bytes, this budget does not take them either";
    EXPECT_TRUE(second.take(30));
    EXPECT_EQ(whole->taken(), 100U);
    first.giveBack(70);
    EXPECT_EQ(whole->taken(), 30U);
}

// --- the limits of the platform

class PlatformBudgetTest : public testing::Test {
protected:
    PlatformBudgetTest() { platform.memory.setLimits({.ofTheService = 100, .ofAUser = 75, .ofAClient = 50}); }

    support::TestPlatform platform;
};

TEST_F(PlatformBudgetTest, LeavesRoomForAnotherClientAndForAnotherUser)
{
    const auto first = session::StorageBudget::makeForClient(1000);
    const auto second = session::StorageBudget::makeForClient(1000);
    const auto ofAnother = session::StorageBudget::makeForClient(1001);
    EXPECT_FALSE(first->take(51));
    EXPECT_TRUE(first->take(50));
    EXPECT_FALSE(second->take(26)) << "their user has 25 left";
    EXPECT_TRUE(second->take(25));
    EXPECT_FALSE(ofAnother->take(26)) << "the service has 25 left";
    EXPECT_TRUE(ofAnother->take(25));
    EXPECT_EQ(session::StorageBudget::service()->taken(), 100U);
    first->giveBack(50);
    second->giveBack(25);
    ofAnother->giveBack(25);
    EXPECT_EQ(session::StorageBudget::service()->taken(), 0U);
}

TEST_F(PlatformBudgetTest, CountsForAUserWhatItsClientsThatWentHaveNotGivenBackYet)
{
    auto gone = session::StorageBudget::makeForClient(1000);
    const auto present = session::StorageBudget::makeForClient(1000);
    {
        session::StorageShare share(gone);
        ASSERT_TRUE(share.grow(50));
        gone.reset();
        EXPECT_FALSE(present->take(26));
    }
    EXPECT_TRUE(present->take(50));
    present->giveBack(50);
}

TEST_F(PlatformBudgetTest, FollowsLimitsThatChange)
{
    const auto client = session::StorageBudget::makeForClient(1000);
    EXPECT_TRUE(client->take(50));
    platform.memory.setLimits({.ofTheService = 40, .ofAUser = 30, .ofAClient = 20});
    EXPECT_FALSE(client->take(1)) << "what was taken before stays";
    client->giveBack(31);
    EXPECT_TRUE(client->take(1));
    EXPECT_FALSE(client->take(1));
    platform.memory.setLimits({.ofTheService = 100, .ofAUser = 75, .ofAClient = 50});
    EXPECT_TRUE(client->take(30));
    client->giveBack(50);
}

// --- shares

TEST(StorageShare, TellsThePlatformWhatIsFree)
{
    support::TestPlatform platform;
    {
        session::StorageShare share(std::make_shared<session::StorageBudget>(100));
        EXPECT_TRUE(share.grow(60));
        EXPECT_EQ(platform.memory.bytesLetGo(), 0U);
        EXPECT_TRUE(share.resize(50));
        EXPECT_EQ(platform.memory.bytesLetGo(), 10U);
    }
    EXPECT_EQ(platform.memory.bytesLetGo(), 60U);
}

TEST(StorageShare, GrowsAndShrinksWithWhatItPaysForAndGivesAllBackInTheEnd)
{
    const auto budget = std::make_shared<session::StorageBudget>(100);
    {
        session::StorageShare share(budget);
        EXPECT_TRUE(share.grow(60));
        EXPECT_FALSE(share.grow(41));
        EXPECT_EQ(share.bytes(), 60U);
        EXPECT_TRUE(share.resize(90));
        EXPECT_FALSE(share.resize(101));
        EXPECT_EQ(budget->taken(), 90U) << "a refusal changes nothing";
        EXPECT_TRUE(share.resize(20));
        share.shrink(5);
        EXPECT_EQ(share.bytes(), 15U);
        EXPECT_EQ(budget->taken(), 15U);
    }
    EXPECT_EQ(budget->taken(), 0U);
}

RC_GTEST_PROP(StorageBudget, IsTheSumOfWhatIsHeldAndNeverAboveItsLimit, ())
{
    constexpr std::size_t limit = 1000;
    const auto whole = std::make_shared<session::StorageBudget>(limit);
    session::StorageBudget part(limit / 2, whole);
    std::vector<std::size_t> held;
    std::size_t sum = 0;
    for (const auto bytes : *rc::gen::container<std::vector<std::size_t>>(rc::gen::inRange<std::size_t>(0, 400))) {
        if (bytes % 3 == 0 && !held.empty()) {
            part.giveBack(held.back());
            sum -= held.back();
            held.pop_back();
            continue;
        }
        const bool fits = sum + bytes <= limit / 2;
        RC_ASSERT(part.take(bytes) == fits);
        if (fits) {
            held.push_back(bytes);
            sum += bytes;
        }
        RC_ASSERT(part.taken() == sum);
        RC_ASSERT(whole->taken() == sum);
    }
}

} // namespace
