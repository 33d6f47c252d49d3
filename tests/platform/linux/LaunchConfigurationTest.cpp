// SPDX-License-Identifier: Apache-2.0
// Every wrong configuration has its own error line; and the exchange with the service manager.
#include "platform/linux/LaunchConfiguration.h"

#include "platform/linux/process/ServiceManager.h"
#include "support/TemporaryDirectory.h"

#include <array>
#include <cstdlib>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

namespace platform {
namespace {

using testing::HasSubstr;

namespace fs = std::filesystem;

constexpr std::array variables = {"RUNTIME_DIRECTORY",       "STATE_DIRECTORY",    "LOGS_DIRECTORY",
                                  "CONFIGURATION_DIRECTORY", "KESTO_SERVICE_NAME", "KESTO_LOG",
                                  "KESTO_CHANNEL_ROOT",      "LISTEN_PID",         "LISTEN_FDS",
                                  "LISTEN_FDNAMES",          "NOTIFY_SOCKET"};

class LaunchConfigurationTest : public testing::Test {
protected:
    void SetUp() override
    {
        clear();
        for (const char* name : {"run", "state", "logs", "etc"})
            fs::create_directory(root / name);
        set("RUNTIME_DIRECTORY", root / "run");
        set("STATE_DIRECTORY", root / "state");
        set("LOGS_DIRECTORY", root / "logs");
        set("CONFIGURATION_DIRECTORY", root / "etc");
        set("KESTO_SERVICE_NAME", "com.quarn.kesto");
    }
    void TearDown() override { clear(); }

    static void clear()
    {
        for (const char* name : variables)
            ::unsetenv(name);
    }
    static void set(const char* name, const std::string& value) { ::setenv(name, value.c_str(), 1); }

    static std::string problem()
    {
        const auto configuration = LaunchConfiguration::fromEnvironment();
        return configuration ? "" : configuration.error();
    }

