// SPDX-License-Identifier: Apache-2.0
// Sources and sessions in memory: what is remembered stays bounded, whatever becomes of the database.
#include "platform/linux/store/tables/KnownOrigins.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace platform {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using Known = KnownOriginsOf<SourceBegin>;

TEST(KnownOriginsTest, OneThatEndedIsRememberedUntilAThousandMoreHaveEnded)
{
    Known known;
    known.begin({.number = 1});
    known.end({.number = 1, .time = 5});
    for (std::uint64_t number = 2; number <= 1024; ++number) {
        known.begin({.number = number});
        known.end({.number = number, .time = 5});
    }
    known.committed();
    ASSERT_NE(known.find(1), nullptr);
    EXPECT_EQ(known.find(1)->ended, 5.0);
    known.begin({.number = 1025});
    known.end({.number = 1025, .time = 5});
    known.committed();
    EXPECT_EQ(known.find(1), nullptr);
    EXPECT_NE(known.find(2), nullptr);
}

TEST(KnownOriginsTest, OnlyWhatChangedIsWrittenAgain)
{
    Known known;
    known.begin({.number = 1, .processName = "player"});
    known.setRow(1, 1);
    known.committed();
    known.begin({.number = 1, .processName = "player"});
    EXPECT_THAT(known.changed(), IsEmpty());
    known.begin({.number = 1, .processName = "recorder"});
    EXPECT_THAT(known.changed(), ElementsAre(1));
}

TEST(KnownOriginsTest, ADatabaseThatStaysClosedCostsNoMemory)
{
    Known known;
    known.begin({.number = 1});
    known.setRow(1, 1);
    known.committed();
    for (std::uint64_t number = 2; number <= 5000; ++number) {
        known.begin({.number = 1, .userIdentifier = static_cast<std::uint32_t>(number)});
        known.begin({.number = number});
        known.end({.number = number, .time = 5});
        known.rolledBack();
    }
    EXPECT_THAT(known.changed(), ElementsAre(1));
    EXPECT_EQ(known.find(2), nullptr);
    EXPECT_NE(known.find(5000), nullptr);
}

TEST(KnownOriginsTest, ARowThatWasNotCommittedIsNoRow)
{
    Known known;
    known.begin({.number = 1});
    known.setRow(1, 7);
    known.rolledBack();
    EXPECT_EQ(known.find(1)->row, 0);
    known.setRow(1, 8);
    known.committed();
    known.rolledBack();
    EXPECT_EQ(known.find(1)->row, 8);
    known.forgetRows();
    EXPECT_EQ(known.find(1)->row, 0);
    EXPECT_THAT(known.changed(), IsEmpty());
}

} // namespace
} // namespace platform
