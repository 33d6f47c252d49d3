// SPDX-License-Identifier: Apache-2.0
// Names of databases that were set aside, and what a kill in the middle leaves.
#include "platform/linux/damage/SetAsideFiles.h"

#include "platform/linux/store/ManualClock.h"
#include "support/TemporaryDirectory.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace platform {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using testing::Optional;

namespace fs = std::filesystem;

class SetAsideFilesTest : public testing::Test {
protected:
    void makeDatabase(const std::string& text = "text")
    {
        for (const char* suffix : {"", "-wal", "-shm"})
            support::writeFile(database.string() + suffix, text + suffix);
    }
    [[nodiscard]] std::vector<std::string> names() const { return support::namesIn(temporary.path()); }

    support::TemporaryDirectory temporary;
    const fs::path database = temporary / "db";
    const fs::path aside = temporary / "db.corrupt-20270115T080000Z";
    support::ManualClock clock;
    SetAsideFiles files{database, clock};
};

TEST_F(SetAsideFilesTest, ADamagedDatabaseIsRenamedWithItsLogAndMarked)
{
    makeDatabase();
    EXPECT_THAT(files.setAsideDamaged(), Optional(aside));
    EXPECT_THAT(names(),
                ElementsAre("db.corrupt-20270115T080000Z", "db.corrupt-20270115T080000Z-shm",
                            "db.corrupt-20270115T080000Z-unsaved", "db.corrupt-20270115T080000Z-wal"));
    EXPECT_EQ(support::readFile(aside.string() + "-wal"), "text-wal");
    EXPECT_THAT(files.unsaved(), ElementsAre(aside));
    SetAsideFiles::markSaved(aside);
    EXPECT_THAT(files.unsaved(), IsEmpty());
}

TEST_F(SetAsideFilesTest, ADatabaseOfALaterVersionHasNoMark)
{
    makeDatabase();
    EXPECT_THAT(files.setAsideNewer(), Optional(temporary / "db.newer-20270115T080000Z"));
    EXPECT_THAT(
        names(),
        ElementsAre("db.newer-20270115T080000Z", "db.newer-20270115T080000Z-shm", "db.newer-20270115T080000Z-wal"));
}

TEST_F(SetAsideFilesTest, WithoutADatabaseNothingIsSetAsideOrMarked)
{
    EXPECT_EQ(files.setAsideDamaged(), std::nullopt);
    EXPECT_EQ(files.setAsideNewer(), std::nullopt);
    EXPECT_THAT(names(), IsEmpty());
}

TEST_F(SetAsideFilesTest, FilesBesideADatabaseThatIsGoneStayInTheirPlace)
{
    makeDatabase();
    fs::remove(database);
    EXPECT_EQ(files.setAsideDamaged(), std::nullopt);
    EXPECT_THAT(names(), ElementsAre("db-shm", "db-wal"));
    EXPECT_EQ(support::readFile(database.string() + "-wal"), "text-wal");
}

TEST_F(SetAsideFilesTest, TheOldestIsRemovedWithAllThatBelongsToIt)
{
    for (int number = 0; number < 4; ++number) {
        makeDatabase(std::to_string(number));
        ASSERT_TRUE(files.setAsideDamaged());
        clock.advance(1);
    }
    EXPECT_FALSE(fs::exists(aside));
    EXPECT_THAT(names(), testing::SizeIs(12));
    EXPECT_THAT(files.unsaved(),
                ElementsAre(temporary / "db.corrupt-20270115T080001Z", temporary / "db.corrupt-20270115T080002Z",
                            temporary / "db.corrupt-20270115T080003Z"));
}

TEST_F(SetAsideFilesTest, AKillAfterTheMarkLeavesTheDatabaseInItsPlace)
{
    makeDatabase();
    support::writeFile(aside.string() + "-unsaved", "");
    files.finish();
    EXPECT_THAT(names(), ElementsAre("db", "db-shm", "db-wal"));
}

TEST_F(SetAsideFilesTest, AKillBetweenLogAndDatabaseSetsTheDatabaseAsideToo)
{
    makeDatabase();
    support::writeFile(aside.string() + "-unsaved", "");
    fs::rename(database.string() + "-wal", aside.string() + "-wal");
    files.finish();
    EXPECT_EQ(support::readFile(aside), "text");
    EXPECT_EQ(support::readFile(aside.string() + "-wal"), "text-wal");
    EXPECT_EQ(support::readFile(aside.string() + "-shm"), "text-shm");
    EXPECT_FALSE(fs::exists(database));
    EXPECT_THAT(files.unsaved(), ElementsAre(aside));
}

TEST_F(SetAsideFilesTest, AKillBeforeTheNewDatabaseLosesNoMark)
{
    makeDatabase();
    ASSERT_TRUE(files.setAsideDamaged());
    files.finish();
    EXPECT_THAT(files.unsaved(), ElementsAre(aside));
}

} // namespace
} // namespace platform
