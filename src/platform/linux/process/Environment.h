// SPDX-License-Identifier: Apache-2.0
// The environment, as all programs here read it.
#pragma once

#include <cstdlib>
#include <string>

namespace platform {

// Empty if the variable is not set, or if the program runs with more privileges than the user that set it. Callers take
// an empty variable for one that is not set, as in a unit file that resets a setting. Must not be called while another
// thread changes the environment.
[[nodiscard]] inline std::string environment(const char* variable)
{
    const char* value = ::secure_getenv(variable);
    return value == nullptr ? "" : value;
}

} // namespace platform
