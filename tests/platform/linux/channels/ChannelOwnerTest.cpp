// SPDX-License-Identifier: Apache-2.0
// The owner of a channel, and files of other users in its place.
#include "platform/linux/channels/ChannelOwner.h"
#include "platform/linux/channels/ChannelTree.h"
#include "platform/linux/channels/Unhurried.h"
#include "support/TemporaryDirectory.h"

#include <cerrno>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/stat.h>
#include <unistd.h>

namespace platform {
namespace {

namespace fs = std::filesystem;
using testing::ElementsAre;
using testing::IsEmpty;

constexpr std::string_view owner = "0123456789abcdef";

// --- words

TEST(ChannelOwnerWords, AreTheLineAndTheNamesOfHiddenFiles)
{
    EXPECT_EQ(channelOwnerLine(owner), "owner 0123456789abcdef\n");
    EXPECT_EQ(channelOwnerFileName(owner), ".kesto-0123456789abcdef.owner");
    EXPECT_EQ(channelTemporaryFileName(owner), ".kesto-0123456789abcdef.tmp");
    EXPECT_EQ(ownerOfChannelOwnerFile(".kesto-0123456789abcdef.owner"), owner);
    EXPECT_EQ(ownerOfChannelTemporaryFile(".kesto-0123456789abcdef.tmp"), owner);
}

TEST(ChannelOwnerWords, AreTakenForNothingElse)
{
    for (const char* name :
         {"", ".kesto-.owner", ".kesto-0123456789abcde.owner", ".kesto-0123456789abcdef0.owner",
          ".kesto-0123456789ABCDEF.owner", ".kesto-0123456789abcdeg.owner", "kesto-0123456789abcdef.owner",
          ".kesto-0123456789abcdef.tmp", ".kesto-/123456789abcde.owner"})
        EXPECT_EQ(ownerOfChannelOwnerFile(name), "") << name;
    EXPECT_EQ(ownerOfChannelTemporaryFile(".kesto-0123456789abcdef.owner"), "");
    EXPECT_EQ(ownerOfChannelTemporaryFile(".kestod-0123456789abcdef.tmp"), "") << "another program's";
}

TEST(ChannelOwnerWords, AreTakenOffTheTextOfAFile)
{
    std::string_view text = "owner 0123456789abcdef\nsimple\n1\n";
    EXPECT_EQ(takeChannelOwner(text), owner);
    EXPECT_EQ(text, "simple\n1\n");
    text = "owner 0123456789abcdef\n";
    EXPECT_EQ(takeChannelOwner(text), owner);
    EXPECT_EQ(text, "");
    for (const std::string_view other :
         {"", "simple\n1\n", "owner 0123456789abcdef", "owner 0123456789abcde\nsimple\n1\n", "owner \nsimple\n1\n",
          "owner 0123456789abcdef0\nsimple\n1\n", "owner 0123456789ABCDEF\nsimple\n1\n"}) {
        text = other;
        EXPECT_EQ(takeChannelOwner(text), "") << other;
        EXPECT_EQ(text, other);
    }
}

// --- in a tree

class ChannelOwnerTest : public testing::Test {
protected:
    ChannelOwnerTest()
    {
        fs::create_directories(root / "amp/Tx/-");
        support::writeFile(root / "amp/Tx/-/owned", "owner 0123456789abcdef\nsimple\n1\n");
    }

