// SPDX-License-Identifier: Apache-2.0
// Every variable is read, even after a problem, and the first problem is kept: so the checks read as a list.
#include "platform/linux/LaunchConfiguration.h"

#include "platform/linux/connection/LinuxConnectionListener.h"
#include "platform/linux/process/Environment.h"

#include <cerrno>
#include <fcntl.h>
#include <fmt/format.h>
#include <string_view>
#include <sys/un.h>
#include <system_error>
#include <unistd.h>

namespace platform {
namespace {

namespace fs = std::filesystem;

// The first of the directories that the variable names; systemd passes all of a unit's directories.
fs::path directoryIn(const char* name)
{
    const std::string value = environment(name);
    return value.empty() ? fs::path() : fs::absolute(value.substr(0, value.find(':')));
}

// Reads one variable after the other and remembers the first problem.
class EnvironmentReader {
public:
    [[nodiscard]] const std::optional<std::string>& problem() const noexcept { return problem_; }

    std::optional<ListeningSocket> passedSocket()
    {
        auto socket = ListeningSocket::passed();
        if (socket)
            return std::move(*socket);
        fail("LISTEN_FDS: {}: correct the socket unit", description(socket.error()));
        return std::nullopt;
    }

    fs::path directory(const char* name, std::string_view purpose)
    {
        fs::path path = directoryIn(name);
        std::error_code error;
        const fs::file_status status = fs::status(path, error);
        if (path.empty())
            fail("{} is not set: set it to the directory for {}", name, purpose);
        else if (error && status.type() != fs::file_type::not_found)
            fail("{}: {} cannot be reached ({}): let the user of the service search the directories above it", name,
                 path.native(), error.message());
        else if (fs::exists(status) && !fs::is_directory(status))
            fail("{}: {} is not a directory: remove it, or name another", name, path.native());
        return path;
    }

    fs::path writableDirectory(const char* name, std::string_view purpose)
    {
        fs::path path = directory(name, purpose);
        if (::faccessat(AT_FDCWD, path.c_str(), W_OK | X_OK, AT_EACCESS) == 0)
            return path;
        if (errno == ENOENT)
            fail("{}: {} does not exist: create it, owned by the user of the service", name, path.native());
        else
            fail("{}: {} cannot be written to ({}): let the user of the service write there", name, path.native(),
                 std::generic_category().message(errno));
        return path;
    }

    fs::path socketPath(const char* name, const fs::path& runtimeDirectory)
    {
        const std::string serviceName = environment(name);
        fs::path path = runtimeDirectory / serviceName;
        if (serviceName.empty())
            fail("{} is not set: set it to the name of the socket in the runtime directory, or pass a socket", name);
        else if (serviceName.find('/') != std::string_view::npos || serviceName == "." || serviceName == "..")
            fail("{}: \"{}\" is not the name of a file: choose one without \"/\"", name, serviceName);
        else if (path.native().size() > longestSocketPath)
            fail("{}: {} is longer than the {} bytes that the path of a socket may have: choose a shorter name or "
                 "another runtime directory",
                 name, path.native(), longestSocketPath);
        return path;
    }

    LogThresholds logThresholds(const char* name)
    {
        auto thresholds = LogThresholds::parse(environment(name));
        if (thresholds)
            return std::move(*thresholds);
        fail("{}: {}", name, thresholds.error());
        return {};
    }

    void checkDescriptors()
    {
        constexpr std::size_t least = LinuxConnectionListener::leastDescriptors;
        if (const std::size_t most = LinuxConnectionListener::mostDescriptors(); most < least)
            fail("RLIMIT_NOFILE: the service needs {} descriptors and may have {}: raise LimitNOFILE of its unit, or "
                 "\"ulimit -n\"",
                 least, most);
    }

private:
    static constexpr std::size_t longestSocketPath = sizeof(sockaddr_un::sun_path) - 1;

    template <typename... Arguments>
    void fail(fmt::format_string<const Arguments&...> format, const Arguments&... arguments)
    {
        if (!problem_)
            problem_ = fmt::format(format, arguments...);
    }

    std::optional<std::string> problem_;
};

} // namespace

std::expected<LaunchConfiguration, std::string> LaunchConfiguration::fromEnvironment()
{
    EnvironmentReader reader;
    LaunchConfiguration configuration{.passedSocket = reader.passedSocket()};
    if (configuration.passedSocket) {
        configuration.runtimeDirectory = directoryIn("RUNTIME_DIRECTORY");
    } else {
        configuration.runtimeDirectory = reader.writableDirectory("RUNTIME_DIRECTORY", "the service's socket");
        configuration.socketPath = reader.socketPath("KESTO_SERVICE_NAME", configuration.runtimeDirectory);
    }
    configuration.stateDirectory = reader.writableDirectory("STATE_DIRECTORY", "the analytics store");
    configuration.logsDirectory = reader.writableDirectory("LOGS_DIRECTORY", "diagnostic files");
    configuration.configurationDirectory = reader.directory("CONFIGURATION_DIRECTORY", "the configuration");
    configuration.logThresholds = reader.logThresholds("KESTO_LOG");
    reader.checkDescriptors();

    if (const std::string channelRoot = environment("KESTO_CHANNEL_ROOT"); !channelRoot.empty())
        configuration.channelRoot = fs::absolute(channelRoot);
    else if (!configuration.runtimeDirectory.empty())
        configuration.channelRoot = configuration.runtimeDirectory / "channels";

    if (reader.problem())
        return std::unexpected(*reader.problem());
    return configuration;
}

} // namespace platform
