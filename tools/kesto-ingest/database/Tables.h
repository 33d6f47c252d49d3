// SPDX-License-Identifier: Apache-2.0
// The tables of the fleet, as SQL that makes them.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

namespace kesto_ingest {

// Grows with each change of the tables that an earlier or later program could not use.
constexpr std::uint64_t tablesEdition = 1;

// Statements that end with ";". Without a cluster they make tables for one server; with one they make replicated tables
// on each server of the cluster, with a distributed table above each.
[[nodiscard]] std::string tablesSql(std::string_view database, std::string_view cluster);

// With the columns that rows bring; the others have a DEFAULT or an ALIAS.
[[nodiscard]] std::string insertStatement(std::string_view table);

} // namespace kesto_ingest
