// SPDX-License-Identifier: Apache-2.0
// A folder that fills up: which files are removed, which stay, and how rarely it is read.
#include "platform/linux/diagnostics/FolderLimits.h"
#include "platform/linux/diagnostics/LinuxFileSystem.h"
#include "support/TemporaryDirectory.h"
#include "support/fakes/FakeClock.h"
#include "support/fakes/FakeLog.h"
#include "support/fakes/FakeWorkQueues.h"

#include <gmock/gmock.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

namespace fs = std::filesystem;
using enum platform::LogLevel;
using platform::KeptFiles;
using support::IsLine;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::IsSupersetOf;
using testing::SizeIs;

bool isNote(std::string_view name)
{
    return name.starts_with("note-");
}

class FolderLimitsTest : public testing::Test {
protected:
    FolderLimitsTest() { fs::create_directories(folder); }

    // A file of that age: the higher the number, the younger it is.
    void make(const std::string& name, int number, std::size_t size = 1) const
    {
        support::writeFile(folder / name, std::string(size, 'x'));
        fs::last_write_time(folder / name, epoch + std::chrono::hours(number));
    }
    // The same, reported to the limits.
    void add(int number, std::size_t size = 1)
    {
        make("note-" + std::to_string(number), number, size);
        files.keepWithin(folder, kept, size);
    }
    [[nodiscard]] std::vector<std::string> names() const { return support::namesIn(folder); }

    // In a process of its own, which owns the files and may read the folder, but may not write to it.
    template <typename Body> [[nodiscard]] bool isTrueWithoutRightToRemove(Body body) const
    {
        constexpr uid_t nobody = 65534;
        const pid_t child = ::fork();
        if (child == 0) {
            if (::geteuid() == 0) {
                for (const auto& entry : fs::directory_iterator(folder))
                    (void)::chown(entry.path().c_str(), nobody, nobody);
                fs::permissions(root.path(), fs::perms(0755));
                if (::setegid(nobody) != 0 || ::seteuid(nobody) != 0)
                    ::_exit(2);
            } else {
                fs::permissions(folder, fs::perms(0555));
            }
            ::_exit(body() ? 0 : 1);
        }
        int status = 0;
        EXPECT_EQ(::waitpid(child, &status, 0), child);
        fs::permissions(folder, fs::perms(0755));
        return status == 0;
    }
    [[nodiscard]] bool hasSaidOnly(const std::string& message) const
    {
        const auto lines = log.lines();
        return lines.size() == 1 && lines[0].level == Error && lines[0].message == message;
    }

    const fs::file_time_type epoch = fs::file_time_type::clock::now() - std::chrono::hours(1000);
    const support::TemporaryDirectory root;
    const fs::path folder = root / "Audio/Notes";
    KeptFiles kept{8, 1000, isNote};
    support::FakeClock clock;
    support::FakeWorkQueues queues{clock};
    support::FakeLog log;
    platform::FolderLimits limits{queues, platform::ProviderLog(log)};
    platform::LinuxFileSystem files{root.path(), &limits};
};

TEST_F(FolderLimitsTest, LetsTheOldestGoWhenThereAreTooManyAndLeavesRoomForMore)
{
    for (int number = 8; number >= 1; --number)
        add(number);
    queues.runAll();
    EXPECT_THAT(names(), SizeIs(8));
    EXPECT_THAT(log.lines(), IsEmpty());
    add(9);
    queues.runAll();
    EXPECT_THAT(names(), ElementsAre("note-4", "note-5", "note-6", "note-7", "note-8", "note-9"));
    EXPECT_EQ(limits.removedFiles(), 3U);
    EXPECT_THAT(log.lines(),
                ElementsAre(IsLine(Default, "kerl",
                                   "removed the oldest 3 files from " + folder.string()
                                       + ", 3 since the start: there may be 8 of 0 MiB together")));
}

TEST_F(FolderLimitsTest, LetsTheOldestGoWhenTheyAreTooLargeTogether)
{
    for (int number = 1; number <= 3; ++number)
        add(number, 300);
    queues.runAll();
    EXPECT_THAT(names(), SizeIs(3));
    add(4, 101);
    queues.runAll();
    EXPECT_THAT(names(), ElementsAre("note-2", "note-3", "note-4"));
}

TEST_F(FolderLimitsTest, AlwaysLeavesTheNewest)
{
    add(1);
    queues.runAll();
    add(2, 2000);
    queues.runAll();
    EXPECT_THAT(names(), ElementsAre("note-2"));
    add(3);
    queues.runAll();
    EXPECT_THAT(names(), ElementsAre("note-3"));
}

TEST_F(FolderLimitsTest, CountsWhatWasThereBeforeTheService)
{
    for (int number = 100; number < 200; ++number)
        make("note-" + std::to_string(number), number);
    add(200);
    queues.runAll();
    EXPECT_THAT(names(), ElementsAre("note-195", "note-196", "note-197", "note-198", "note-199", "note-200"));
}

TEST_F(FolderLimitsTest, LooksAtTheFirstFileAndThenOnlyWhenTheSumPassesALimit)
{
    std::size_t looks = 0;
    constexpr int rounds = 10;
    for (int number = 1; number <= 9 + 3 * rounds; ++number) {
        add(number);
        looks += queues.pending();
        queues.runAll();
        EXPECT_LE(names().size(), kept.most);
    }
    EXPECT_EQ(looks, 2U + rounds) << "one a quarter of the limit";
}

TEST_F(FolderLimitsTest, LooksOnceHoweverManyFilesComeMeanwhileAndForgetsNone)
{
    for (int number = 1; number <= 20; ++number)
        add(number);
    EXPECT_EQ(queues.pending(), 1U);
    queues.runAll();
    EXPECT_THAT(names(), SizeIs(6));
    for (int number = 21; number <= 30; ++number) {
        add(number);
        queues.runAll();
        EXPECT_LE(names().size(), kept.most);
    }
}

