// SPDX-License-Identifier: Apache-2.0
// Where the service's socket is.
#pragma once

#include "kesto/kesto.h"

#include <expected>
#include <string>
#include <vector>

namespace libkesto {

// The paths to try, in order. An empty `socketPath` or `serviceName` means the default. KESTO_INVALID_ARGUMENT for
// names that no socket can have. Reads the environment.
[[nodiscard]] std::expected<std::vector<std::string>, kesto_status> servicePaths(const std::string& socketPath,
                                                                                 const std::string& serviceName);

} // namespace libkesto
