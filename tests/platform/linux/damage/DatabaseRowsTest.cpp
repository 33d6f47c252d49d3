// SPDX-License-Identifier: Apache-2.0
// What can be read of databases that SQLite made, whole and damaged.
#include "platform/linux/damage/DatabaseRows.h"

#include "platform/linux/damage/DatabaseDamage.h"
#include "support/TemporaryDirectory.h"

#include <fmt/format.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <map>

namespace platform {
namespace {

using support::Writer;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

namespace fs = std::filesystem;

std::string textOf(const StoredValue& value)
{
    struct Words {
        std::string operator()(std::monostate) const { return "NULL"; }
        std::string operator()(std::int64_t number) const { return std::to_string(number); }
        std::string operator()(double number) const { return fmt::format("{:?>}", number); }
        std::string operator()(std::string_view text) const { return std::string(text); }
        std::string operator()(const StoredBytes& blob) const { return fmt::format("blob:{}", blob.bytes); }
    };
    return std::visit(Words(), value);
}

class DatabaseRowsTest : public testing::Test {
protected:
    // The rows with so many values, by their numbers.
    std::map<std::int64_t, std::vector<std::string>> rowsOf(const fs::path& path, std::size_t values)
    {
        std::map<std::int64_t, std::vector<std::string>> found;
        DatabaseRows rows{DatabasePages(path)};
        for (std::uint32_t page = 1; page <= rows.pageCount(); ++page)
            if (rows.goTo(page))
                while (const StoredRow* row = rows.next())
                    if (row->values.size() == values)
                        for (const StoredValue& value : row->values)
                            found[row->number].push_back(textOf(value));
        return found;
    }
    std::size_t rowCount(std::size_t values) { return rowsOf(file, values).size(); }
    // Three values in each row, as many as the schema has not.
    static std::string manyRows(int count, int size)
    {
        return fmt::format("WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < {}) "
                           "INSERT INTO t SELECT i, i, printf('%.*c', {}, 'x') FROM n",
                           count, size);
    }

