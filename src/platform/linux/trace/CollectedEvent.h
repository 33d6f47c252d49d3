// SPDX-License-Identifier: Apache-2.0
// An event on its way from the kernel's pages to the sessions. Ordering copies events a few times, so this type holds
// only the fields of this system. The larger KernelTraceEvent, with fields of other systems, is made for each session
// when it gets the event.
#pragma once

#include "platform/linux/trace/EmittedEvent.h"

namespace platform {

struct CollectedEvent {
    std::uint64_t timestamp = 0; // of the trace's clock
    std::uint32_t threadID = 0;
    std::uint32_t cpu = 0;
    EmittedEvent emitted{}; // as it was written to the marker
};
static_assert(sizeof(CollectedEvent) == 56);

} // namespace platform
