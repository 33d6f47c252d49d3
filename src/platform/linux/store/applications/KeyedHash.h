// SPDX-License-Identifier: Apache-2.0
// Texts that stand for others: the same text has the same hash, so that it can be counted, and without the key no one
// can try which text yields it.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace platform {

constexpr std::size_t hashKeyBytes = 32;

// A key of that size. Any thread, as below.
[[nodiscard]] std::string randomHashKey();

// 16 hexadecimal digits: the first 64 bits of the text's HMAC-SHA-256 (RFC 2104, FIPS 180-4).
[[nodiscard]] std::string keyedHash(std::string_view key, std::string_view text);

} // namespace platform
