// SPDX-License-Identifier: Apache-2.0
// The launch configuration of the process: environment variables, with systemd's own names where it has them, so that a
// unit file sets everything.
#pragma once

#include "platform/linux/connection/ListeningSocket.h"
#include "platform/linux/log/LogThresholds.h"

#include <expected>
#include <filesystem>
#include <optional>
#include <string>

namespace platform {

struct LaunchConfiguration {
    // The exit status of a process that cannot run with its configuration (systemd's EX_CONFIG).
    static constexpr int exitStatus = 78;

    // The socket that the service manager passed; it is used in place of `socketPath`.
    std::optional<ListeningSocket> passedSocket = {};
    std::filesystem::path socketPath = {}; // empty with a passed socket
    std::filesystem::path runtimeDirectory = {}; // may be empty with a passed socket
    std::filesystem::path stateDirectory = {};
    std::filesystem::path logsDirectory = {}; // the root of the diagnostic files
    std::filesystem::path configurationDirectory = {}; // it and its files may be missing; defaults then hold
    std::filesystem::path channelRoot = {}; // empty if neither it nor a runtime directory is set
    std::filesystem::path soundRoot = "/proc/asound"; // the kernel's sound cards; not set from the environment
    LogThresholds logThresholds = {};

    // Reads the environment, and checks the directories and the limit of descriptors. The error is one line for a
    // person that names what is missing or cannot be used, and what to do. Call it once, before the first thread
    // starts, because it removes a passed socket from the environment.
    [[nodiscard]] static std::expected<LaunchConfiguration, std::string> fromEnvironment();
};

} // namespace platform
