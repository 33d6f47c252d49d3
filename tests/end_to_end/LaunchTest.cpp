// Starting: where the socket comes from, what is said when there is none, and when the service is ready.
#include "end_to_end/Kestod.h"
#include "end_to_end/WireClient.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>

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
    const support::TemporaryDirectory directory;
    const std::string path = directory.path() / "notify";
    const platform::FileDescriptor manager(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    path.copy(address.sun_path, sizeof address.sun_path - 1);
    ASSERT_EQ(::bind(manager.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    const timeval timeout{.tv_sec = patience.count(), .tv_usec = 0};
    ::setsockopt(manager.get(), SOL_SOCKET, SO_RCVTIMEO, &timeout, sizeof timeout);

    Kestod kestod({}, {{"NOTIFY_SOCKET", path}});
    kestod.start();
    std::string told(4096, '\0');
    const ssize_t count = ::recv(manager.get(), told.data(), told.size(), 0);
    ASSERT_GT(count, 0);
    told.resize(static_cast<std::size_t>(count));
    EXPECT_THAT(told, HasSubstr("READY=1"));
    WireClient(kestod.socketPath()).ask(GetAllReporters);
}

TEST(LaunchTest, BrokenConfigurationIsSaidAndTheServiceRunsWithoutIt)
{
    Kestod kestod({{"analytics.toml", "used = [\n"},
                   {"device.toml", "InternalBuild = maybe\n"},
                   {"preferences/com.quarn.kesto.toml", "= 1\n"}},
                  {{"KESTO_LOG", "default"}});
    kestod.start();
    WireClient client(kestod.socketPath());
    client.ask(Create, 1);
    client.call(Start, 1);
    client.ask(SendMessage, foundation::Dictionary{{"a", 1}}, 4, 1, foundation::Array{1});
    EXPECT_EQ(kestod.events("com.quarn.kesto.Playback.Start").size(), 1U);
    for (const std::string_view file : {"analytics.toml", "device.toml", "com.quarn.kesto.toml"})
        EXPECT_TRUE(kestod.waitForLog(file)) << file;
}

TEST(LaunchTest, ADatabaseThatIsNoneIsPutAsideAndAnotherBegun)
{
    Kestod kestod({}, {{"KESTO_LOG", "default"}});
    support::writeFile(kestod.directory() / "state/analytics.sqlite3", std::string(10'000, 'x'));
    kestod.start();
    WireClient(kestod.socketPath()).ask(SendMessage, foundation::Dictionary{{"a", 1}}, 4, 1, foundation::Value());
    EXPECT_EQ(kestod.events("com.quarn.kesto.Playback.Start").size(), 1U);
    EXPECT_THAT(kestod.log(), HasSubstr("analytics.sqlite3.corrupt-"));
}

} // namespace
} // namespace end_to_end
