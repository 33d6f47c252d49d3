// SPDX-License-Identifier: Apache-2.0
// How much memory a thread has and has had at most, so that a test can check the memory that an object takes while it
// is made.
#pragma once

#include <cstddef>

// The bytes that the program itself, without shared libraries, allocated on this thread and that are not released yet,
// less the bytes of other threads that it released.
[[nodiscard]] std::ptrdiff_t allocatedBytes() noexcept;
// Sets the maximum to the present bytes.
void forgetMostAllocatedBytes() noexcept;
// The maximum since then.
[[nodiscard]] std::ptrdiff_t mostAllocatedBytes() noexcept;
