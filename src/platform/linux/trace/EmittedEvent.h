// SPDX-License-Identifier: Apache-2.0
// The interface between service and clients for events in the kernel's trace, besides the wire protocol: the bytes of
// one event, and the page that shows whether a trace runs. Plain memory in the machine's own byte order.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>

namespace platform {

// One event, as it is written to the marker in one piece. The kernel adds time, thread and processor.
struct EmittedEvent {
    static constexpr std::uint32_t ownTag = 0x4F54534B; // the bytes "KSTO"; records without it are foreign

    std::uint32_t tag = ownTag;
    std::uint32_t code = 0;
    std::array<std::uint64_t, 4> arguments{};
};
static_assert(sizeof(EmittedEvent) == 40);

// The shared page. Only the service writes to it; a reader may see a change a moment later.
struct TraceSwitchPage {
    static constexpr std::size_t size = 4096; // of the file; all but the first field is 0 and reserved

    std::uint32_t isTracing = 0; // 0: no trace runs
};

} // namespace platform