    support::TemporaryDirectory directory;
    const fs::path root = directory.path();
};

TEST_F(LaunchConfigurationTest, ReadsTheEnvironment)
{
    set("KESTO_LOG", "info");
    const auto configuration = LaunchConfiguration::fromEnvironment();
    ASSERT_TRUE(configuration) << configuration.error();
    EXPECT_FALSE(configuration->passedSocket);
    EXPECT_EQ(configuration->runtimeDirectory, root / "run");
    EXPECT_EQ(configuration->socketPath, root / "run" / "com.quarn.kesto");
    EXPECT_EQ(configuration->stateDirectory, root / "state");
    EXPECT_EQ(configuration->logsDirectory, root / "logs");
    EXPECT_EQ(configuration->configurationDirectory, root / "etc");
    EXPECT_EQ(configuration->channelRoot, root / "run" / "channels");
    EXPECT_EQ(configuration->logThresholds.threshold("kerr"), LogLevel::Info);
}

TEST_F(LaunchConfigurationTest, TheChannelRootMayBeElsewhere)
{
    set("KESTO_CHANNEL_ROOT", "/sys/kesto");
    EXPECT_EQ(LaunchConfiguration::fromEnvironment()->channelRoot, "/sys/kesto");
}

TEST_F(LaunchConfigurationTest, OfSeveralDirectoriesTheFirstCounts)
{
    set("STATE_DIRECTORY", (root / "state").string() + ":" + (root / "nowhere").string());
    EXPECT_EQ(LaunchConfiguration::fromEnvironment()->stateDirectory, root / "state");
}

TEST_F(LaunchConfigurationTest, ADirectoryMayBeRelative)
{
    const fs::path before = fs::current_path();
    fs::current_path(root);
    set("STATE_DIRECTORY", "state");
    EXPECT_EQ(LaunchConfiguration::fromEnvironment()->stateDirectory, fs::current_path() / "state");
    fs::current_path(before);
}

TEST_F(LaunchConfigurationTest, TheConfigurationDirectoryNeedNotBeThere)
{
    set("CONFIGURATION_DIRECTORY", root / "later");
    EXPECT_EQ(LaunchConfiguration::fromEnvironment()->configurationDirectory, root / "later");
}

TEST_F(LaunchConfigurationTest, SaysWhichVariableIsMissing)
{
    for (const auto& [name, line] :
         {std::pair("RUNTIME_DIRECTORY",
                    "RUNTIME_DIRECTORY is not set: set it to the directory for the service's socket"),
          std::pair("KESTO_SERVICE_NAME",
                    "KESTO_SERVICE_NAME is not set: set it to the name of the socket in the runtime directory, or pass "
                    "a socket"),
          std::pair("STATE_DIRECTORY", "STATE_DIRECTORY is not set: set it to the directory for the analytics store"),
          std::pair("LOGS_DIRECTORY", "LOGS_DIRECTORY is not set: set it to the directory for diagnostic files"),
          std::pair("CONFIGURATION_DIRECTORY",
                    "CONFIGURATION_DIRECTORY is not set: set it to the directory for the configuration")}) {
        const std::string before = std::getenv(name);
        ::unsetenv(name);
        EXPECT_EQ(problem(), line);
        set(name, "");
        EXPECT_EQ(problem(), line);
        set(name, before);
    }
    EXPECT_EQ(problem(), "");
}

TEST_F(LaunchConfigurationTest, SaysWhichDirectoryDoesNotExist)
{
    for (const char* name : {"RUNTIME_DIRECTORY", "STATE_DIRECTORY", "LOGS_DIRECTORY"}) {
        const std::string before = std::getenv(name);
        set(name, root / "nowhere");
        EXPECT_EQ(problem(),
                  std::string(name) + ": " + (root / "nowhere").string()
                      + " does not exist: create it, owned by the user of the service");
        set(name, before);
    }
}

TEST_F(LaunchConfigurationTest, SaysWhatIsNotADirectory)
{
    support::writeFile(root / "file", "");
    for (const char* name : {"RUNTIME_DIRECTORY", "STATE_DIRECTORY", "LOGS_DIRECTORY", "CONFIGURATION_DIRECTORY"}) {
        const std::string before = std::getenv(name);
        set(name, root / "file");
        EXPECT_EQ(problem(),
                  std::string(name) + ": " + (root / "file").string()
                      + " is not a directory: remove it, or name another");
        set(name, before);
    }
}

TEST_F(LaunchConfigurationTest, SaysWhichDirectoryCannotBeReached)
{
    fs::create_directory_symlink("loop", root / "loop");
    for (const char* name : {"RUNTIME_DIRECTORY", "STATE_DIRECTORY", "LOGS_DIRECTORY", "CONFIGURATION_DIRECTORY"}) {
        const std::string before = std::getenv(name);
        set(name, root / "loop/below");
        EXPECT_EQ(problem(),
                  std::string(name) + ": " + (root / "loop/below").string()
                      + " cannot be reached (Too many levels of symbolic links): let the user of the service search "
                        "the directories above it");
        set(name, before);
    }
}

TEST_F(LaunchConfigurationTest, SaysWhichDirectoryCannotBeWrittenTo)
{
    // Runs as a user that does not own the directory; a privileged test changes its user first.
    ::chmod(root.c_str(), 0755);
    ::chmod((root / "state").c_str(), 0555);
    const pid_t child = ::fork();
    if (child == 0) {
        if (::getuid() == 0 && (::setgid(65534) != 0 || ::setuid(65534) != 0))
            ::_exit(2);
        set("RUNTIME_DIRECTORY", "/tmp");
        const bool isAsExpected = problem()
            == "STATE_DIRECTORY: " + (root / "state").string()
                + " cannot be written to (Permission denied): let the user of the service write there";
        ::_exit(isAsExpected ? 0 : 1);
    }
    int status = 0;
    ASSERT_EQ(::waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0);
}

TEST_F(LaunchConfigurationTest, TheServiceNameIsTheNameOfAFile)
{
    for (const std::string name : {"../socket", "a/b", "/run/socket", ".", ".."}) {
        set("KESTO_SERVICE_NAME", name);
        EXPECT_EQ(problem(),
                  "KESTO_SERVICE_NAME: \"" + name + "\" is not the name of a file: choose one without \"/\"");
    }
}

TEST_F(LaunchConfigurationTest, ThePathOfTheSocketMustFitAnAddress)
{
    constexpr std::size_t longest = 107;
    const std::size_t room = longest - (root / "run").native().size() - 1;
    set("KESTO_SERVICE_NAME", std::string(room, 'x'));
    EXPECT_EQ(problem(), "");
    set("KESTO_SERVICE_NAME", std::string(room + 1, 'x'));
    EXPECT_THAT(problem(),
                HasSubstr("is longer than the 107 bytes that the path of a socket may have: choose a shorter "
                          "name or another runtime directory"));
}

TEST_F(LaunchConfigurationTest, SaysWhatIsWrongWithTheLogThresholds)
{
    set("KESTO_LOG", "info,loud");
    EXPECT_EQ(problem(),
              "KESTO_LOG: \"loud\" is neither a level (error, default, info or debug) nor of the form tag=level");
}

TEST_F(LaunchConfigurationTest, OnlyTheFirstProblemIsReported)
{
    ::unsetenv("STATE_DIRECTORY");
    set("KESTO_LOG", "loud");
    EXPECT_THAT(problem(), testing::StartsWith("STATE_DIRECTORY"));
    EXPECT_EQ(problem().find('\n'), std::string::npos);
}

// --- Socket activation: the descriptors begin at 3 and are meant for one process, so each test is one.

template <typename Test> int statusOfChild(Test test)
{
    const pid_t child = ::fork();
    if (child == 0) {
        ::setenv("LISTEN_PID", std::to_string(::getpid()).c_str(), 1);
        ::_exit(test());
    }
    int status = 0;
    EXPECT_EQ(::waitpid(child, &status, 0), child);
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

int passSocket(int type, bool listens, const fs::path& path)
{
    const int socket = ::socket(AF_UNIX, type, 0);
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    path.native().copy(address.sun_path, sizeof address.sun_path - 1);
    if (::bind(socket, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0)
        return -1;
    if (listens && ::listen(socket, 5) != 0)
        return -1;
    if (socket != 3 && ::dup2(socket, 3) != 3)
        return -1;
    ::setenv("LISTEN_FDS", "1", 1);
    return 0;
}

TEST_F(LaunchConfigurationTest, APassedSocketComesFirstAndNeedsNeitherNameNorRuntimeDirectory)
{
    EXPECT_EQ(statusOfChild([&] {
                  if (passSocket(SOCK_STREAM, true, root / "run" / "passed") != 0)
                      return 10;
                  ::unsetenv("RUNTIME_DIRECTORY");
                  ::unsetenv("KESTO_SERVICE_NAME");
                  const auto configuration = LaunchConfiguration::fromEnvironment();
                  if (!configuration)
                      return 11;
                  if (!configuration->passedSocket || configuration->passedSocket->descriptor() != 3)
                      return 12;
                  if (!configuration->socketPath.empty() || !configuration->channelRoot.empty())
                      return 13;
                  return std::getenv("LISTEN_FDS") == nullptr ? 0 : 14;
              }),
              0);
}

TEST_F(LaunchConfigurationTest, APassedSocketOfAnotherKindIsRefused)
{
    const auto isRefused = [&](int type, bool listens, const char* name) {
        return statusOfChild([&] {
            if (passSocket(type, listens, root / "run" / name) != 0)
                return 10;
            return problem()
                    == "LISTEN_FDS: socket activation passed something other than one listening Unix stream socket: "
                       "correct the socket unit"
                ? 0
                : 11;
        });
    };
    EXPECT_EQ(isRefused(SOCK_STREAM, false, "not-listening"), 0);
    EXPECT_EQ(isRefused(SOCK_DGRAM, false, "datagrams"), 0);
}

// --- Readiness

class ServiceManagerTest : public LaunchConfigurationTest {
protected:
    std::string received()
    {
        std::string bytes(1000, '\0');
        const ssize_t length = ::recv(manager.get(), bytes.data(), bytes.size(), MSG_DONTWAIT);
        bytes.resize(length < 0 ? 0 : static_cast<std::size_t>(length));
        return bytes;
    }
    void listen()
    {
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        (root / "notify").native().copy(address.sun_path, sizeof address.sun_path - 1);
        manager = FileDescriptor(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
        ASSERT_EQ(::bind(manager.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
        set("NOTIFY_SOCKET", root / "notify");
    }

    FileDescriptor manager;
};

TEST_F(ServiceManagerTest, IsNotifiedThatTheServiceIsReady)
{
    listen();
    notifyReady("accepting connections");
    EXPECT_EQ(received(), "READY=1\nSTATUS=accepting connections");
}

TEST_F(ServiceManagerTest, IsNotifiedEachTime)
{
    listen();
    notifyReady("accepting connections");
    EXPECT_EQ(received(), "READY=1\nSTATUS=accepting connections");
    notifyReady("accepting connections again");
    EXPECT_EQ(received(), "READY=1\nSTATUS=accepting connections again");
}

TEST_F(ServiceManagerTest, ShowsTheLastStatus)
{
    EXPECT_FALSE(hasServiceManager());
    listen();
    EXPECT_TRUE(hasServiceManager());
    notifyStatus("3 connections, 100% kept");
    EXPECT_EQ(received(), "STATUS=3 connections, 100% kept");
}

TEST_F(ServiceManagerTest, WithoutOneNothingHappens)
{
    notifyStatus("3 connections");
    notifyReady("accepting connections");
    set("NOTIFY_SOCKET", root / "nobody");
    notifyReady("accepting connections");
}

} // namespace
} // namespace platform
