// SPDX-License-Identifier: Apache-2.0
// The program's lines on standard error, which a service manager keeps.
#pragma once

#include <fmt/format.h>

#include <cstdio>
#include <utility>

namespace kesto_pipewire {

class Diagnostics {
public:
    explicit Diagnostics(bool verbose) : isVerbose_(verbose) { }

    [[nodiscard]] bool isVerbose() const noexcept { return isVerbose_; }

    // A line about a change that affects the reports. Any thread, as the other function.
    template <typename... Values> void say(fmt::format_string<Values...> format, Values&&... values) const
    {
        fmt::print(stderr, "kesto-pipewire: {}\n", fmt::format(format, std::forward<Values>(values)...));
    }
    // A line that is only written with --verbose.
    template <typename... Values> void detail(fmt::format_string<Values...> format, Values&&... values) const
    {
        if (isVerbose_)
            say(format, std::forward<Values>(values)...);
    }

private:
    bool isVerbose_;
};

} // namespace kesto_pipewire
