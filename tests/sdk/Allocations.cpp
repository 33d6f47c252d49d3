// SPDX-License-Identifier: Apache-2.0
// The program's own operator new counts allocations, separately for each thread.
#include "sdk/Allocations.h"

#include "support/Sanitizers.h"

#include <cstdlib>
#include <new>

namespace {

thread_local std::size_t count = 0;

} // namespace

std::size_t sdk_test::allocations() noexcept
{
    return count;
}

#ifdef KESTO_THREADS_ARE_WATCHED

// The sanitizer's calls this. NOLINTNEXTLINE(bugprone-reserved-identifier)
extern "C" void __sanitizer_malloc_hook(const volatile void*, std::size_t)
{
    ++count;
}

#else

void* operator new(std::size_t size, const std::nothrow_t&) noexcept
{
    ++count;
    return std::malloc(size);
}

void* operator new(std::size_t size)
{
    if (void* memory = operator new(size, std::nothrow); memory != nullptr)
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
