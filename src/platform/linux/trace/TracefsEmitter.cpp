// SPDX-License-Identifier: Apache-2.0
// One write. If it fails, the event is lost.
#include "platform/linux/trace/TracefsEmitter.h"

#include "platform/linux/trace/EmittedEvent.h"

#include <unistd.h>

namespace platform {

void TracefsEmitter::emit(std::uint32_t code, const std::array<std::uint64_t, 4>& arguments)
{
    const int marker = marker_.load(std::memory_order_relaxed);
    if (marker < 0)
        return;
    const EmittedEvent record{.code = code, .arguments = arguments};
    [[maybe_unused]] const ssize_t written = ::write(marker, &record, sizeof record);
}

} // namespace platform
