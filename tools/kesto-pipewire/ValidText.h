// SPDX-License-Identifier: Apache-2.0
// Makes foreign text valid for sending: any program chooses its names, and the reporting service ends a connection that
// sends text that is not UTF-8.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace kesto_pipewire {

constexpr std::size_t maximumNameBytes = 255;

// The text cut to that many bytes, never within a character. Each byte that is not part of a UTF-8 character becomes
// "?". Any thread.
[[nodiscard]] std::string tidyText(std::string_view text, std::size_t maximumBytes = maximumNameBytes);

} // namespace kesto_pipewire