TEST_F(FolderLimitsTest, RemovesNothingButFilesOfThatShape)
{
    make("other", 0, 5000);
    make("a-note-1", 0, 5000);
    make(".kestod-0123456789abcdef.tmp.old", 0, 5000);
    make(".kestod-0123456789abcdeg.tmp", 0, 5000);
    fs::create_directories(folder / "note-folder");
    fs::create_symlink(folder / "other", folder / "note-link");
    ASSERT_EQ(::mkfifo((folder / "note-pipe").c_str(), 0600), 0);
    const auto before = names();
    for (int number = 1; number <= 9; ++number)
        add(number);
    queues.runAll();
    EXPECT_THAT(names(), IsSupersetOf(before));
    EXPECT_THAT(names(), SizeIs(before.size() + 6));
    EXPECT_EQ(limits.removedFiles(), 3U);
}

TEST_F(FolderLimitsTest, RemovesNoFilesOfOtherUsers)
{
    constexpr uid_t nobody = 65534;
    make("note-of-another", 0);
    if (::chown((folder / "note-of-another").c_str(), nobody, nobody) != 0)
        GTEST_SKIP() << "only root can give files away";
    for (int number = 1; number <= 9; ++number)
        add(number);
    queues.runAll();
    EXPECT_THAT(names(), testing::Contains("note-of-another"));
    EXPECT_EQ(limits.removedFiles(), 3U);
}

TEST_F(FolderLimitsTest, RemovesWhatAKilledServiceHadBegunToWrite)
{
    {
        auto begun = files.createAtomically(folder / "note-0");
        ASSERT_TRUE(begun);
        (*begun)->write("half");
        const auto hidden = names();
        ASSERT_THAT(hidden, SizeIs(1));
        fs::copy_file(folder / hidden.front(), folder / ".kestod-0123456789abcdef.tmp");
    }
    fs::last_write_time(folder / ".kestod-0123456789abcdef.tmp", epoch);
    for (int number = 1; number <= 8; ++number)
        add(number);
    queues.runAll();
    EXPECT_THAT(names(), ElementsAre("note-3", "note-4", "note-5", "note-6", "note-7", "note-8"));
}

TEST_F(FolderLimitsTest, RemovesAllThatAKilledServiceHadBegunToWriteAndNothingElse)
{
    make(".kestod-0123456789abcdef.tmp", 0, 5000);
    make(".kestod-fedcba9876543210.tmp", 1);
    make(".kestod-0123456789abcdef.tmp.old", 0);
    make("note-1", 0);
    fs::create_directories(folder / ".kestod-00000000000000aa.tmp");
    fs::create_symlink(folder / "note-1", folder / ".kestod-00000000000000bb.tmp");
    files.removeUnfinished(folder);
    EXPECT_THAT(names(),
                ElementsAre(".kestod-00000000000000aa.tmp", ".kestod-00000000000000bb.tmp",
                            ".kestod-0123456789abcdef.tmp.old", "note-1"));
    EXPECT_THAT(
        log.lines(),
        ElementsAre(IsLine(Default, "kerl",
                           "removed 2 files from " + folder.string() + " that a killed service had not finished")));
}

TEST_F(FolderLimitsTest, SaysNothingOfAFolderWithoutUnfinishedFilesOrThatIsMissing)
{
    make("note-1", 0);
    files.removeUnfinished(folder);
    files.removeUnfinished(root / "Audio/Missing");
    EXPECT_THAT(names(), ElementsAre("note-1"));
    EXPECT_THAT(log.lines(), IsEmpty());
}

TEST_F(FolderLimitsTest, DoesNotLookThroughALink)
{
    for (int number = 1; number <= 8; ++number)
        add(number);
    queues.runAll();
    fs::rename(root / "Audio", root / "elsewhere");
    fs::create_directory_symlink(root / "elsewhere", root / "Audio");
    add(9);
    queues.runAll();
    EXPECT_THAT(names(), SizeIs(9));
    EXPECT_THAT(log.lines(),
                ElementsAre(IsLine(Error, "kerl",
                                   folder.string() + " cannot be searched (Not a directory): its oldest files stay")));
    add(10);
    EXPECT_EQ(queues.pending(), 0U) << "not with each new file";
}

TEST_F(FolderLimitsTest, SaysOnceWhatItCannotRemove)
{
    for (int number = 1; number <= 8; ++number)
        add(number);
    queues.runAll();
    for (int number = 9; number <= 11; ++number)
        make("note-" + std::to_string(number), number);
    EXPECT_TRUE(isTrueWithoutRightToRemove([&] {
        files.keepWithin(folder, kept, 1);
        queues.runAll();
        files.keepWithin(folder, kept, 1);
        return queues.pending() == 0
            && hasSaidOnly("5 of the oldest files cannot be removed from " + folder.string() + " (Permission denied)");
    }));
    EXPECT_THAT(names(), SizeIs(11));
}

TEST_F(FolderLimitsTest, SaysThatItCannotRemoveWhatAKilledServiceHadBegunToWrite)
{
    make(".kestod-0123456789abcdef.tmp", 0);
    EXPECT_TRUE(isTrueWithoutRightToRemove([&] {
        files.removeUnfinished(folder);
        return hasSaidOnly("the unfinished files of a killed service in " + folder.string()
                           + " cannot be removed (Permission denied)");
    }));
    EXPECT_THAT(names(), ElementsAre(".kestod-0123456789abcdef.tmp"));
}

} // namespace
