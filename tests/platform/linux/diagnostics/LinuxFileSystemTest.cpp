// SPDX-License-Identifier: Apache-2.0
// Folders and files on the real file system: permissions, links of other users, and full disks.
#include "platform/linux/diagnostics/LinuxFileSystem.h"
#include "support/TemporaryDirectory.h"

#include <array>
#include <csignal>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/inotify.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

namespace fs = std::filesystem;
using platform::LinuxFileSystem;
using support::namesIn;
using support::permissionsOf;
using testing::Each;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::UnorderedElementsAre;

class LinuxFileSystemTest : public testing::Test {
protected:
    std::expected<void, std::error_code> write(const fs::path& path, std::string_view text)
    {
        auto file = files.createAtomically(path);
        if (!file)
            return std::unexpected(file.error());
        (*file)->write(text);
        return (*file)->commit();
    }
    // Runs `body` in a separate process, so that it may change the process's limits and rights. Returns its result.
    template <typename Body> static bool inChild(Body body)
    {
        const pid_t child = ::fork();
        if (child == 0)
            ::_exit(body() ? 0 : 1);
        int status = 0;
        EXPECT_EQ(::waitpid(child, &status, 0), child);
        return WIFEXITED(status) && WEXITSTATUS(status) == 0;
    }
    // Gives up root's right to use every folder.
    static bool becomeNobody()
    {
        constexpr uid_t nobody = 65534;
        return ::geteuid() != 0 || (::setegid(nobody) == 0 && ::seteuid(nobody) == 0);
    }

    const support::TemporaryDirectory directory;
    const fs::path root = directory.path();
    LinuxFileSystem files{root};
};

// --- folders

TEST_F(LinuxFileSystemTest, MakesEveryMissingFolderWithExactlyThePermissionsDespiteTheUmask)
{
    for (const mode_t mask : {0U, 022U, 077U, 0777U}) {
        const mode_t before = ::umask(mask);
        const fs::path top = root / std::to_string(mask);
        const auto made = files.createDirectories(top / "Audio/Reporting", 0777);
        ::umask(before);
        EXPECT_TRUE(made) << made.error().message();
        for (const fs::path& folder : {top, top / "Audio", top / "Audio/Reporting"})
            EXPECT_EQ(permissionsOf(folder), 0777U) << folder;
    }
    ASSERT_TRUE(files.createDirectories(root / "others", 0750));
    EXPECT_EQ(permissionsOf(root / "others"), 0750U);
}

TEST_F(LinuxFileSystemTest, LeavesFoldersThatExistAsTheyAre)
{
    fs::create_directory(root / "Audio");
    ASSERT_EQ(::chmod((root / "Audio").c_str(), 0750), 0);
    ASSERT_TRUE(files.createDirectories(root / "Audio/Reporting", 0777));
    ASSERT_TRUE(files.createDirectories(root / "Audio/Reporting", 0777));
    EXPECT_EQ(permissionsOf(root / "Audio"), 0750U);
    EXPECT_EQ(permissionsOf(root / "Audio/Reporting"), 0777U);
    ASSERT_TRUE(files.createDirectories(root, 0777));
    EXPECT_NE(permissionsOf(root), 0777U) << "the service may not open the root";
}

TEST_F(LinuxFileSystemTest, FollowsALinkToTheRootWhichIsTheAdministrators)
{
    fs::create_directory(root / "real");
    fs::create_directory_symlink("real", root / "link");
    LinuxFileSystem throughLink(root / "link");
    ASSERT_TRUE(throughLink.createDirectories(root / "link/Audio", 0777));
    auto file = throughLink.createAtomically(root / "link/Audio/a.json");
    ASSERT_TRUE(file);
    ASSERT_TRUE((*file)->commit());
    EXPECT_TRUE(fs::exists(root / "real/Audio/a.json"));
}

