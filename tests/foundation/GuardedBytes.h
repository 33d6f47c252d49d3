// SPDX-License-Identifier: Apache-2.0
// Bytes right before an inaccessible page: code that reads one byte beyond them ends the test program, with or without
// a sanitizer.
#pragma once

#include <cstddef>
#include <new>
#include <string_view>
#include <sys/mman.h>
#include <unistd.h>

class GuardedBytes {
public:
    explicit GuardedBytes(std::string_view bytes)
    {
        const auto page = static_cast<std::size_t>(::sysconf(_SC_PAGESIZE));
        const std::size_t usable = (bytes.size() + page) / page * page;
        size_ = usable + page;
        memory_ = ::mmap(nullptr, size_, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
        if (memory_ == MAP_FAILED)
            throw std::bad_alloc();
        char* const begin = static_cast<char*>(memory_);
        ::mprotect(begin + usable, page, PROT_NONE);
        view_ = {begin + usable - bytes.size(), bytes.size()};
        bytes.copy(begin + usable - bytes.size(), bytes.size());
    }
    ~GuardedBytes() { ::munmap(memory_, size_); }
    GuardedBytes(const GuardedBytes&) = delete;
    GuardedBytes& operator=(const GuardedBytes&) = delete;

    [[nodiscard]] std::string_view view() const noexcept { return view_; }

private:
    void* memory_;
    std::size_t size_;
    std::string_view view_;
};
