// SPDX-License-Identifier: Apache-2.0
// Scenarios in which the trial measures, and what it prints of the figures.
#pragma once

#include "fleet/Fleet.h"

#include <string>

namespace fleet {

// The ingest begins when all batches wait.
void measureIngest(Fleet& fleet);
// A kesto-uplink with a large store.
void measureUplink(Fleet& fleet);
// How much room the rows take, when all parts are merged.
void measureRoom(Fleet& fleet);

// Lines for a person.
[[nodiscard]] std::string textOf(const Figures& figures);

} // namespace fleet
