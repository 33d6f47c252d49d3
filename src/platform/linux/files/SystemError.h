// SPDX-License-Identifier: Apache-2.0
// The system's error numbers, as std::error_code and as text that is the same in every locale.
#pragma once

#include <cerrno>
#include <cstring>
#include <string_view>
#include <system_error>

namespace platform {

// Of the call that failed last on this thread. Any thread.
[[nodiscard]] inline std::error_code systemError() noexcept
{
    return {errno, std::generic_category()};
}

// Such as "Connection reset by peer" for ECONNRESET. Any thread.
[[nodiscard]] inline std::string_view systemErrorText(int error) noexcept
{
    const char* text = ::strerrordesc_np(error);
    return text == nullptr ? "unknown error" : text;
}

} // namespace platform
