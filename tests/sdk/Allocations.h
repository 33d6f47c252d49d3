// SPDX-License-Identifier: Apache-2.0
// Counts a thread's allocations, so that a test can prove that a function does not allocate.
#pragma once

#include <cstddef>

namespace sdk_test {

// The calling thread's count since it began.
[[nodiscard]] std::size_t allocations() noexcept;

} // namespace sdk_test
