// Where the service keeps its things, if nobody says otherwise: where the environment says, in systemd's names, as for
// the service itself; else in the user's own directories, if the user has a service; else in the system's.
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
