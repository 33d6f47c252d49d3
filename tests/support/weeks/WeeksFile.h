// SPDX-License-Identifier: Apache-2.0
// Made-up weeks as a file of the event store, in the tables that the service itself makes.
#pragma once

#include "support/weeks/MadeUpWeeks.h"

#include <filesystem>

namespace weeks {

// Makes the file, as a service leaves it that ended at `weeks.now`: whoever reads it counts what runs up to then.
// Throws std::runtime_error.
void writeWeeks(const Weeks& weeks, const std::filesystem::path& database);

} // namespace weeks
