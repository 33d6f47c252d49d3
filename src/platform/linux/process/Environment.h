// The environment, as all programs here read it.
#pragma once

#include <cstdlib>
#include <string>

namespace platform {

// Empty when the variable is not set, or when the program runs with privileges that the user who set it does not have.
// Not while another thread changes the environment.
[[nodiscard]] inline std::string environment(const char* variable)
{
    const char* value = ::secure_getenv(variable);
    return value == nullptr ? "" : value;
}

} // namespace platform
