// SPDX-License-Identifier: Apache-2.0
// Files by their names in an open folder: links, pipes and folders in their places.
#include "platform/linux/files/FilesAt.h"

#include "support/TemporaryDirectory.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/stat.h>

namespace platform {
namespace {

namespace fs = std::filesystem;
using testing::ElementsAre;
using testing::IsEmpty;

class FilesAtTest : public testing::Test {
protected:
    const support::TemporaryDirectory directory;
    const fs::path root = directory.path();
    const FileDescriptor folder{::open(root.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC)};
};

TEST_F(FilesAtTest, OpensFoldersButNoLinksToThem)
{
    fs::create_directory(root / "real");
    fs::create_directory_symlink("real", root / "link");
    support::writeFile(root / "file", "");
    EXPECT_TRUE(openDirectoryAt(folder.get(), "real"));
    EXPECT_EQ(openDirectoryAt(folder.get(), "link").error(), std::errc::not_a_directory);
    EXPECT_EQ(openDirectoryAt(folder.get(), "file").error(), std::errc::not_a_directory);
    EXPECT_EQ(openDirectoryAt(folder.get(), "missing").error(), std::errc::no_such_file_or_directory);
}

TEST_F(FilesAtTest, ListsNamesInOrderHiddenOnesToo)
{
    EXPECT_THAT(*namesIn(folder.get(), 10), IsEmpty());
    for (const char* name : {"b", "a", ".hidden"})
        support::writeFile(root / name, "");
    EXPECT_THAT(*namesIn(folder.get(), 10), ElementsAre(".hidden", "a", "b"));
    EXPECT_THAT(*namesIn(folder.get(), 10), ElementsAre(".hidden", "a", "b")) << "again, from the beginning";
    EXPECT_EQ(namesIn(folder.get(), 2)->size(), 2U);
    EXPECT_FALSE(namesIn(-1, 2));
}

TEST_F(FilesAtTest, ReadsTheFirstBytesOfAFile)
{
    support::writeFile(root / "file", std::string(10'000, 'x') + "end");
    EXPECT_EQ(readFileAt(folder.get(), "file", 20'000), std::string(10'000, 'x') + "end");
    EXPECT_EQ(readFileAt(folder.get(), "file", 5'000), std::string(5'000, 'x'));
    EXPECT_EQ(readFileAt(folder.get(), "file", 0), "");
    support::writeFile(root / "empty", "");
    EXPECT_EQ(readFileAt(folder.get(), "empty", 10), "");
}

TEST(RandomDigits, AreOthersEachTimeAndFoundInNames)
{
    const std::string digits = randomDigits();
    EXPECT_THAT(digits, testing::MatchesRegex("[0-9a-f]*"));
    EXPECT_EQ(digits.size(), 16U);
    EXPECT_NE(digits, randomDigits());
    EXPECT_EQ(randomDigitsBetween("<", ">", "<" + digits + ">"), digits);
    for (const char* other : {"", "<>", "<0123456789abcde>", "<0123456789abcdef0>", "<0123456789abcdeF>",
                              "0123456789abcdef>", "<0123456789abcdef"})
        EXPECT_EQ(randomDigitsBetween("<", ">", other), "") << other;
}

TEST_F(FilesAtTest, RemovesAFileIfItIsUnwanted)
{
    const auto isOld = [&](const std::string& name) { return support::readFile(root / name) == "old"; };
    support::writeFile(root / "file", "new");
    EXPECT_FALSE(removeFileAtIf(folder.get(), "file", ".aside", isOld));
    EXPECT_THAT(*namesIn(folder.get(), 10), ElementsAre("file"));
    support::writeFile(root / "file", "old");
    EXPECT_TRUE(removeFileAtIf(folder.get(), "file", ".aside", isOld));
    EXPECT_THAT(*namesIn(folder.get(), 10), IsEmpty());
}

TEST_F(FilesAtTest, RemovesNoFileThatTakesThePlaceOfAnUnwantedOne)
{
    int asked = 0;
    const auto isOld = [&](const std::string& name) {
        const bool isIt = support::readFile(root / name) == "old";
        if (++asked == 1)
            support::replaceFile(root / "file", "new");
        return isIt;
    };
    support::writeFile(root / "file", "old");
    EXPECT_FALSE(removeFileAtIf(folder.get(), "file", ".aside", isOld));
    EXPECT_THAT(*namesIn(folder.get(), 10), ElementsAre("file"));
    EXPECT_EQ(support::readFile(root / "file"), "new");
}

TEST_F(FilesAtTest, KeepsTheNewestOfSeveralFilesThatTakeThePlaceOfAnUnwantedOne)
{
    int asked = 0;
    const auto isOld = [&](const std::string& name) {
        const bool isIt = support::readFile(root / name) == "old";
        support::replaceFile(root / "file", ++asked == 1 ? "newer" : "newest");
        return isIt;
    };
    support::writeFile(root / "file", "old");
    EXPECT_FALSE(removeFileAtIf(folder.get(), "file", ".aside", isOld));
    EXPECT_THAT(*namesIn(folder.get(), 10), ElementsAre("file"));
    EXPECT_EQ(support::readFile(root / "file"), "newest");
}

TEST_F(FilesAtTest, ReadsRegularFilesOnlyAndNeverWaits)
{
    support::writeFile(root / "secret", "secret");
    fs::create_symlink("secret", root / "link");
    fs::create_directory(root / "folder");
    ASSERT_EQ(::mkfifo((root / "pipe").c_str(), 0600), 0);
    EXPECT_EQ(readFileAt(folder.get(), "link", 10).error(), std::errc::too_many_symbolic_link_levels);
    EXPECT_EQ(readFileAt(folder.get(), "folder", 10).error(), std::errc::invalid_argument);
    EXPECT_EQ(readFileAt(folder.get(), "pipe", 10).error(), std::errc::invalid_argument);
    EXPECT_EQ(readFileAt(folder.get(), "missing", 10).error(), std::errc::no_such_file_or_directory);
}

TEST_F(FilesAtTest, WritesAFileThatIsNotThereYet)
{
    EXPECT_FALSE(writeFileAt(folder.get(), "file", "text"));
    EXPECT_EQ(support::readFile(root / "file"), "text");
    EXPECT_EQ(fs::status(root / "file").permissions() & fs::perms::others_all, fs::perms::none);
    EXPECT_EQ(writeFileAt(folder.get(), "file", "other"), std::errc::file_exists);
    EXPECT_EQ(support::readFile(root / "file"), "text");

    fs::create_symlink("elsewhere", root / "link");
    EXPECT_EQ(writeFileAt(folder.get(), "link", "text"), std::errc::file_exists);
    EXPECT_FALSE(fs::exists(root / "elsewhere"));
}

TEST_F(FilesAtTest, CountsTheBytesOfFilesAlone)
{
    support::writeFile(root / "a", "123");
    support::writeFile(root / "b", "4567");
    support::writeFile(directory.path() / "c", "");
    fs::create_directory(root / "folder");
    support::writeFile(root / "folder/inside", "not counted");
    fs::create_symlink("a", root / "link");
    EXPECT_EQ(bytesOfFilesIn(folder.get()), 7U);
}

TEST_F(FilesAtTest, RemovesAFolderWithEverythingInItAndNothingThatLinksLeadTo)
{
    fs::create_directories(root / "kept");
    support::writeFile(root / "kept/file", "kept");
    fs::create_directories(root / "tree/a/b");
    support::writeFile(root / "tree/a/b/.file", "");
    fs::create_directory_symlink(root / "kept", root / "tree/a/link");
    fs::create_symlink(root / "kept/file", root / "tree/link");
    EXPECT_TRUE(removeTreeAt(folder.get(), "tree"));
    EXPECT_THAT(*namesIn(folder.get(), 10), ElementsAre("kept"));
    EXPECT_EQ(support::readFile(root / "kept/file"), "kept");

    fs::create_directory_symlink("kept", root / "link");
    EXPECT_TRUE(removeTreeAt(folder.get(), "link"));
    EXPECT_TRUE(removeTreeAt(folder.get(), "kept"));
    EXPECT_THAT(*namesIn(folder.get(), 10), IsEmpty());
    EXPECT_FALSE(removeTreeAt(folder.get(), "missing"));
}

TEST_F(FilesAtTest, StopsAtATreeThatIsDeeperThanAnyOfOurs)
{
    fs::create_directories(root / "1/2/3/4/5/6/7/8/9");
    EXPECT_FALSE(removeTreeAt(folder.get(), "1"));
    EXPECT_TRUE(fs::exists(root / "1/2/3/4/5/6/7/8/9"));
    fs::remove(root / "1/2/3/4/5/6/7/8/9");
    EXPECT_TRUE(removeTreeAt(folder.get(), "1"));
    EXPECT_FALSE(fs::exists(root / "1"));
}

} // namespace
} // namespace platform
