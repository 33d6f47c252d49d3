// How much memory was asked for in one piece, to prove that what a hostile length claims is not believed.
#pragma once

#include <cstddef>

// Forgets what was asked for so far.
void forgetAllocations() noexcept;
// The largest request of this thread through `operator new` since then, in bytes.
[[nodiscard]] std::size_t largestAllocation() noexcept;
