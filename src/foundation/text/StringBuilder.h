// SPDX-License-Identifier: Apache-2.0
// A string in the making, which may become very long.
//
// The string's own memory grows, by `realloc`: the system moves the pages of a large text instead of copying it, and
// there is never a second copy of the finished string.
#pragma once

#include "foundation/values/String.h"

#include <cstring>
#include <memory>
#include <string_view>
#include <utility>

namespace foundation {

// One thread at a time.
class StringBuilder {
public:
    StringBuilder() = default;
    StringBuilder(StringBuilder&& other) noexcept
        : memory_(std::move(other.memory_)),
          size_(std::exchange(other.size_, 0)),
          capacity_(std::exchange(other.capacity_, 0))
    {
    }
    StringBuilder& operator=(StringBuilder other) noexcept
    {
        std::swap(memory_, other.memory_);
        std::swap(size_, other.size_);
        std::swap(capacity_, other.capacity_);
        return *this;
    }
    ~StringBuilder() = default;

    void append(std::string_view text)
    {
        if (text.empty())
            return;
        if (capacity_ - size_ < text.size())
            grow(text.size());
        std::memcpy(bytes() + size_, text.data(), text.size());
        size_ += text.size();
    }

    [[nodiscard]] std::size_t size() const noexcept { return size_; }

    void append(char character) { append(std::string_view(&character, 1)); }
    // Appends the last `size` characters again, so many times.
    void repeatLast(std::size_t size, std::size_t times);
    // Removes the last character; the string must not be empty.
    void dropLast() noexcept { --size_; }

    // Leaves an empty builder.
    [[nodiscard]] String finish() &&;

private:
    struct Free {
        void operator()(char* memory) const noexcept;
    };

    [[nodiscard]] char* bytes() const noexcept { return memory_.get() + sizeof(StringObject); }
    void grow(std::size_t additional);
    void setCapacity(std::size_t capacity);

    std::unique_ptr<char, Free> memory_; // room for the object, then the bytes
    std::size_t size_ = 0;
    std::size_t capacity_ = 0;
};

} // namespace foundation
