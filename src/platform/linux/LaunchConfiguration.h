// What the process was launched with: all of it environment variables, in systemd's own names where it has
// them, so that a unit file sets everything.
#pragma once

#include "platform/linux/connection/ListeningSocket.h"
#include "platform/linux/log/LogThresholds.h"

#include <expected>
#include <filesystem>
#include <optional>
#include <string>

namespace platform {

struct LaunchConfiguration {
    // The exit status of a process that cannot run with what it was given (EX_CONFIG, as systemd knows it).
    static constexpr int exitStatus = 78;

    // The socket that the service manager passed; it comes before `socketPath`.
    std::optional<ListeningSocket> passedSocket = {};
    std::filesystem::path socketPath = {}; // empty with a passed socket
    std::filesystem::path runtimeDirectory = {}; // may be empty with a passed socket
    std::filesystem::path stateDirectory = {};
    std::filesystem::path logsDirectory = {}; // the root of the diagnostic files
    std::filesystem::path configurationDirectory = {}; // need not be there; what it lacks has its default
    std::filesystem::path channelRoot = {}; // empty when neither it nor a runtime directory was given
    std::filesystem::path soundRoot = "/proc/asound"; // what the kernel tells about sound cards; never set from outside
    LogThresholds logThresholds = {};

    // Reads the environment and looks at the directories. The error is one line for a person: what is missing or
    // cannot be used, and what to do. To be called once, before the first thread is started, since a passed
    // socket is taken out of the environment.
    [[nodiscard]] static std::expected<LaunchConfiguration, std::string> fromEnvironment();
};

} // namespace platform
