// The program's own operator new sees every request, and remembers the largest.
#include "foundation/LargestAllocation.h"

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
