// SPDX-License-Identifier: Apache-2.0
// The captures on a real disk: complete or missing, within the limits, and never through a link.
#include "platform/linux/bugs/BugCaptureFolder.h"

#include "support/TemporaryDirectory.h"

#include <array>
#include <csignal>
#include <gmock/gmock.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace platform {
namespace {

namespace fs = std::filesystem;
using support::namesIn;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::UnorderedElementsAre;

constexpr double noon = 1'800'000'000; // 2027-01-15T08:00:00Z
using File = BugCaptureFolder::File;
using Limits = BugCaptureFolder::Limits;

class BugCaptureFolderTest : public testing::Test {
protected:
    static std::error_code addTo(BugCaptureFolder& folder, const std::string& bulk = "bulk")
    {
        const auto name = folder.nextName(noon);
        if (!name)
            return name.error();
        return folder.add(*name, {{"signature.json", "{}"}, {"response.json", "{}"}}, {{"log.txt", bulk}});
    }
    // A capture of that number, with its name at noon.
    [[nodiscard]] fs::path capture(int number) const
    {
        auto text = std::to_string(number);
        return captures / (std::string(8 - text.size(), '0') + text + "-20270115T080000Z");
    }
    [[nodiscard]] bool hasBulk(int number) const { return fs::exists(capture(number) / "state"); }

