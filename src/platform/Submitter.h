// Who submits work, or sends it: a process of a user, as the kernel tells.
#pragma once

#include <compare>
#include <cstdint>

namespace platform {

struct Submitter {
    std::uint32_t user = 0;
    std::int32_t process = 0; // 0 where the kernel does not tell

    friend auto operator<=>(const Submitter&, const Submitter&) = default;
};

} // namespace platform
