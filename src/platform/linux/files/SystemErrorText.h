// What the system's error numbers mean, in the same words whatever the locale.
#pragma once

#include <cstring>
#include <string_view>

namespace platform {

// Such as "Connection reset by peer" for ECONNRESET. Any thread.
[[nodiscard]] inline std::string_view systemErrorText(int error) noexcept
{
    const char* text = ::strerrordesc_np(error);
    return text == nullptr ? "unknown error" : text;
}

} // namespace platform
