// SPDX-License-Identifier: Apache-2.0
// Rows that the database refuses do not stop the others.
#include "kesto-ingest/database/Block.h"

#include "kesto-ingest/database/ClickHouse.h"
#include "tools/kesto-ingest/database/FakeDatabase.h"

#include <fmt/format.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace kesto_ingest {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

Block blockOf(std::initializer_list<std::string_view> rows)
{
    Block block;
    for (const std::string_view row : rows)
        block.add(fmt::format("{}\n", row), 0, 0);
    return block;
}

TEST(Block, GivesItsRowsBack)
{
    Block block;
    block.add("a\n", 1, 10);
    block.add("bc\n", 1, 11);
    EXPECT_EQ(block.size(), 2U);
    EXPECT_EQ(block.rows(0, 2), "a\nbc\n");
    EXPECT_EQ(block.rows(1, 2), "bc\n");
    EXPECT_EQ(block.source(1), 11U);
}

TEST(Block, HasFewWeeks)
{
    Block block;
    for (std::uint32_t week = 0; week < 49; ++week)
        block.add("a\n", week, 0);
    EXPECT_TRUE(block.takes(48));
    EXPECT_FALSE(block.takes(49));
}

TEST(Block, HasABoundOfBytes)
{
    Block block;
    block.add(std::string((16U << 20) - 1, 'x'), 1, 0);
    EXPECT_TRUE(block.takes(1));
    block.add("x", 1, 0);
    EXPECT_FALSE(block.takes(1));
}

TEST(InsertBlock, InsertsAllAtOnce)
{
    FakeDatabase database;
    EXPECT_THAT(insertBlock(database, "events", blockOf({"a", "b"})).value(), IsEmpty());
    EXPECT_THAT(database.blocks, ElementsAre("a\nb\n"));
}

TEST(InsertBlock, FindsTheRowsThatAreRefused)
{
    FakeDatabase database;
    database.refusedWord = "bad";
    const auto refused = insertBlock(database, "events", blockOf({"a", "bad 1", "c", "d", "e", "bad 2"}));
    EXPECT_THAT(refused.value(), ElementsAre(RefusedRow{1, "no such word"}, RefusedRow{5, "no such word"}));
    EXPECT_THAT(database.tables["events"], ElementsAre("a", "c", "d", "e"));
}

TEST(InsertBlock, SaysWhyTheDatabaseCannotBeUsed)
{
    FakeDatabase database;
    database.isAway = true;
    EXPECT_EQ(insertBlock(database, "events", blockOf({"a"})).error(), "away");
}

TEST(InsertBlock, SuspectsTheTablesIfEveryRowIsRefused)
{
    FakeDatabase database;
    database.refusedWord = "bad";
    Block block;
    for (int row = 0; row < 31; ++row)
        block.add("bad\n", 0, 0);
    EXPECT_THAT(insertBlock(database, "events", block).value(), SizeIs(31));
    block.add("bad\n", 0, 0);
    EXPECT_EQ(insertBlock(database, "events", block).error(), "it refuses every row: no such word");
    block = blockOf({"good"});
    for (int row = 0; row < 32; ++row)
        block.add("bad\n", 0, 0);
    EXPECT_THAT(insertBlock(database, "events", block).value(), SizeIs(32));
}

TEST(InsertBlock, SuspectsTablesOfAnotherEditionAtOnce)
{
    FakeDatabase database;
    database.refusedWord = "bad";
    database.editionOfTables = 2;
    EXPECT_EQ(insertBlock(database, "events", blockOf({"bad"})).error(),
              "the tables are of another edition, or not there: no such word");
    EXPECT_THAT(insertBlock(database, "events", blockOf({"good", "bad"})).value(), SizeIs(1));
}

TEST(ExceptionCode, IsTheNumberInTheAnswer)
{
    EXPECT_EQ(fleet_database::exceptionCode("Code: 27, e.displayText() = DB::Exception: Cannot parse input"), 27);
    EXPECT_EQ(fleet_database::exceptionCode("http://host answered 500: Code: 60. DB::Exception"), 60);
    EXPECT_EQ(fleet_database::exceptionCode("nginx: bad gateway"), 0);
}

} // namespace
} // namespace kesto_ingest
