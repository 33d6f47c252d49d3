// SPDX-License-Identifier: Apache-2.0
// Counts the freed bytes and the clients that the service reports, and has the limits that a test sets.
#pragma once

#include "foundation/Mutex.h"
#include "platform/Memory.h"

namespace support {

// One thread.
class FakeMemory final : public platform::Memory {
public:
    void letGo(std::size_t bytes) override { bytes_ += bytes; }
    void clientGone() override { ++clientsGone_; }
    [[nodiscard]] platform::MemoryLimits limits() const override
    {
        const foundation::Lock lock(lock_);
        return limits_;
    }
    [[nodiscard]] std::size_t bytesLetGo() const { return bytes_; }
    [[nodiscard]] int clientsGone() const { return clientsGone_; }
    // Any thread.
    void setLimits(const platform::MemoryLimits& limits)
    {
        const foundation::Lock lock(lock_);
        limits_ = limits;
    }

private:
    std::size_t bytes_ = 0;
    int clientsGone_ = 0;
    mutable foundation::Mutex lock_;
    platform::MemoryLimits limits_{
        .ofTheService = std::size_t{2} << 30, .ofAUser = std::size_t{2} << 30, .ofAClient = std::size_t{1} << 30};
};

} // namespace support
