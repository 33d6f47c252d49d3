// SPDX-License-Identifier: Apache-2.0
// Writing to a descriptor that may accept fewer bytes than it gets.
#pragma once

#include <cerrno>
#include <string_view>
#include <unistd.h>

namespace platform {

// Writes the bytes, in as many calls as it takes. 0, or the `errno` of the call that failed. Any thread.
[[nodiscard]] inline int writeAll(int file, std::string_view bytes) noexcept
{
    while (!bytes.empty()) {
        const ssize_t count = ::write(file, bytes.data(), bytes.size());
        if (count > 0)
            bytes.remove_prefix(static_cast<std::size_t>(count));
        else if (count == 0)
            return EIO;
        else if (errno != EINTR)
            return errno;
    }
    return 0;
}

} // namespace platform
