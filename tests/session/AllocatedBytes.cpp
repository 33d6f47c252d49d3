// SPDX-License-Identifier: Apache-2.0
// The linker makes the program call these functions in place of malloc and its like. They count the real sizes,
// separately for each thread, so that other threads do not disturb the count. Operator new is the program's own, so
// that it is counted as well.
#include "session/AllocatedBytes.h"

#include "support/Sanitizers.h"

#include <algorithm>
#include <cstdlib>
#include <malloc.h>
#include <new>

namespace {

thread_local std::ptrdiff_t bytes = 0;
thread_local std::ptrdiff_t mostBytes = 0;

void count(std::ptrdiff_t more) noexcept
{
    bytes += more;
    mostBytes = std::max(mostBytes, bytes);
}

std::ptrdiff_t bytesOf(void* memory) noexcept
{
    return static_cast<std::ptrdiff_t>(::malloc_usable_size(memory)); // 0 for null
}

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

// NOLINTBEGIN(bugprone-reserved-identifier,cert-dcl37-c,cert-dcl51-cpp): the linker chooses these names
extern "C" {

void* __real_malloc(std::size_t size);
void* __real_realloc(void* memory, std::size_t size);
void __real_free(void* memory);

void* __wrap_malloc(std::size_t size)
{
    void* memory = __real_malloc(size);
    count(bytesOf(memory));
    return memory;
}

void* __wrap_realloc(void* memory, std::size_t size)
{
    const std::ptrdiff_t before = bytesOf(memory);
    void* moved = __real_realloc(memory, size);
    if (moved != nullptr)
        count(bytesOf(moved) - before);
    return moved;
}

void __wrap_free(void* memory)
{
    count(-bytesOf(memory));
    __real_free(memory);
}
}
// NOLINTEND(bugprone-reserved-identifier,cert-dcl37-c,cert-dcl51-cpp)

#ifndef KESTO_THREADS_ARE_WATCHED

void* operator new(std::size_t size)
{
    void* memory = std::malloc(size);
    if (memory == nullptr)
        throw std::bad_alloc();
    return memory;
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