    support::TemporaryDirectory temporary;
    const fs::path file = temporary / "db";
    const fs::path log = temporary / "db-wal";
    std::mt19937 random{1};
};

constexpr const char* threeColumns = "CREATE TABLE t(id INTEGER PRIMARY KEY, a, b)";

TEST_F(DatabaseRowsTest, EveryKindOfValueIsRead)
{
    Writer(file).execute("CREATE TABLE t(a, b, c, d, e, f, g, h, i, j, k, l);"
                         "INSERT INTO t(rowid, a, b, c, d, e, f, g, h, i, j, k, l) VALUES"
                         "(-7, NULL, 0, 1, -5, 300, -70000, 2000000000, 140737488355327, -9223372036854775808, 0.5, "
                         "'a\u00e9', x'6263')");
    EXPECT_THAT(rowsOf(file, 12),
                ElementsAre(std::pair(-7,
                                      std::vector<std::string>{"NULL", "0", "1", "-5", "300", "-70000", "2000000000",
                                                               "140737488355327", "-9223372036854775808", "0.5",
                                                               "a\u00e9", "blob:bc"})));
}

TEST_F(DatabaseRowsTest, RowsThatGoOnInOtherPagesAreWhole)
{
    Writer writer(file);
    writer.execute(threeColumns);
    std::size_t expected = 0;
    // Around every limit at which SQLite divides a row in another way.
    for (const int size : {4050, 4055, 4056, 4057, 4058, 4060, 4100, 8100, 8140, 8150, 8200, 100'000, 3'000'000}) {
        writer.execute(fmt::format("INSERT INTO t VALUES({0}, 1, printf('%.*c', {0}, 'x'))", size));
        ++expected;
    }
    const auto rows = rowsOf(file, 3);
    EXPECT_THAT(rows, SizeIs(expected));
    for (const auto& [number, values] : rows)
        EXPECT_EQ(values[2], std::string(static_cast<std::size_t>(number), 'x'));
}

TEST_F(DatabaseRowsTest, ARowThatHasLostAPageIsLeftOut)
{
    Writer(file).execute(
        fmt::format("{}; INSERT INTO t VALUES(1, 1, printf('%.*c', 100000, 'x')), (2, 1, 'y')", threeColumns));
    support::overwritePage(file, 10, random);
    EXPECT_THAT(rowsOf(file, 3), ElementsAre(std::pair(2, std::vector<std::string>{"NULL", "1", "y"})));
}

TEST_F(DatabaseRowsTest, DamageAboveRowsCostsNone)
{
    {
        Writer writer(file);
        writer.execute(threeColumns);
        writer.execute(manyRows(5000, 100));
    }
    support::overwritePage(file, 2, random); // the root of the table
    EXPECT_THROW(Writer(file).execute("SELECT count(*) FROM t"), std::runtime_error);
    EXPECT_EQ(rowCount(3), 5000U);
}

TEST_F(DatabaseRowsTest, DamageOfTheFirstPageCostsNoRow)
{
    for (const std::uint64_t size : {4096U, 8192U}) {
        fs::remove(file);
        {
            Writer writer(file);
            writer.execute(fmt::format("PRAGMA page_size = {}", size));
            writer.execute(threeColumns);
            writer.execute(manyRows(5000, 100));
        }
        support::overwritePage(file, 1, random, size);
        EXPECT_EQ(rowCount(3), 5000U) << size;
    }
}

TEST_F(DatabaseRowsTest, DamagedRowsCostOnlyTheirPage)
{
    {
        Writer writer(file);
        writer.execute(threeColumns);
        writer.execute(manyRows(5000, 100));
    }
    support::overwritePage(file, 20, random);
    const std::size_t left = rowCount(3);
    EXPECT_LT(left, 5000U);
    EXPECT_GT(left, 4950U);
}

TEST_F(DatabaseRowsTest, WhatIsNotUtf8IsNoText)
{
    Writer(file).execute(fmt::format("{}; INSERT INTO t VALUES(1, 1, CAST(x'ff' AS TEXT)), (2, 1, 'y')", threeColumns));
    EXPECT_THAT(rowsOf(file, 3), ElementsAre(std::pair(2, std::vector<std::string>{"NULL", "1", "y"})));
}

TEST_F(DatabaseRowsTest, ATruncatedDatabaseHasTheRowsOfItsPages)
{
    {
        Writer writer(file);
        writer.execute(threeColumns);
        writer.execute(manyRows(5000, 100));
    }
    fs::resize_file(file, 60 * support::pageSize + 100);
    EXPECT_GT(rowCount(3), 1500U);
    EXPECT_LT(rowCount(3), 2500U);
}

TEST_F(DatabaseRowsTest, OtherPageSizesAreRead)
{
    for (const int size : {512, 1024, 32768, 65536}) {
        fs::remove(file);
        Writer writer(file);
        writer.execute(fmt::format("PRAGMA page_size = {}", size));
        writer.execute(threeColumns);
        writer.execute(manyRows(1000, 700));
        EXPECT_EQ(rowCount(3), 1000U) << size;
    }
}

TEST_F(DatabaseRowsTest, RubbishHasNoRows)
{
    for (std::size_t size : {0U, 1U, 99U, 100U, 4096U, 40960U, 409'601U}) {
        support::writeFile(file, support::rubbish(random, size));
        support::writeFile(log, support::rubbish(random, size));
        EXPECT_THAT(rowsOf(file, 3), IsEmpty());
    }
    EXPECT_EQ(DatabasePages(temporary / "missing").count(), 0U);
    EXPECT_EQ(DatabasePages(temporary.path()).count(), 0U);
}

TEST_F(DatabaseRowsTest, PagesFullOfBytesThatLookLikeRowsEndTheReading)
{
    for (const char byte : {'\x0d', '\x7f', '\x80', '\xff', '\x01'}) {
        std::string page(support::pageSize, byte);
        page[0] = '\x0d';
        support::writeFile(file, page + page + page);
        rowsOf(file, 3);
    }
}

// --- The log

class DatabaseRowsInLogTest : public DatabaseRowsTest {
protected:
    DatabaseRowsInLogTest()
    {
        writer.execute("PRAGMA journal_mode = WAL; PRAGMA wal_autocheckpoint = 0");
        writer.execute(threeColumns);
    }
    // In the log, the frames of a commit lie behind each other; the first has the number 0.
    static std::uint64_t placeOfFrame(std::uint64_t number) { return 32 + number * (24 + support::pageSize); }

    Writer writer{file};
};

TEST_F(DatabaseRowsInLogTest, RowsAreReadFromTheLog)
{
    writer.execute(manyRows(1000, 100));
    EXPECT_LE(support::pagesIn(file), 1U);
    EXPECT_EQ(rowCount(3), 1000U);
}

TEST_F(DatabaseRowsInLogTest, TheLogIsNewerThanTheDatabase)
{
    writer.execute("INSERT INTO t VALUES(1, 1, 'old'); PRAGMA wal_checkpoint; UPDATE t SET b = 'new'");
    EXPECT_THAT(rowsOf(file, 3), ElementsAre(std::pair(1, std::vector<std::string>{"NULL", "1", "new"})));
}

TEST_F(DatabaseRowsInLogTest, ALogThatBeganAgainHasNoOldRows)
{
    writer.execute(manyRows(1000, 100));
    writer.execute("PRAGMA wal_checkpoint; DELETE FROM t WHERE id > 10; PRAGMA wal_checkpoint; "
                   "UPDATE t SET b = 'new' WHERE id = 1");
    EXPECT_EQ(rowCount(3), 10U);
    EXPECT_EQ(rowsOf(file, 3)[1][2], "new");
}

TEST_F(DatabaseRowsInLogTest, WhatIsNotCommittedIsNoRow)
{
    writer.execute("INSERT INTO t VALUES(1, 1, 'x'); PRAGMA cache_size = 5; BEGIN");
    const auto before = fs::file_size(log);
    writer.execute("INSERT INTO t SELECT i, i, printf('%.*c', 1000, 'y') FROM "
                   "(WITH RECURSIVE n(i) AS (SELECT 2 UNION ALL SELECT i + 1 FROM n WHERE i < 500) SELECT i FROM n)");
    EXPECT_GT(fs::file_size(log), before);
    EXPECT_EQ(rowCount(3), 1U);
}

TEST_F(DatabaseRowsInLogTest, ADamagedFrameCostsOnlyItsPage)
{
    writer.execute(manyRows(1000, 100)); // 36 rows a page
    support::overwrite(log, placeOfFrame(10) + 24 + 1000, "damage");
    EXPECT_EQ(rowCount(3), 964U);
}

TEST_F(DatabaseRowsInLogTest, ADamagedHeaderOfAFrameCostsTwoPages)
{
    writer.execute(manyRows(1000, 100));
    support::overwrite(log, placeOfFrame(10) + 16, "damage");
    EXPECT_EQ(rowCount(3), 928U);
}

TEST_F(DatabaseRowsInLogTest, ATruncatedLogHasTheRowsOfItsWholeCommits)
{
    writer.execute("INSERT INTO t VALUES(1, 1, 'x')");
    writer.execute(fmt::format("BEGIN; DELETE FROM t; {}; COMMIT", manyRows(1000, 100)));
    fs::resize_file(log, placeOfFrame(12));
    EXPECT_EQ(rowCount(3), 1U);
}

} // namespace
} // namespace platform
