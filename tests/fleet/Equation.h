// SPDX-License-Identifier: Apache-2.0
// The equation that each scenario ends with: the rows in the database, each once, are the rows that the devices allow.
#pragma once

#include "fleet/DatabaseCluster.h"
#include "fleet/Truth.h"

#include <cstdint>
#include <string>
#include <vector>

namespace fleet {

struct Equality {
    std::uint64_t rows = 0; // that must be there
    std::vector<std::string> differences = {}; // none: it holds. Lines for a person, with the first IDs that differ
};

// Each replica alone must have all.
[[nodiscard]] Equality compare(DatabaseCluster& database, const SumsOfRows& truth, const Chapters& chapters);

} // namespace fleet