    const support::TemporaryDirectory directory;
    const fs::path state = directory.path();
    const fs::path captures = state / "bug-captures";
    const fs::path lastNumber = state / "bug-captures.last";
};

TEST_F(BugCaptureFolderTest, MakesNothingBeforeThereIsACapture)
{
    BugCaptureFolder folder(state);
    EXPECT_FALSE(folder.checkFreeSpace());
    EXPECT_THAT(namesIn(state), IsEmpty());
}

TEST_F(BugCaptureFolderTest, KeepsACaptureWithItsFilesAndItsBulk)
{
    BugCaptureFolder folder(state);
    ASSERT_EQ(folder.nextName(noon), "00000001-20270115T080000Z");
    ASSERT_FALSE(folder.add("00000001-20270115T080000Z", {{"signature.json", "seen"}}, {{"log.txt", "said"}}));
    EXPECT_THAT(namesIn(captures), ElementsAre("00000001-20270115T080000Z"));
    EXPECT_THAT(namesIn(capture(1)), ElementsAre("signature.json", "state"));
    EXPECT_EQ(support::readFile(capture(1) / "signature.json"), "seen");
    EXPECT_EQ(support::readFile(capture(1) / "state/log.txt"), "said");
}

TEST_F(BugCaptureFolderTest, IsNotForOthersToRead)
{
    BugCaptureFolder folder(state);
    ASSERT_FALSE(addTo(folder));
    for (const fs::path& path : {captures, capture(1), capture(1) / "state", capture(1) / "state/log.txt"})
        EXPECT_EQ(fs::status(path).permissions() & fs::perms::others_all, fs::perms::none) << path;
}

TEST_F(BugCaptureFolderTest, NumbersGoOnForAnyClockAndAfterARestart)
{
    {
        BugCaptureFolder folder(state);
        ASSERT_FALSE(addTo(folder));
        ASSERT_FALSE(addTo(folder));
    }
    BugCaptureFolder folder(state);
    EXPECT_EQ(folder.nextName(0), "00000003-19700101T000000Z");
    fs::remove_all(capture(1)); // by a person
    EXPECT_EQ(folder.nextName(noon), "00000003-20270115T080000Z");
}

TEST_F(BugCaptureFolderTest, ANumberIsNeverUsedAgainAfterCapturesAreRemoved)
{
    {
        BugCaptureFolder folder(state);
        ASSERT_FALSE(addTo(folder));
        ASSERT_FALSE(addTo(folder));
        fs::remove_all(capture(2)); // the newest, by a person
        EXPECT_EQ(folder.nextName(noon), "00000003-20270115T080000Z");
        ASSERT_FALSE(addTo(folder));
        fs::remove_all(captures);
        EXPECT_EQ(folder.nextName(noon), "00000004-20270115T080000Z");
        fs::remove_all(captures);
    }
    BugCaptureFolder folder(state);
    ASSERT_FALSE(addTo(folder));
    EXPECT_THAT(namesIn(captures), ElementsAre(capture(4).filename())) << "after a restart, too";
}

TEST_F(BugCaptureFolderTest, TheCapturesThemselvesCountWhereTheLastNumberIsLostOrBroken)
{
    BugCaptureFolder folder(state);
    for (int each = 0; each < 3; ++each)
        ASSERT_FALSE(addTo(folder));
    for (const char* broken : {"", "x\n", "2", "2\n", "-1\n", "99999999999999999999\n", "18446744073709551615\n"}) {
        support::writeFile(lastNumber, broken);
        EXPECT_EQ(folder.nextName(noon), "00000004-20270115T080000Z") << broken;
    }
    fs::remove(lastNumber);
    EXPECT_EQ(folder.nextName(noon), "00000004-20270115T080000Z");
    ASSERT_FALSE(addTo(folder));
    EXPECT_EQ(support::readFile(lastNumber), "4\n");
}

TEST_F(BugCaptureFolderTest, CapturesNothingWhoseNumberItCannotKeep)
{
    fs::create_directories(lastNumber / "in its place");
    BugCaptureFolder folder(state);
    EXPECT_TRUE(addTo(folder));
    EXPECT_THAT(namesIn(captures), IsEmpty());
    EXPECT_THAT(namesIn(state), ElementsAre("bug-captures", "bug-captures.last")) << "and no file is left";
}

TEST_F(BugCaptureFolderTest, OldestBulkGoesFirstAndItsSignatureStays)
{
    BugCaptureFolder folder(state, Limits{.mostWithBulk = 2});
    for (int each = 0; each < 4; ++each)
        ASSERT_FALSE(addTo(folder));
    EXPECT_FALSE(hasBulk(1));
    EXPECT_FALSE(hasBulk(2));
    EXPECT_TRUE(hasBulk(3));
    EXPECT_TRUE(hasBulk(4));
    EXPECT_THAT(namesIn(capture(1)), ElementsAre("response.json", "signature.json")) << "the tombstone";
    EXPECT_THAT(namesIn(captures), testing::SizeIs(4)) << "nothing hidden is left";
}

TEST_F(BugCaptureFolderTest, AllBulkTogetherIsNeverMoreThanAllowed)
{
    BugCaptureFolder folder(state, Limits{.mostBytes = 1000});
    for (const std::size_t size : {400U, 400U, 200U})
        ASSERT_FALSE(addTo(folder, std::string(size, 'x')));
    EXPECT_TRUE(hasBulk(1)) << "1000 bytes are allowed";
    ASSERT_FALSE(addTo(folder, "x"));
    EXPECT_FALSE(hasBulk(1)) << "1001 are not";
    EXPECT_TRUE(hasBulk(2));
    ASSERT_FALSE(addTo(folder, std::string(900, 'x')));
    EXPECT_FALSE(hasBulk(2));
    EXPECT_FALSE(hasBulk(3));
    EXPECT_TRUE(hasBulk(4)) << "900 and 1 fit";
    EXPECT_TRUE(hasBulk(5));
}

TEST_F(BugCaptureFolderTest, ACaptureLargerThanAllThatIsAllowedIsKeptAsASignature)
{
    BugCaptureFolder folder(state, Limits{.mostBytes = 1000});
    ASSERT_FALSE(addTo(folder, "small"));
    ASSERT_FALSE(addTo(folder, std::string(1001, 'x')));
    EXPECT_TRUE(hasBulk(1)) << "no capture was removed for it";
    EXPECT_FALSE(hasBulk(2));
    EXPECT_TRUE(fs::exists(capture(2) / "signature.json"));
}

TEST_F(BugCaptureFolderTest, BeyondSoManyCapturesTheOldestGoAltogether)
{
    BugCaptureFolder folder(state, Limits{.mostCaptures = 3, .mostWithBulk = 1});
    for (int each = 0; each < 5; ++each)
        ASSERT_FALSE(addTo(folder));
    EXPECT_THAT(namesIn(captures), ElementsAre(capture(3).filename(), capture(4).filename(), capture(5).filename()));
    EXPECT_TRUE(hasBulk(5));
}

TEST_F(BugCaptureFolderTest, LeavesAloneWhatIsNotItsOwn)
{
    BugCaptureFolder folder(state, Limits{.mostCaptures = 1, .mostWithBulk = 1});
    ASSERT_FALSE(addTo(folder));
    fs::create_directory(captures / "notes of a person");
    support::writeFile(captures / "12 is no capture", "");
    ASSERT_FALSE(addTo(folder));
    EXPECT_THAT(namesIn(captures),
                UnorderedElementsAre(capture(2).filename(), "notes of a person", "12 is no capture"));
}

TEST_F(BugCaptureFolderTest, SaysWhenTheDiskHasNoRoomForOthers)
{
    BugCaptureFolder folder(state, Limits{.bytesLeftFree = UINT64_MAX});
    EXPECT_EQ(folder.checkFreeSpace(), std::errc::no_space_on_device);
    EXPECT_EQ(BugCaptureFolder(state / "missing").checkFreeSpace(), std::errc::no_such_file_or_directory);
}

// --- complete or missing

TEST_F(BugCaptureFolderTest, RemovesWhatAKilledServiceLeftWhenItStarts)
{
    {
        BugCaptureFolder folder(state);
        ASSERT_FALSE(addTo(folder));
    }
    fs::create_directories(captures / ".new/state");
    support::writeFile(captures / ".new/state/log.txt", "half");
    fs::create_directories(captures / ".old");
    support::writeFile(captures / ".old/log.txt", "half");
    support::writeFile(captures / ".hidden by a person", "");
    BugCaptureFolder folder(state);
    EXPECT_THAT(namesIn(captures), ElementsAre(".hidden by a person", capture(1).filename()));
}

TEST_F(BugCaptureFolderTest, LeavesNothingOfACaptureThatDoesNotFit)
{
    const pid_t child = ::fork();
    if (child == 0) {
        std::signal(SIGXFSZ, SIG_IGN);
        const rlimit atMost{10'000, 10'000};
        BugCaptureFolder folder(state);
        const bool isRefused = ::setrlimit(RLIMIT_FSIZE, &atMost) == 0
            && addTo(folder, std::string(20'000, 'x')) == std::errc::file_too_large && !addTo(folder, "small");
        ::_exit(isRefused ? 0 : 1);
    }
    int status = 0;
    ASSERT_EQ(::waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0);
    EXPECT_THAT(namesIn(captures), ElementsAre(capture(1).filename())) << "the small one, of the same number";
}

TEST_F(BugCaptureFolderTest, LeavesNothingOfACaptureWhosePlaceIsTaken)
{
    BugCaptureFolder folder(state);
    fs::create_directories(capture(1) / "of a person");
    EXPECT_EQ(folder.add(capture(1).filename(), {{"signature.json", "{}"}}, {}), std::errc::directory_not_empty);
    EXPECT_THAT(namesIn(captures), ElementsAre(capture(1).filename()));
    EXPECT_THAT(namesIn(capture(1)), ElementsAre("of a person"));
}

TEST_F(BugCaptureFolderTest, KilledAtAnyMomentEveryCaptureThatIsSeenIsWhole)
{
    constexpr int kills = 10;
    const Limits limits{.mostCaptures = 6, .mostWithBulk = 3};
    for (int each = 0; each < kills; ++each) {
        std::array<int, 2> ends{};
        ASSERT_EQ(::pipe(ends.data()), 0);
        const pid_t child = ::fork();
        if (child == 0) {
            BugCaptureFolder folder(state, limits);
            for (char byte = 0; !addTo(folder, std::string(50'000, 'x'));)
                if (::write(ends[1], &byte, 1) != 1)
                    break;
            ::_exit(1);
        }
        char byte = 0;
        for (int written = 0; written <= each; ++written)
            EXPECT_EQ(::read(ends[0], &byte, 1), 1);
        ::kill(child, SIGKILL);
        int status = 0;
        ASSERT_EQ(::waitpid(child, &status, 0), child);
        ::close(ends[0]);
        ::close(ends[1]);
        for (const std::string& name : namesIn(captures)) {
            if (name.starts_with('.'))
                continue;
            EXPECT_TRUE(fs::exists(captures / name / "signature.json")) << name;
            EXPECT_TRUE(fs::exists(captures / name / "response.json")) << name;
            if (fs::exists(captures / name / "state")) {
                EXPECT_EQ(fs::file_size(captures / name / "state/log.txt"), 50'000U) << name;
            }
        }
    }
    BugCaptureFolder folder(state, limits);
    ASSERT_FALSE(addTo(folder));
    EXPECT_LE(namesIn(captures).size(), 6U);
    EXPECT_FALSE(namesIn(captures).front().starts_with('.')) << "no incomplete capture remains";
}

// --- links

TEST_F(BugCaptureFolderTest, TakesNoLinkForItsFolder)
{
    fs::create_directory(state / "elsewhere");
    fs::create_directories(state / "elsewhere/.new");
    fs::create_directory_symlink("elsewhere", captures);
    BugCaptureFolder folder(state);
    EXPECT_EQ(addTo(folder), std::errc::not_a_directory);
    EXPECT_THAT(namesIn(state / "elsewhere"), ElementsAre(".new")) << "nothing removed, nothing written";
}

TEST_F(BugCaptureFolderTest, FollowsALinkToTheStateDirectoryWhichIsTheAdministrators)
{
    fs::create_directory(state / "real");
    fs::create_directory_symlink("real", state / "link");
    BugCaptureFolder folder(state / "link");
    EXPECT_FALSE(addTo(folder));
    EXPECT_THAT(namesIn(state / "real"), ElementsAre("bug-captures", "bug-captures.last"));
}

TEST_F(BugCaptureFolderTest, RemovingBulkRemovesNothingThatLinksLeadTo)
{
    fs::create_directory(state / "precious");
    support::writeFile(state / "precious/file", "kept");
    BugCaptureFolder folder(state, Limits{.mostCaptures = 2, .mostWithBulk = 1});
    ASSERT_FALSE(addTo(folder));
    fs::create_directory_symlink(state / "precious", capture(1) / "state/link");
    ASSERT_FALSE(addTo(folder));
    ASSERT_FALSE(hasBulk(1));
    fs::remove_all(capture(1));
    fs::create_directory_symlink(state / "precious", capture(1)); // in the place of a capture
    fs::create_directory_symlink(state / "precious", captures / ".new"); // and of the next one
    ASSERT_FALSE(addTo(folder));
    ASSERT_FALSE(addTo(folder));
    EXPECT_EQ(support::readFile(state / "precious/file"), "kept");
    EXPECT_THAT(namesIn(state / "precious"), ElementsAre("file"));
}

TEST_F(BugCaptureFolderTest, SaysWhyACaptureCannotBeKept)
{
    BugCaptureFolder missing(state / "missing");
    EXPECT_EQ(addTo(missing), std::errc::no_such_file_or_directory);
    support::writeFile(captures, "a file");
    BugCaptureFolder blocked(state);
    EXPECT_EQ(addTo(blocked), std::errc::not_a_directory);
}

} // namespace
} // namespace platform
