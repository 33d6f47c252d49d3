// SPDX-License-Identifier: Apache-2.0
// The default directories of the service. The environment comes first, with systemd's names, as for the service itself;
// then the user's own directories, if the user has a service; then the system's.
#pragma once

#include <filesystem>

// $STATE_DIRECTORY/analytics.sqlite3
[[nodiscard]] std::filesystem::path usualDatabase();
// $STATE_DIRECTORY/analytics.ledger
[[nodiscard]] std::filesystem::path usualLedger();
// $KESTO_SOCKET, or that of the service in $RUNTIME_DIRECTORY
[[nodiscard]] std::filesystem::path usualSocket();
// $CONFIGURATION_DIRECTORY
[[nodiscard]] std::filesystem::path usualConfigurationDirectory();
// $LOGS_DIRECTORY
[[nodiscard]] std::filesystem::path usualLogsDirectory();
// $RUNTIME_DIRECTORY
[[nodiscard]] std::filesystem::path usualRuntimeDirectory();
