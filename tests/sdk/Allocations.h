// Counts what a thread allocates, so that a test can say that something allocates nothing.
#pragma once

#include <cstddef>

namespace sdk_test {

// By the calling thread, since it began.
[[nodiscard]] std::size_t allocations() noexcept;

} // namespace sdk_test
