// SPDX-License-Identifier: Apache-2.0
// Whether a service runs that keeps its events in a store. The service locks the store's directory for as long as it
// runs (see SqliteEventFile); the kernel lists the locks of all processes that this one can see. The lock itself is
// left alone: a service that starts in that moment would find it taken.
#pragma once

#include <filesystem>

// False also if the service cannot be seen from here, such as one in another container.
[[nodiscard]] bool isHeldByService(const std::filesystem::path& database);
