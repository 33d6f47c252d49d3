// SPDX-License-Identifier: Apache-2.0
// Whose messages and events were refused, lost or removed: a user, a process and an application.
#pragma once

#include <cstdint>
#include <string>

namespace ledger {

struct Culprit {
    std::uint32_t user = 0;
    std::string process; // its name, from the kernel
    std::string application; // the name that the client gave its session; empty without a session

    friend bool operator==(const Culprit&, const Culprit&) = default;
    friend auto operator<=>(const Culprit&, const Culprit&) = default;
};

} // namespace ledger
