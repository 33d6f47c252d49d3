// SPDX-License-Identifier: Apache-2.0
// The tables of the fleet, as SQL that makes them.
#pragma once

#include "fleet-database/ClickHouseServers.h"

#include <string>
#include <string_view>

namespace kesto_ingest {

using fleet_database::tablesEdition;

// Statements that end with ";". Without a cluster they make tables for one server; with one they make replicated tables
// on each server of the cluster, with a distributed table above each.
[[nodiscard]] std::string tablesSql(std::string_view database, std::string_view cluster);

// With the columns that rows bring; the others have a DEFAULT.
[[nodiscard]] std::string insertStatement(std::string_view table);

} // namespace kesto_ingest