TEST_F(LinuxFileSystemTest, TakesNoLinkForAFolder)
{
    fs::create_directory(root / "elsewhere");
    fs::create_directory_symlink("elsewhere", root / "Audio");
    const auto made = files.createDirectories(root / "Audio/Reporting", 0777);
    ASSERT_FALSE(made);
    EXPECT_EQ(made.error(), std::errc::not_a_directory);
    EXPECT_THAT(namesIn(root / "elsewhere"), IsEmpty());

    fs::create_directories(root / "elsewhere/Reporting");
    EXPECT_EQ(write(root / "Audio/Reporting/a.json", "text").error(), std::errc::not_a_directory);
    EXPECT_EQ(write(root / "Audio/a.json", "text").error(), std::errc::not_a_directory);
    EXPECT_THAT(namesIn(root / "elsewhere"), ElementsAre("Reporting"));
    EXPECT_THAT(namesIn(root / "elsewhere/Reporting"), IsEmpty());
}

TEST_F(LinuxFileSystemTest, MakesNoFolderWhereADanglingLinkStands)
{
    fs::create_directory_symlink("nowhere", root / "Audio");
    EXPECT_FALSE(files.createDirectories(root / "Audio", 0777));
    EXPECT_FALSE(fs::exists(root / "nowhere"));
}

TEST_F(LinuxFileSystemTest, SaysWhyAFolderCannotBeMade)
{
    EXPECT_EQ(LinuxFileSystem(root / "gone").createDirectories(root / "gone/Audio", 0777).error(),
              std::errc::no_such_file_or_directory);
    ASSERT_EQ(::chmod(root.c_str(), 0555), 0);
    EXPECT_TRUE(inChild([&] {
        return becomeNobody() && files.createDirectories(root / "Audio", 0777).error() == std::errc::permission_denied;
    }));
    ASSERT_EQ(::chmod(root.c_str(), 0700), 0);
}

TEST_F(LinuxFileSystemTest, MakesItsRootAgainAsItWasWhenItWentMeanwhile)
{
    for (const fs::path& gone : {root / "state/logs", root / "state"})
        for (const mode_t mask : {0U, 0777U}) {
            fs::create_directories(root / "state/logs");
            ASSERT_EQ(::chmod((root / "state/logs").c_str(), 02750), 0);
            LinuxFileSystem logs(root / "state/logs");
            fs::remove_all(gone);
            EXPECT_EQ(logs.createAtomically(root / "state/logs/a.json").error(), std::errc::no_such_file_or_directory)
                << "only requested folders are made";
            const mode_t before = ::umask(mask);
            const auto made = logs.createDirectories(root / "state/logs/Audio", 0777);
            ::umask(before);
            ASSERT_TRUE(made) << made.error().message();
            EXPECT_EQ(permissionsOf(root / "state/logs"), 02750U);
            EXPECT_EQ(permissionsOf(root / "state/logs/Audio"), 0777U);
            fs::remove_all(root / "state");
        }
}

TEST_F(LinuxFileSystemTest, SaysWhyItsRootCannotBeMadeAgain)
{
    fs::create_directory(root / "logs");
    LinuxFileSystem logs(root / "logs");
    fs::remove(root / "logs");
    ASSERT_EQ(::chmod(root.c_str(), 0555), 0);
    EXPECT_TRUE(inChild([&] {
        return becomeNobody()
            && logs.createDirectories(root / "logs/Audio", 0777).error() == std::errc::permission_denied;
    }));
    ASSERT_EQ(::chmod(root.c_str(), 0700), 0);
    fs::create_directory_symlink("nowhere", root / "logs");
    EXPECT_FALSE(logs.createDirectories(root / "logs/Audio", 0777)) << "a link is the administrator's";
    EXPECT_FALSE(fs::exists(root / "nowhere"));
}

// --- files

TEST_F(LinuxFileSystemTest, LetsEverybodyReadItsFilesDespiteTheUmask)
{
    for (const mode_t mask : {0U, 022U, 077U, 0777U}) {
        const fs::path path = root / std::to_string(mask);
        const mode_t before = ::umask(mask);
        const auto written = write(path, "text");
        ::umask(before);
        EXPECT_TRUE(written);
        EXPECT_EQ(permissionsOf(path), 0644U);
    }
}

TEST_F(LinuxFileSystemTest, TakesThePlaceOfAnEarlierFileAndLeavesItsReadersTheOldOne)
{
    ASSERT_TRUE(write(root / "a.json", "old"));
    std::ifstream reader(root / "a.json");
    ASSERT_TRUE(write(root / "a.json", "new"));
    std::string seen;
    reader >> seen;
    EXPECT_EQ(seen, "old");
    EXPECT_EQ(support::readFile(root / "a.json"), "new");
}

