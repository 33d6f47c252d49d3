// SPDX-License-Identifier: Apache-2.0
// The compression of batches.
#pragma once

#include <string>
#include <string_view>

namespace kesto_uplink {

// One frame of zstd, with the size of the text in its header. Any thread.
[[nodiscard]] std::string compressed(std::string_view text);

} // namespace kesto_uplink
