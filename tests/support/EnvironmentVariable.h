// SPDX-License-Identifier: Apache-2.0
// A variable of the process's environment for one test: set, or unset, as long as this lives.
#pragma once

#include <cstdlib>
#include <optional>
#include <string>

namespace support {

class EnvironmentVariable {
public:
    EnvironmentVariable(const char* name, const std::optional<std::string>& value) : name_(name)
    {
        if (const char* before = std::getenv(name); before != nullptr)
            before_ = before;
        set(value);
    }
    ~EnvironmentVariable() { set(before_); }
    EnvironmentVariable(const EnvironmentVariable&) = delete;
    EnvironmentVariable& operator=(const EnvironmentVariable&) = delete;

private:
    void set(const std::optional<std::string>& value)
    {
        if (value)
            ::setenv(name_, value->c_str(), 1);
        else
            ::unsetenv(name_);
    }

    const char* name_;
    std::optional<std::string> before_;
};

} // namespace support
