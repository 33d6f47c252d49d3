// SPDX-License-Identifier: Apache-2.0
// Opens what a device compressed. The size of the result is known and checked before memory is taken for it.
#pragma once

#include <cstddef>
#include <expected>
#include <string>
#include <string_view>

namespace kesto_ingest {

// One frame of zstd that names the size of its content. The error says what is wrong with it.
[[nodiscard]] std::expected<std::string, std::string> decompress(std::string_view bytes, std::size_t largest);

} // namespace kesto_ingest
