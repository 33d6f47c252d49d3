// SPDX-License-Identifier: Apache-2.0
// The largest single allocation, to prove that the code does not allocate for a hostile length.
#pragma once

#include <cstddef>

// Forgets earlier requests.
void forgetAllocations() noexcept;
// The largest request of this thread through `operator new` since then, in bytes.
[[nodiscard]] std::size_t largestAllocation() noexcept;
