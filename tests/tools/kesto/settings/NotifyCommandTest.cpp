// SPDX-License-Identifier: Apache-2.0
// Posting notifications, up to the session that gets them.
#include "end_to_end/Kestod.h"
#include "end_to_end/WireClient.h"
#include "tools/kesto/Tool.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <limits>
#include <sys/stat.h>

namespace kesto_tool {
namespace {

using testing::HasSubstr;
using testing::IsEmpty;

class NotifyCommand : public testing::Test {
protected:
    const support::TemporaryDirectory directory;
    const std::filesystem::path file = directory.path() / "run/notifications/com.quarn.halden.ringerstate";
    Tool tool{directory.path()};
};

TEST_F(NotifyCommand, WritesTheStateForAllToRead)
{
    ::umask(0077);
    EXPECT_EQ(tool.print({"notify", "com.quarn.halden.ringerstate", "1"}), "");
    ::umask(0022);
    EXPECT_EQ(support::readFile(file), "1\n");
    EXPECT_EQ(std::filesystem::status(file).permissions(), std::filesystem::perms(0644));
    EXPECT_EQ(std::filesystem::status(file.parent_path()).permissions(), std::filesystem::perms(0755));
    EXPECT_EQ(tool.print({"notify", "com.quarn.halden.ringerstate", "18446744073709551615"}), "");
    EXPECT_EQ(support::readFile(file), "18446744073709551615\n");
    EXPECT_EQ(support::namesIn(file.parent_path()).size(), 1U) << "and nothing is left behind";
}

TEST_F(NotifyCommand, KeepsTheStateWhenItIsGivenNone)
{
    EXPECT_EQ(tool.print({"notify", "name", "5"}), "");
    EXPECT_EQ(tool.print({"notify", "name"}), "");
    EXPECT_EQ(support::readFile(file.parent_path() / "name"), "5\n");
    EXPECT_EQ(tool.print({"notify", "other"}), "");
    EXPECT_EQ(support::readFile(file.parent_path() / "other"), "");
}

TEST_F(NotifyCommand, FindsTheDirectoryThatIsNamed)
{
    const auto other = directory.path() / "other";
    std::filesystem::create_directory(other);
    EXPECT_EQ(tool.print({"notify", "--directory", other, "name", "1"}), "");
    EXPECT_EQ(support::readFile(other / "notifications/name"), "1\n");
    tool.setVariable("RUNTIME_DIRECTORY");
    tool.setVariable("XDG_RUNTIME_DIR=" + directory.path().native());
    std::filesystem::create_directory(directory.path() / "kesto");
    EXPECT_EQ(tool.print({"notify", "name", "2"}), "");
    EXPECT_EQ(support::readFile(directory.path() / "kesto/notifications/name"), "2\n");
}

TEST_F(NotifyCommand, SaysThatTheServiceIsMissing)
{
    tool.setVariable("RUNTIME_DIRECTORY=/nonexistent/kesto");
    const Finished finished = tool.run({"notify", "name", "1"});
    EXPECT_EQ(finished.status, 1);
    EXPECT_THAT(finished.errors, HasSubstr("the runtime directory /nonexistent/kesto does not exist"));
}

TEST_F(NotifyCommand, SaysWhenItMayNot)
{
    std::filesystem::create_directory(file.parent_path());
    support::writeFile(file, "1");
    tool.giveUpRights();
    for (const Tool::Arguments& state : {Tool::Arguments{"0"}, Tool::Arguments{}}) {
        Tool::Arguments arguments{"notify", "com.quarn.halden.ringerstate"};
        arguments.insert(arguments.end(), state.begin(), state.end());
        if (::geteuid() != 0)
            std::filesystem::permissions(state.empty() ? file : file.parent_path(), std::filesystem::perms(0555));
        const Finished finished = tool.run(arguments);
        EXPECT_EQ(finished.status, 1);
        EXPECT_EQ(finished.errors, "kesto: cannot write " + file.native() + ": Permission denied\n");
    }
    EXPECT_EQ(support::readFile(file), "1");
}

TEST(NotifyRoad, ASwitchReachesTheSessionEachTime)
{
    end_to_end::Kestod kestod;
    kestod.start();
    const Tool tool(kestod.directory());
    end_to_end::WireClient client(kestod.socketPath());
    client.ask(end_to_end::Create, 1);
    const auto told = [&](std::size_t times) {
        return end_to_end::waitUntil(
            [&] { return kestod.countInLog("sending message for session owned by 1") == times; });
    };
    EXPECT_EQ(tool.print({"notify", "com.quarn.halden.ringerstate", "1"}), "");
    ASSERT_TRUE(told(1));
    EXPECT_TRUE(kestod.waitForLog(R"(defaults {"ringerstate":true)"));
    EXPECT_EQ(tool.print({"notify", "com.quarn.halden.ringerstate", "2"}), "");
    ASSERT_TRUE(told(2));
    EXPECT_TRUE(kestod.waitForLog(R"(defaults {"ringerstate":false)"));
    EXPECT_EQ(tool.print({"notify", "com.quarn.halden.ringerstate"}), "");
    EXPECT_TRUE(told(3)) << "the same again";
}

} // namespace
} // namespace kesto_tool
