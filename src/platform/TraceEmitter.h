// SPDX-License-Identifier: Apache-2.0
// Events of this service in the kernel's trace.
#pragma once

#include <array>
#include <cstdint>

namespace platform {

// Any thread.
class TraceEmitter {
public:
    virtual ~TraceEmitter() = default;
    // Emits one kernel trace event; does nothing while no trace runs.
    virtual void emit(std::uint32_t code, const std::array<std::uint64_t, 4>& arguments) = 0;
};

} // namespace platform
