// SPDX-License-Identifier: Apache-2.0
// When the database is checked, and what a check finds.
#include "platform/linux/damage/DamageCheck.h"

#include "platform/linux/damage/DatabaseDamage.h"
#include "platform/linux/store/ManualClock.h"
#include "support/TemporaryDirectory.h"

#include <condition_variable>
#include <fmt/format.h>
#include <future>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <memory>
#include <mutex>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace platform {
namespace {

using Finding = DamageCheck::Finding;
using testing::Optional;
using namespace std::chrono_literals;

namespace fs = std::filesystem;

class DamageCheckTest : public testing::Test {
protected:
    DamageCheckTest()
    {
        support::Writer writer(file);
        writer.execute("PRAGMA journal_mode = WAL; CREATE TABLE t(id INTEGER PRIMARY KEY, a)");
        writer.execute("WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < 5000) "
                       "INSERT INTO t SELECT i, printf('%.*c', 100, 'x') FROM n");
    }
    DamageCheck& check()
    {
        if (!check_)
            check_ = std::make_unique<DamageCheck>(file, clock, [this] {
                ioPriority = static_cast<int>(::syscall(SYS_ioprio_get, 1, 0));
                niceness = ::getpriority(PRIO_PROCESS, static_cast<id_t>(::gettid()));
                const std::lock_guard lock(mutex_);
                ++ended_;
                changed_.notify_all();
            });
        return *check_;
    }
    void forget() { check_.reset(); }
    void begin()
    {
        check().beginIfDue([] { return true; });
    }
    // What a check finds that is due; nothing if none is.
    std::optional<Finding> finding()
    {
        const int before = ended();
        begin();
        std::unique_lock lock(mutex_);
        // Its thread gives way to all others, so a busy machine makes it wait.
        changed_.wait_for(lock, isDue_ ? 100s : 0s, [&] { return ended_ > before; });
        lock.unlock();
        return check().takeFinding();
    }
    int ended()
    {
        const std::lock_guard lock(mutex_);
        return ended_;
    }
    // Whether the next check should be waited for.
    void expectNone() { isDue_ = false; }
    void expectOne() { isDue_ = true; }

    support::TemporaryDirectory temporary;
    const fs::path file = temporary / "db";
    support::ManualClock clock;
    std::mt19937 random{1};
    std::atomic<int> ioPriority = 0;
    std::atomic<int> niceness = 0;

private:
    std::mutex mutex_;
    std::condition_variable changed_;
    int ended_ = 0;
    bool isDue_ = true;
    std::unique_ptr<DamageCheck> check_;
};

TEST_F(DamageCheckTest, AHealthyDatabaseIsSound)
{
    EXPECT_THAT(finding(), Optional(Finding::Sound));
}

TEST_F(DamageCheckTest, TheThreadGivesWayToAllOthers)
{
    EXPECT_THAT(finding(), Optional(Finding::Sound));
    EXPECT_EQ(ioPriority >> 13, 3); // IOPRIO_CLASS_IDLE
    EXPECT_EQ(niceness, 19);
}

TEST_F(DamageCheckTest, EveryPageIsLookedAt)
{
    for (std::uint64_t page = 1; page <= support::pagesIn(file); ++page) {
        const std::string before = support::readFile(file);
        support::overwritePage(file, page, random);
        check().ask();
        EXPECT_THAT(finding(), Optional(Finding::Damaged)) << page;
        support::overwrite(file, 0, before);
    }
}

TEST_F(DamageCheckTest, ATruncatedDatabaseIsDamaged)
{
    fs::resize_file(file, fs::file_size(file) / 2);
    EXPECT_THAT(finding(), Optional(Finding::Damaged));
}

TEST_F(DamageCheckTest, AMissingDatabaseIsUnknownAndLookedForAgainLater)
{
    fs::rename(file, temporary / "away");
    EXPECT_THAT(finding(), Optional(Finding::Unknown));
    fs::rename(temporary / "away", file);
    expectNone();
    clock.advance(3599);
    EXPECT_EQ(finding(), std::nullopt);
    clock.advance(1);
    expectOne();
    EXPECT_THAT(finding(), Optional(Finding::Sound));
}

TEST_F(DamageCheckTest, ADayPassesBetweenChecksAlsoIfTheServiceStartsAgain)
{
    EXPECT_THAT(finding(), Optional(Finding::Sound));
    EXPECT_EQ(support::readFile(temporary / "db-checked"), "1800000000\n");
    expectNone();
    clock.advance(86399);
    EXPECT_EQ(finding(), std::nullopt);
    forget();
    EXPECT_EQ(finding(), std::nullopt);
    clock.advance(1);
    expectOne();
    EXPECT_THAT(finding(), Optional(Finding::Sound));
}

TEST_F(DamageCheckTest, AStampFromTheFutureCountsForNothing)
{
    support::writeFile(temporary / "db-checked", "1900000000\n");
    EXPECT_THAT(finding(), Optional(Finding::Sound));
}

TEST_F(DamageCheckTest, ACheckThatIsAskedForDoesNotWaitADay)
{
    EXPECT_THAT(finding(), Optional(Finding::Sound));
    check().ask();
    EXPECT_THAT(finding(), Optional(Finding::Sound));
}

TEST_F(DamageCheckTest, ACheckThatIsAskedForAndNotMadeIsDueAtTheNextStart)
{
    EXPECT_THAT(finding(), Optional(Finding::Sound));
    check().ask();
    forget();
    EXPECT_THAT(finding(), Optional(Finding::Sound));
    expectNone();
    forget();
    EXPECT_EQ(finding(), std::nullopt);
}

TEST_F(DamageCheckTest, ADatabaseThatWasReplacedIsNotLookedAtAndTheCheckStaysDue)
{
    check().beginIfDue([] { return false; });
    EXPECT_EQ(check().takeFinding(), std::nullopt);
    EXPECT_EQ(ended(), 0);
    EXPECT_THAT(finding(), Optional(Finding::Sound));
}

TEST_F(DamageCheckTest, TheFileThatWasInPlaceIsLookedAtAlsoIfItIsReplacedRightAfter)
{
    check().beginIfDue([this] {
        support::replaceFile(file, "not a database");
        return true;
    });
    EXPECT_THAT(finding(), Optional(Finding::Sound));
}

TEST_F(DamageCheckTest, ACheckThatIsBrokenOffIsNoCheck)
{
    {
        support::Writer writer(file);
        writer.execute("WITH RECURSIVE n(i) AS (SELECT 5001 UNION ALL SELECT i + 1 FROM n WHERE i < 200000) "
                       "INSERT INTO t SELECT i, printf('%.*c', 300, 'x') FROM n");
    }
    begin();
    check().breakOff();
    EXPECT_EQ(check().takeFinding(), std::nullopt);
    EXPECT_FALSE(fs::exists(temporary / "db-checked"));
    EXPECT_EQ(ended(), 0);
    expectNone();
    clock.advance(3599);
    EXPECT_EQ(finding(), std::nullopt);
    clock.advance(1);
    expectOne();
    EXPECT_THAT(finding(), Optional(Finding::Sound));
}

} // namespace
} // namespace platform
