// SPDX-License-Identifier: Apache-2.0
// How many ends of connections may wait, by user and by process.
#include "platform/linux/connection/UnfinishedEnds.h"

#include <gtest/gtest.h>

namespace platform {
namespace {

constexpr Submitter flood{.user = 1000, .process = 7};
constexpr Submitter neighbour{.user = 1000, .process = 8};
constexpr Submitter ofAnotherUser{.user = 1001, .process = 9};

class UnfinishedEndsTest : public testing::Test {
protected:
    void add(const Submitter& process, int count)
    {
        for (; count > 0; --count)
            ends.add(process);
    }
    void remove(const Submitter& process, int count)
    {
        for (; count > 0; --count)
            ends.remove(process);
    }

    UnfinishedEnds ends;
};

TEST_F(UnfinishedEndsTest, OneProcessMayHaveAllOfItsUsers)
{
    add(flood, 16'383);
    EXPECT_FALSE(ends.refusal(flood));
    add(flood, 1);
    const auto refusal = ends.refusal(flood);
    ASSERT_TRUE(refusal);
    EXPECT_EQ(refusal->endsOfUser, 16'384U);
    EXPECT_EQ(refusal->endsOfProcess, 16'384U);
}

TEST_F(UnfinishedEndsTest, AnEndThatWasCarriedOutMakesRoom)
{
    add(flood, 16'384);
    remove(flood, 1);
    EXPECT_FALSE(ends.refusal(flood));
}

TEST_F(UnfinishedEndsTest, AnotherProcessOfTheUserMayHave512InAnyCase)
{
    add(flood, 16'384);
    EXPECT_FALSE(ends.refusal(neighbour));
    add(neighbour, 511);
    EXPECT_FALSE(ends.refusal(neighbour));
    add(neighbour, 1);
    const auto refusal = ends.refusal(neighbour);
    ASSERT_TRUE(refusal);
    EXPECT_EQ(refusal->endsOfUser, 16'896U);
    EXPECT_EQ(refusal->endsOfProcess, 512U);
}

TEST_F(UnfinishedEndsTest, AnotherUserIsNotConcerned)
{
    add(flood, 20'000);
    add(ofAnotherUser, 16'383);
    EXPECT_FALSE(ends.refusal(ofAnotherUser));
}

TEST_F(UnfinishedEndsTest, TheFirstRefusalIsToldApartUntilNoEndOfTheUserWaits)
{
    add(flood, 16'384);
    EXPECT_TRUE(ends.refusal(flood)->isFirst);
    EXPECT_FALSE(ends.refusal(flood)->isFirst);
    remove(flood, 16'383);
    add(flood, 16'383);
    EXPECT_FALSE(ends.refusal(flood)->isFirst);
    remove(flood, 16'384);
    add(flood, 16'384);
    EXPECT_TRUE(ends.refusal(flood)->isFirst);
}

} // namespace
} // namespace platform
