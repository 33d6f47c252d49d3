// The service's own events in the kernel's trace.
#pragma once

#include "platform/TraceMarkers.h"

#include <atomic>

namespace platform {

// Any thread.
class TracefsMarkers final : public TraceMarkers {
public:
    // Costs a load and a branch when nobody traces. What the kernel does not take is nobody's loss.
    void emit(std::uint32_t code, const std::array<std::uint64_t, 4>& arguments) override;

    // From now on events are written to the marker, which stays open for as long as the process; -1: to none.
    void setMarker(int descriptor) noexcept { marker_.store(descriptor, std::memory_order_relaxed); }

private:
    std::atomic<int> marker_ = -1;
};

} // namespace platform
