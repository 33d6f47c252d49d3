// SPDX-License-Identifier: Apache-2.0
// Memory doubles while the string grows, and is cut to size when it is finished.
#include "foundation/text/StringBuilder.h"

#include <algorithm>
#include <cstdlib>
#include <new>

namespace foundation {

void StringBuilder::Free::operator()(char* memory) const noexcept
{
    std::free(memory);
}

String StringBuilder::finish() &&
{
    if (size_ == 0)
        return {};
    setCapacity(size_);
    capacity_ = 0;
    return String(Reference<StringObject>::adopt(StringObject::createIn(memory_.release(), std::exchange(size_, 0))));
}

// The copied text serves as a longer and longer pattern, up to the size of a processor's cache.
void StringBuilder::repeatLast(std::size_t size, std::size_t times)
{
    constexpr std::size_t longPattern = std::size_t{16} << 10;
    std::size_t missing = size * times;
    if (missing == 0)
        return;
    if (capacity_ - size_ < missing)
        grow(missing);
    const char* const pattern = bytes() + size_ - size;
    for (std::size_t length = size; missing != 0; length = length < longPattern ? length * 2 : length) {
        const std::size_t count = std::min(length, missing);
        std::memcpy(bytes() + size_, pattern, count);
        size_ += count;
        missing -= count;
    }
}

void StringBuilder::grow(std::size_t additional)
{
    constexpr std::size_t smallest = 32;
    setCapacity(std::max({smallest, size_ + additional, capacity_ * 2}));
}

void StringBuilder::setCapacity(std::size_t capacity)
{
    void* moved = std::realloc(memory_.get(), sizeof(StringObject) + capacity);
    if (moved == nullptr)
        throw std::bad_alloc();
    static_cast<void>(memory_.release());
    memory_.reset(static_cast<char*>(moved));
    capacity_ = capacity;
}

} // namespace foundation
