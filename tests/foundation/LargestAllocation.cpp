// SPDX-License-Identifier: Apache-2.0
// The program's own operator new records the largest request.
#include "foundation/LargestAllocation.h"

#include "support/Sanitizers.h"

#include <algorithm>
#include <cstdlib>
#include <new>

namespace {

thread_local std::size_t largest = 0;

} // namespace

void forgetAllocations() noexcept
{
    largest = 0;
}

std::size_t largestAllocation() noexcept
{
    return largest;
}

#ifdef KESTO_THREADS_ARE_WATCHED

// The sanitizer's calls this. NOLINTNEXTLINE(bugprone-reserved-identifier)
extern "C" void __sanitizer_malloc_hook(const volatile void*, std::size_t size)
{
    largest = std::max(largest, size);
}

#else

void* operator new(std::size_t size)
{
    largest = std::max(largest, size);
    if (void* memory = std::malloc(size); memory != nullptr)
        return memory;
    throw std::bad_alloc();
}

void operator delete(void* memory) noexcept
{
    std::free(memory);
}

void operator delete(void* memory, std::size_t) noexcept
{
    std::free(memory);
}

#endif
