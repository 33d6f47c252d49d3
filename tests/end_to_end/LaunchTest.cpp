// SPDX-License-Identifier: Apache-2.0
// Starting: the source of the socket, the error without one, and the notification of readiness.
#include "end_to_end/Kestod.h"
#include "end_to_end/ServiceManager.h"
#include "end_to_end/WireClient.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <unistd.h>

namespace end_to_end {
namespace {

using testing::HasSubstr;
using testing::Not;

constexpr int cannotRun = 78;

struct BadLaunch {
    std::string name;
    Kestod::Environment environment;
    std::string reason;

    friend void PrintTo(const BadLaunch& launch, std::ostream* stream) { *stream << launch.reason; }
};

class BadLaunchTest : public testing::TestWithParam<BadLaunch> { };

TEST_P(BadLaunchTest, SaysWhyInOneLineAndExitsWithStatus78)
{
    Kestod kestod({}, GetParam().environment);
    kestod.start();
    EXPECT_EQ(kestod.exitStatus(), cannotRun);
    const std::string log = kestod.log();
    EXPECT_THAT(log, HasSubstr(GetParam().reason));
    EXPECT_EQ(std::ranges::count(log, '\n'), 1) << log;
}

INSTANTIATE_TEST_SUITE_P(
    OfEveryKind, BadLaunchTest,
    testing::Values(
        BadLaunch{"NoStateDirectory", {{"STATE_DIRECTORY", ""}}, "STATE_DIRECTORY"},
        BadLaunch{"NoRuntimeDirectory", {{"RUNTIME_DIRECTORY", ""}}, "RUNTIME_DIRECTORY"},
        BadLaunch{"NoLogsDirectory", {{"LOGS_DIRECTORY", ""}}, "LOGS_DIRECTORY"},
        BadLaunch{"AStateDirectoryThatIsMissing", {{"STATE_DIRECTORY", "/nonexistent/kesto"}}, "/nonexistent/kesto"},
        BadLaunch{"AServiceNameWithASlash", {{"KESTO_SERVICE_NAME", "a/b"}}, "KESTO_SERVICE_NAME"},
        BadLaunch{"ALogLevelThatDoesNotExist", {{"KESTO_LOG", "loud"}}, "KESTO_LOG"}),
    [](const auto& input) { return input.param.name; });

// What the program prints for these arguments, and its exit status.
std::pair<std::string, int> answerTo(const std::string& arguments)
{
    FILE* const output = ::popen((std::string(Kestod::program()) + " " + arguments + " 2>&1").c_str(), "r");
    std::string text;
    for (int character = std::fgetc(output); character != EOF; character = std::fgetc(output))
        text += static_cast<char>(character);
    return {text, WEXITSTATUS(::pclose(output))};
}

TEST(LaunchTest, OnItsCommandLineItOnlySaysWhoItIs)
{
    EXPECT_THAT(answerTo("--version"), testing::Pair(testing::StartsWith("kestod "), 0));
    const auto [help, status] = answerTo("--help");
    EXPECT_EQ(status, 0);
    EXPECT_THAT(help, testing::StartsWith("Usage: kestod [--help | --version]\n"));
    for (const char* variable : {"RUNTIME_DIRECTORY", "STATE_DIRECTORY", "LOGS_DIRECTORY", "CONFIGURATION_DIRECTORY",
                                 "KESTO_SERVICE_NAME", "KESTO_LOG"})
        EXPECT_THAT(help, HasSubstr(variable));
    EXPECT_EQ(answerTo("--socket /run"),
              (std::pair<std::string, int>("kestod: it takes no argument but --help and --version, not --socket; its "
                                           "configuration is in its environment\n",
                                           cannotRun)));
}

TEST(LaunchTest, WithTooFewDescriptorsForItselfItSaysSoAndDoesNotStart)
{
    Kestod kestod;
    kestod.limitDescriptors(63);
    kestod.start();
    EXPECT_EQ(kestod.exitStatus(), cannotRun);
    EXPECT_EQ(kestod.log(),
              "kestod: RLIMIT_NOFILE: the service needs 64 descriptors and may have 63: raise LimitNOFILE "
              "of its unit, or \"ulimit -n\"\n");
}

TEST(LaunchTest, ASecondServiceAtTheSameSocketGivesWay)
{
    Kestod first;
    first.start();
    WireClient(first.socketPath()).ask(GetAllReporters);
    Kestod second({}, {{"RUNTIME_DIRECTORY", first.directory() / "run"}});
    second.start();
    EXPECT_EQ(second.exitStatus(), cannotRun);
    EXPECT_THAT(second.log(), HasSubstr("another process listens"));
    EXPECT_EQ(WireClient(first.socketPath()).ask(GetAllReporters),
              (foundation::Array{1, foundation::Value(), foundation::Array{}}));
}

TEST(LaunchTest, TellsTheServiceManagerWhenItIsReady)
{
    Notifications manager;
    Kestod kestod({}, {{"NOTIFY_SOCKET", manager.path}});
    kestod.start();
    EXPECT_THAT(manager.next(), HasSubstr("READY=1"));
    WireClient(kestod.socketPath()).ask(GetAllReporters);
}

class PassedSocketTest : public testing::Test {
protected:
    void SetUp() override
    {
        ASSERT_EQ(::listen(socket.get(), SOMAXCONN), 0);
        kestod.start({.listeningSocket = socket.get()});
    }

