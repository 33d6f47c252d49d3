// SPDX-License-Identifier: Apache-2.0
// Files of a database that are removed or replaced.
#include "platform/linux/damage/FilesInPlace.h"

#include "support/TemporaryDirectory.h"

#include <ctime>
#include <gtest/gtest.h>

namespace platform {
namespace {

using Change = FilesInPlace::Change;
using namespace std::chrono_literals;

namespace fs = std::filesystem;

// With the directory's stamp and without it.
class FilesInPlaceTest : public testing::TestWithParam<std::chrono::seconds> {
protected:
    static fs::path makeFiles(const fs::path& directory)
    {
        for (const char* name : {"db", "db-wal", "db-shm"})
            support::writeFile(directory / name, "first");
        waitForTick();
        return directory / "db";
    }
    // Until the kernel stamps changes with another time.
    static void waitForTick()
    {
        const auto nanoseconds = [] {
            timespec now = {};
            ::clock_gettime(CLOCK_REALTIME_COARSE, &now);
            return now.tv_nsec;
        };
        for (const auto before = nanoseconds(); nanoseconds() == before;) { }
    }

    support::TemporaryDirectory temporary;
    const fs::path database = makeFiles(temporary.path());
    FilesInPlace files{(fs::path(database)), GetParam()};
};

TEST_P(FilesInPlaceTest, FilesThatStayAreInPlace)
{
    EXPECT_EQ(files.change(), Change::None);
    support::writeFile(database, "longer than before");
    support::writeFile(temporary / "other", "x");
    EXPECT_EQ(files.change(), Change::None);
}

TEST_P(FilesInPlaceTest, ARemovedFileIsNoticed)
{
    EXPECT_EQ(files.change(), Change::None);
    fs::remove(temporary / "db-shm");
    EXPECT_EQ(files.change(), Change::Companions);
    fs::remove(temporary / "db-wal");
    EXPECT_EQ(files.change(), Change::Companions);
    fs::remove(database);
    EXPECT_EQ(files.change(), Change::Database);
}

TEST_P(FilesInPlaceTest, FilesThatComeAfterwardsAreNoted)
{
    for (const char* name : {"other-wal", "other-shm", "other"}) {
        FilesInPlace later(temporary / "other", GetParam());
        for (const char* made : {"other", "other-wal", "other-shm"})
            support::writeFile(temporary / made, "first");
        EXPECT_EQ(later.change(), Change::None);
        fs::remove(temporary / name);
        EXPECT_EQ(later.change(), std::string_view(name) == "other" ? Change::Database : Change::Companions);
        for (const char* made : {"other", "other-wal", "other-shm"})
            fs::remove(temporary / made);
    }
}

TEST_P(FilesInPlaceTest, AFileThatWasRemovedBeforeItCouldBeNotedIsMissed)
{
    FilesInPlace later(temporary / "other", GetParam());
    EXPECT_EQ(later.change(), Change::Database);
    support::writeFile(temporary / "other", "first");
    EXPECT_EQ(later.change(), Change::Companions);
}

TEST_P(FilesInPlaceTest, AReplacedFileIsNoticedEachTime)
{
    for (const auto& [name, expected] : {std::pair("db-shm", Change::Companions),
                                         std::pair("db-wal", Change::Companions), std::pair("db", Change::Database)}) {
        support::replaceFile(temporary / name, "second");
        EXPECT_EQ(files.change(), expected);
        EXPECT_EQ(files.change(), expected);
    }
}

TEST_P(FilesInPlaceTest, ARemovedDirectoryIsNoticed)
{
    EXPECT_EQ(files.change(), Change::None);
    fs::rename(temporary.path(), temporary.path().string() + ".away");
    EXPECT_EQ(files.change(), Change::Database);
    fs::rename(temporary.path().string() + ".away", temporary.path());
    EXPECT_EQ(files.change(), Change::None);
}

TEST_P(FilesInPlaceTest, OnlyNotedCompanionsAreRemovedBesideAnotherDatabase)
{
    support::replaceFile(temporary / "db-wal", "of the other");
    files.removeNotedCompanions();
    EXPECT_EQ(support::namesIn(temporary.path()), (std::vector<std::string>{"db", "db-wal"}));
    files.removeCompanions();
    EXPECT_EQ(support::namesIn(temporary.path()), (std::vector<std::string>{"db"}));
}

INSTANTIATE_TEST_SUITE_P(Steps, FilesInPlaceTest, testing::Values(0s, FilesInPlace::longestStep),
                         [](const auto& step) { return step.param == 0s ? "ByTheDirectory" : "ByTheFiles"; });

} // namespace
} // namespace platform
