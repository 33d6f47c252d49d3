// SPDX-License-Identifier: Apache-2.0
// An open file of the process; its last owner closes it.
#pragma once

#include <unistd.h>
#include <utility>

namespace platform {

class FileDescriptor {
public:
    FileDescriptor() noexcept = default;
    explicit FileDescriptor(int number) noexcept : number_(number) { }
    FileDescriptor(FileDescriptor&& other) noexcept : number_(std::exchange(other.number_, -1)) { }
    FileDescriptor& operator=(FileDescriptor other) noexcept
    {
        std::swap(number_, other.number_);
        return *this;
    }
    ~FileDescriptor()
    {
        if (number_ >= 0)
            ::close(number_);
    }

    [[nodiscard]] int get() const noexcept { return number_; }
    explicit operator bool() const noexcept { return number_ >= 0; }

private:
    int number_ = -1;
};

} // namespace platform