    Kestod kestod{{}, {{"RUNTIME_DIRECTORY", ""}, {"KESTO_SERVICE_NAME", ""}}};
    const std::filesystem::path path = kestod.directory() / "run" / "passed";
    const platform::FileDescriptor socket = socketBoundTo(path, SOCK_STREAM);
};

TEST_F(PassedSocketTest, NeedsNoNameAndNoRuntimeDirectory)
{
    EXPECT_EQ(WireClient(path).ask(GetAllReporters), (foundation::Array{1, foundation::Value(), foundation::Array{}}));
}

TEST_F(PassedSocketTest, WithoutARuntimeDirectoryPreferencesAreReportedAllTheSame)
{
    WireClient(path).ask(GetAllReporters); // its notifications are registered
    std::filesystem::create_directory(kestod.directory() / "configuration/preferences");
    support::replaceFile(kestod.directory() / "configuration/preferences/com.quarn.kesto.toml",
                         "device_name = \"a\"\n");
    EXPECT_TRUE(kestod.waitForLog(R"(defaults {"device_name":"a",)"));
}

TEST(LaunchTest, GoesOnWhenItsLogHasNoReaderAnyMore)
{
    int ends[2] = {};
    ASSERT_EQ(::pipe2(ends, O_CLOEXEC), 0);
    platform::FileDescriptor reader(ends[0]);
    platform::FileDescriptor writer(ends[1]);
    Kestod kestod;
    kestod.start({.standardError = writer.get()});
    writer = {};
    WireClient client(kestod.socketPath());
    client.ask(Create, 1);
    char logged = 0;
    EXPECT_EQ(::read(reader.get(), &logged, 1), 1);
    reader = {};
    client.ask(Create, 2);
    EXPECT_EQ(client.ask(GetAllReporters), (foundation::Array{3, foundation::Value(), foundation::Array{1, 2}}));
}

TEST(LaunchTest, BrokenConfigurationIsSaidAndTheServiceRunsWithoutIt)
{
    Kestod kestod({{"analytics.toml", "used = [\n"},
                   {"device.toml", "InternalBuild = maybe\n"},
                   {"limits.toml", "memory_mb = 0\n"},
                   {"preferences/com.quarn.kesto.toml", "= 1\n"}},
                  {{"KESTO_LOG", "default"}});
    kestod.start();
    WireClient client(kestod.socketPath());
    client.ask(Create, 1);
    client.call(Start, 1);
    client.ask(SendMessage, foundation::Dictionary{{"a", 1}}, 4, 1, foundation::Array{1});
    EXPECT_EQ(kestod.events("com.quarn.kesto.Playback.Start").size(), 1U);
    for (const std::string_view file : {"analytics.toml", "device.toml", "limits.toml", "com.quarn.kesto.toml"})
        EXPECT_TRUE(kestod.waitForLog(file)) << file;
}

TEST(LaunchTest, AFileThatIsNotADatabaseIsPutAsideAndAnotherBegun)
{
    Kestod kestod({}, {{"KESTO_LOG", "default"}});
    support::writeFile(kestod.directory() / "state/analytics.sqlite3", std::string(10'000, 'x'));
    kestod.start();
    WireClient(kestod.socketPath()).ask(SendMessage, foundation::Dictionary{{"a", 1}}, 4, 1, foundation::Value());
    EXPECT_EQ(kestod.events("com.quarn.kesto.Playback.Start").size(), 1U);
    EXPECT_TRUE(kestod.waitForLog("analytics.sqlite3.corrupt-"));
}

TEST(LaunchTest, RemovesTheResultsThatAKilledServiceHadBegunToWrite)
{
    Kestod kestod;
    const auto folder = kestod.directory() / "logs/Audio/Traces";
    std::filesystem::create_directories(folder);
    support::writeFile(folder / ".kestod-0123456789abcdef.tmp", "{\"project\":");
    support::writeFile(folder / "tracing_results.qdj", "{}");
    kestod.start();
    WireClient(kestod.socketPath()).ask(GetAllReporters);
    EXPECT_FALSE(std::filesystem::exists(folder / ".kestod-0123456789abcdef.tmp"));
    EXPECT_TRUE(std::filesystem::exists(folder / "tracing_results.qdj"));
}

} // namespace
} // namespace end_to_end
