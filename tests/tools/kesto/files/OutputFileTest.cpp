// SPDX-License-Identifier: Apache-2.0
// Files that a user names: what is at the place decides whether it is replaced or written into.
#include "kesto/files/OutputFile.h"
#include "platform/linux/files/FileDescriptor.h"
#include "support/TemporaryDirectory.h"

#include <array>
#include <csignal>
#include <fcntl.h>
#include <filesystem>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <stdexcept>
#include <string>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

namespace kesto_tool {
namespace {

namespace fs = std::filesystem;
using testing::ElementsAre;

class OutputFile : public testing::Test {
protected:
    [[nodiscard]] std::string errorOf(const fs::path& path, const std::string& text) const
    {
        try {
            writeWholeOutput(path, text);
        } catch (const std::runtime_error& error) {
            return error.what();
        }
        return {};
    }

    support::TemporaryDirectory directory_;
    fs::path file_ = directory_ / "file";
    fs::path link_ = directory_ / "link";
};

TEST_F(OutputFile, IsMadeAsTheUmaskAllows)
{
    const mode_t before = ::umask(027);
    writeWholeOutput(file_, "text");
    EXPECT_EQ(::umask(before), 027U) << "and the umask stays";
    EXPECT_EQ(support::readFile(file_), "text");
    EXPECT_EQ(support::permissionsOf(file_), 0640U);
}

TEST_F(OutputFile, ReplacesAFileWithItsPermissions)
{
    support::writeFile(file_, "old");
    fs::permissions(file_, fs::perms::owner_read | fs::perms::owner_write);
    fs::create_hard_link(file_, directory_ / "old");
    writeWholeOutput(file_, "new");
    EXPECT_EQ(support::readFile(file_), "new");
    EXPECT_EQ(support::permissionsOf(file_), 0600U);
    EXPECT_EQ(support::readFile(directory_ / "old"), "old") << "nobody saw a part";
    EXPECT_THAT(support::namesIn(directory_.path()), ElementsAre("file", "old"));
}

TEST_F(OutputFile, ReplacesTheFileBehindALink)
{
    support::writeFile(file_, "old");
    fs::create_symlink("file", link_);
    writeWholeOutput(link_, "new");
    EXPECT_EQ(fs::read_symlink(link_), "file");
    EXPECT_EQ(support::readFile(file_), "new");
}

TEST_F(OutputFile, IsMadeWhereLinksLeadTo)
{
    fs::create_directory(directory_ / "folder");
    fs::create_symlink("folder/second", link_);
    fs::create_symlink(file_, directory_ / "folder/second");
    writeWholeOutput(link_, "text");
    EXPECT_EQ(fs::read_symlink(link_), "folder/second");
    EXPECT_EQ(fs::read_symlink(directory_ / "folder/second"), file_);
    EXPECT_TRUE(fs::is_regular_file(fs::symlink_status(file_)));
    EXPECT_EQ(support::readFile(file_), "text");
}

TEST_F(OutputFile, IsNotMadeWhereLinksLeadInACircle)
{
    fs::create_symlink("link", link_);
    EXPECT_EQ(errorOf(link_, "text"), "cannot write " + link_.native() + ": Too many levels of symbolic links");
    EXPECT_TRUE(fs::is_symlink(link_));
}

TEST_F(OutputFile, IsWrittenIntoAPipe)
{
    ASSERT_EQ(::mkfifo(file_.c_str(), 0600), 0);
    const platform::FileDescriptor reader(::open(file_.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC));
    ASSERT_TRUE(reader);
    writeWholeOutput(file_, "text");
    std::array<char, 8> read{};
    EXPECT_EQ(::read(reader.get(), read.data(), read.size()), 4);
    EXPECT_STREQ(read.data(), "text");
    EXPECT_TRUE(fs::is_fifo(file_));
}

TEST_F(OutputFile, IsNoDirectory)
{
    EXPECT_EQ(errorOf(directory_.path(), "text"), "cannot write " + directory_.path().native() + ": Is a directory");
}

TEST_F(OutputFile, LeavesNothingBehindThatCannotBeWritten)
{
    support::writeFile(file_, "old");
    rlimit before{};
    ::getrlimit(RLIMIT_FSIZE, &before);
    const auto handler = std::signal(SIGXFSZ, SIG_IGN);
    const rlimit small{.rlim_cur = 3, .rlim_max = before.rlim_max};
    ::setrlimit(RLIMIT_FSIZE, &small);
    const std::string error = errorOf(file_, "longer");
    const std::string errorOfNew = errorOf(directory_ / "new", "longer");
    ::setrlimit(RLIMIT_FSIZE, &before);
    std::signal(SIGXFSZ, handler);
    EXPECT_EQ(error, "cannot write " + file_.native() + ": File too large");
    EXPECT_EQ(errorOfNew, "cannot write " + (directory_ / "new").native() + ": File too large");
    EXPECT_THAT(support::namesIn(directory_.path()), ElementsAre("file"));
    EXPECT_EQ(support::readFile(file_), "old");
}

} // namespace
} // namespace kesto_tool