    [[nodiscard]] FileDescriptor openDriver(const char* name = "amp") const
    {
        return FileDescriptor(::open((root / name).c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    }
    [[nodiscard]] FileDescriptor own(std::string_view who = owner, const char* driver = "amp") const
    {
        return makeChannelOwnerFile(openDriver(driver).get(), who);
    }
    // The names of the existing channels.
    [[nodiscard]] std::vector<std::string> channels() const
    {
        const auto reading = ChannelTree(root, {.time = unhurried}).read({{}}).value();
        EXPECT_THAT(reading.problems, IsEmpty()) << "leftover files are not a problem";
        std::vector<std::string> names;
        for (const ReportingChannel& channel : reading.channels)
            names.push_back(*channel.name);
        return names;
    }

    const support::TemporaryDirectory directory;
    const fs::path root = directory.path() / "channels";
    const fs::path ownerFile = root / "amp/.kesto-0123456789abcdef.owner";
};

TEST_F(ChannelOwnerTest, AChannelIsThereAsLongAsItsOwnerFileIsLocked)
{
    EXPECT_THAT(channels(), IsEmpty()) << "the owner file is missing";
    {
        const FileDescriptor owning = own();
        ASSERT_TRUE(owning);
        EXPECT_THAT(channels(), ElementsAre("owned"));
        EXPECT_THAT(channels(), ElementsAre("owned")) << "testing the lock does not release it";
    }
    EXPECT_TRUE(fs::exists(ownerFile));
    EXPECT_THAT(channels(), IsEmpty());
}

TEST_F(ChannelOwnerTest, EachChannelHasItsOwn)
{
    const auto publish = [&](const std::string& name, const std::string& text) {
        support::writeFile(root / "amp/Tx/-" / name, text);
    };
    publish("a", "owner 1111111111111111\nsimple\n1\n");
    publish("b", "simple\n1\n");
    publish("c", "owner 2222222222222222\nsimple\n1\n");
    publish("d", "owner 1111111111111111\nsimple\n1\n");
    const FileDescriptor first = own("1111111111111111");
    EXPECT_THAT(channels(), ElementsAre("a", "b", "d"));
    const FileDescriptor second = own("2222222222222222");
    EXPECT_THAT(channels(), ElementsAre("a", "b", "c", "d"));
}

TEST_F(ChannelOwnerTest, OwnersOfOtherDriversAreOthers)
{
    fs::create_directories(root / "codec");
    const FileDescriptor elsewhere = own(owner, "codec");
    ASSERT_TRUE(elsewhere);
    EXPECT_THAT(channels(), IsEmpty());
    fs::create_directories(root / "codec/Tx/-");
    fs::copy(root / "amp/Tx/-/owned", root / "codec/Tx/-/owned too");
    EXPECT_THAT(channels(), ElementsAre("owned too"));
}

TEST_F(ChannelOwnerTest, WhoMayOnlyReadTheOwnerFileCannotPretendThatItLives)
{
    {
        const FileDescriptor owning = own();
    }
    const FileDescriptor reader(::open(ownerFile.c_str(), O_RDONLY | O_CLOEXEC));
    struct flock lock = {};
    lock.l_type = F_RDLCK;
    lock.l_whence = SEEK_SET;
    ASSERT_EQ(::fcntl(reader.get(), F_OFD_SETLK, &lock), 0);
    EXPECT_THAT(channels(), IsEmpty());
    lock.l_type = F_WRLCK;
    EXPECT_EQ(::fcntl(reader.get(), F_OFD_SETLK, &lock), -1);
    EXPECT_EQ(errno, EBADF);
}

TEST_F(ChannelOwnerTest, NothingButAFileIsAnOwner)
{
    fs::create_directory(ownerFile);
    EXPECT_THAT(channels(), IsEmpty());
    fs::remove(ownerFile);
    ASSERT_EQ(::mkfifo(ownerFile.c_str(), 0600), 0);
    EXPECT_THAT(channels(), IsEmpty()) << "the test of the lock does not wait";
    fs::remove(ownerFile);
    const FileDescriptor other = own("1111111111111111");
    fs::create_symlink(".kesto-1111111111111111.owner", ownerFile);
    EXPECT_THAT(channels(), IsEmpty());
}

TEST_F(ChannelOwnerTest, AChannelIsThereWhereItsOwnerCannotBeLookedAt)
{
    constexpr uid_t nobody = 65534;
    {
        const FileDescriptor owning = own();
    }
    ASSERT_EQ(::chmod(ownerFile.c_str(), 0), 0);
    ASSERT_EQ(::chmod(directory.path().c_str(), 0755), 0);
    if (::geteuid() == 0) { // root may read everything
        ASSERT_EQ(::seteuid(nobody), 0);
    }
    const auto seen = channels();
    ASSERT_EQ(::seteuid(::getuid()), 0);
    EXPECT_THAT(seen, ElementsAre("owned"));
}

TEST_F(ChannelOwnerTest, TheOwnerFileIsForAllToReadAndForItsOwnerToWrite)
{
    const mode_t before = ::umask(0777);
    const FileDescriptor owning = own();
    ::umask(before);
    ASSERT_TRUE(owning);
    EXPECT_EQ(fs::status(ownerFile).permissions(), fs::perms(0644));
    EXPECT_EQ(fs::file_size(ownerFile), 0U);
}

TEST_F(ChannelOwnerTest, AnOwnerWhoseFileIsJustBeingMadeIsNotGone)
{
    support::writeFile(ownerFile, "");
    ASSERT_EQ(::chmod(ownerFile.c_str(), 0200), 0); // until it is locked
    EXPECT_FALSE(isChannelOwnerGone(openDriver("amp").get(), owner));
    ASSERT_EQ(::chmod(ownerFile.c_str(), 0644), 0);
    EXPECT_TRUE(isChannelOwnerGone(openDriver("amp").get(), owner));
}

TEST_F(ChannelOwnerTest, ACopyOfAnOwnerFileIsReplaced)
{
    support::writeFile(ownerFile, "");
    const FileDescriptor owning = own();
    ASSERT_TRUE(owning);
    EXPECT_THAT(channels(), ElementsAre("owned"));
}

TEST_F(ChannelOwnerTest, NoOwnerFileIsMadeWhereThereCanBeNone)
{
    fs::create_directories(ownerFile / "in its place");
    EXPECT_FALSE(own());
    EXPECT_EQ(errno, EEXIST);
}

TEST_F(ChannelOwnerTest, ALineThatNamesNoOwnerIsNotUnderstood)
{
    support::writeFile(root / "amp/Tx/-/owned", "owner somebody\nsimple\n1\n");
    const auto reading = ChannelTree(root, {.time = unhurried}).read({{}}).value();
    EXPECT_THAT(reading.channels, IsEmpty());
    EXPECT_THAT(reading.problems,
                ElementsAre(ChannelProblem{"amp/Tx/-/owned", "it is neither simple nor histogram nor state"}));
}

} // namespace
} // namespace platform
