// SPDX-License-Identifier: Apache-2.0
// Writes the service's own events into the kernel's trace.
#pragma once

#include "platform/TraceEmitter.h"

#include <atomic>

namespace platform {

// Any thread.
class TracefsEmitter final : public TraceEmitter {
public:
    // Costs a load and a branch while no trace runs. Failed writes are ignored.
    void emit(std::uint32_t code, const std::array<std::uint64_t, 4>& arguments) override;

    // From now on writes events to the marker, which must stay open as long as the process; -1 stops writing.
    void setMarker(int descriptor) noexcept { marker_.store(descriptor, std::memory_order_relaxed); }

private:
    std::atomic<int> marker_ = -1;
};

} // namespace platform
