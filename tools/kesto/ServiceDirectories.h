// The default directories of the service: those of the environment, in systemd's names, as for the service itself; else
// the user's own directories, if the user has a service; else the system's.
#pragma once

#include <filesystem>

// $STATE_DIRECTORY/analytics.sqlite3
[[nodiscard]] std::filesystem::path usualDatabase();
// $CONFIGURATION_DIRECTORY
[[nodiscard]] std::filesystem::path usualConfigurationDirectory();
// $LOGS_DIRECTORY
[[nodiscard]] std::filesystem::path usualLogsDirectory();
// $RUNTIME_DIRECTORY
[[nodiscard]] std::filesystem::path usualRuntimeDirectory();
