// SPDX-License-Identifier: Apache-2.0
// Bytes as the hexadecimal text in which standards and people write them down.
#pragma once

#include <string>
#include <string_view>

// "8301f6" as bytes.
inline std::string fromHex(std::string_view digits)
{
    std::string bytes;
    for (std::size_t at = 0; at + 1 < digits.size(); at += 2)
        bytes.push_back(static_cast<char>(std::stoi(std::string(digits.substr(at, 2)), nullptr, 16)));
    return bytes;
}

inline std::string toHex(std::string_view bytes)
{
    constexpr std::string_view digits = "0123456789abcdef";
    std::string text;
    for (const char byte : bytes) {
        text.push_back(digits[static_cast<unsigned char>(byte) >> 4]);
        text.push_back(digits[static_cast<unsigned char>(byte) & 15]);
    }
    return text;
}
