// The program's own operator new counts what malloc really gave, a count a thread, so that other threads do not
// disturb it.
#include "session/AllocatedBytes.h"

#include <algorithm>
#include <cstdlib>
#include <malloc.h>
#include <new>

namespace {

thread_local std::ptrdiff_t bytes = 0;
thread_local std::ptrdiff_t mostBytes = 0;

} // namespace

std::ptrdiff_t allocatedBytes() noexcept
{
    return bytes;
}

void forgetMostAllocatedBytes() noexcept
{
    mostBytes = bytes;
}

std::ptrdiff_t mostAllocatedBytes() noexcept
{
    return mostBytes;
}

void* operator new(std::size_t size)
{
    void* memory = std::malloc(size);
    if (memory == nullptr)
        throw std::bad_alloc();
    bytes += static_cast<std::ptrdiff_t>(::malloc_usable_size(memory));
    mostBytes = std::max(mostBytes, bytes);
    return memory;
}

void operator delete(void* memory) noexcept
{
    if (memory != nullptr)
        bytes -= static_cast<std::ptrdiff_t>(::malloc_usable_size(memory));
    std::free(memory);
}

void operator delete(void* memory, std::size_t) noexcept
{
    operator delete(memory);
}