TEST_F(LinuxFileSystemTest, ReplacesALinkInThePlaceOfAFileAndNotWhatItLeadsTo)
{
    support::writeFile(root / "precious", "kept");
    fs::create_symlink("precious", root / "a.json");
    ASSERT_TRUE(write(root / "a.json", "new"));
    EXPECT_EQ(support::readFile(root / "precious"), "kept");
    EXPECT_FALSE(fs::is_symlink(root / "a.json"));
    EXPECT_EQ(support::readFile(root / "a.json"), "new");
}

TEST_F(LinuxFileSystemTest, SaysThatAFileMayNotBeWritten)
{
    fs::create_directory(root / "folder");
    ASSERT_EQ(::chmod((root / "folder").c_str(), 0555), 0);
    ASSERT_EQ(::chmod(root.c_str(), 0755), 0);
    EXPECT_TRUE(inChild([&] {
        return becomeNobody() && write(root / "folder/a.json", "text").error() == std::errc::permission_denied;
    }));
}

TEST_F(LinuxFileSystemTest, KeepsTheOldFileWhenTheNewOneDoesNotFit)
{
    ASSERT_TRUE(write(root / "a.json", "old"));
    EXPECT_TRUE(inChild([&] {
        std::signal(SIGXFSZ, SIG_IGN);
        const rlimit atMost{10'000, 10'000};
        if (::setrlimit(RLIMIT_FSIZE, &atMost) != 0)
            return false;
        auto file = files.createAtomically(root / "a.json");
        if (!file)
            return false;
        (*file)->write(std::string(9'000, 'x'));
        (*file)->write(std::string(9'000, 'x'));
        (*file)->write("the rest is not even tried");
        const auto written = (*file)->commit();
        file->reset();
        return !written && written.error() == std::errc::file_too_large;
    }));
    EXPECT_EQ(support::readFile(root / "a.json"), "old");
    EXPECT_THAT(namesIn(root), ElementsAre("a.json"));
}

TEST_F(LinuxFileSystemTest, StaysInAFolderThatIsMovedAwayMeanwhile)
{
    fs::create_directory(root / "Audio");
    fs::create_directory(root / "elsewhere");
    auto file = files.createAtomically(root / "Audio/a.json");
    ASSERT_TRUE(file);
    (*file)->write("text");
    fs::rename(root / "Audio", root / "moved");
    fs::create_directory_symlink("elsewhere", root / "Audio");
    ASSERT_TRUE((*file)->commit());
    EXPECT_THAT(namesIn(root / "elsewhere"), IsEmpty());
    EXPECT_THAT(namesIn(root / "moved"), ElementsAre("a.json"));
}

// --- reading

TEST_F(LinuxFileSystemTest, SaysThatAFileMayNotBeRead)
{
    support::writeFile(root / "secret", "text");
    ASSERT_EQ(::chmod((root / "secret").c_str(), 0), 0);
    ASSERT_EQ(::chmod(root.c_str(), 0755), 0);
    EXPECT_TRUE(inChild(
        [&] { return becomeNobody() && files.readFile(root / "secret", 10).error() == std::errc::permission_denied; }));
}

// Merely opening a device may have an effect. The kernel (inotify) reports each opening.
TEST_F(LinuxFileSystemTest, DoesNotOpenWhatIsNotAFile)
{
    ASSERT_EQ(::mkfifo((root / "pipe").c_str(), 0600), 0);
    const platform::FileDescriptor watch(::inotify_init1(IN_NONBLOCK | IN_CLOEXEC));
    ASSERT_GE(::inotify_add_watch(watch.get(), root.c_str(), IN_OPEN), 0);
    std::array<char, 4096> events{};

    EXPECT_EQ(files.readFile(root / "pipe", 10).error(), std::errc::invalid_argument);
    EXPECT_LT(::read(watch.get(), events.data(), events.size()), 0) << "it was opened";

    const platform::FileDescriptor opened(::open((root / "pipe").c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC));
    EXPECT_GT(::read(watch.get(), events.data(), events.size()), 0) << "and would have been seen";
}

} // namespace
