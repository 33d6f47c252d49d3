// Counts the freed bytes that the service reports.
#pragma once

#include "platform/Memory.h"

namespace support {

// One thread.
class FakeMemory final : public platform::Memory {
public:
    void letGo(std::size_t bytes) override { bytes_ += bytes; }
    [[nodiscard]] std::size_t bytesLetGo() const { return bytes_; }

private:
    std::size_t bytes_ = 0;
};

} // namespace support
