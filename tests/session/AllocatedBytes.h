// How much memory a thread has, and had at most, so that a test can say what something takes while it is made.
#pragma once

#include <cstddef>

// What the calling thread allocated and nobody released yet, less what it released of others': by the program itself,
// not by the libraries that it shares.
[[nodiscard]] std::ptrdiff_t allocatedBytes() noexcept;
// Forgets the most there was.
void forgetMostAllocatedBytes() noexcept;
// The most since then.
[[nodiscard]] std::ptrdiff_t mostAllocatedBytes() noexcept;
