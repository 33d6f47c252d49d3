// How much memory a thread has, and had at most, so that a test can say what something takes while it is made.
#pragma once

#include <cstddef>

// What the calling thread allocated through `operator new` and nobody released yet, less what it released of others'.
[[nodiscard]] std::ptrdiff_t allocatedBytes() noexcept;
// Forgets the most there was.
void forgetMostAllocatedBytes() noexcept;
// The most since then.
[[nodiscard]] std::ptrdiff_t mostAllocatedBytes() noexcept;
