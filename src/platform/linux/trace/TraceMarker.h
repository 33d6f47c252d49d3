// What the service and its clients agree on, beside the wire protocol, to emit events into the kernel's trace: the
// bytes of one event, and the page that says whether anybody wants them. Plain memory in the machine's own byte order.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>

namespace platform {

// One event, as it is written to the marker in one piece. The kernel adds time, thread and processor.
struct TraceMarkerRecord {
    static constexpr std::uint32_t ownTag = 0x4F54534B; // the bytes "KSTO"; what else is in the trace is not ours

    std::uint32_t tag = ownTag;
    std::uint32_t code = 0;
    std::array<std::uint64_t, 4> arguments{};
};
static_assert(sizeof(TraceMarkerRecord) == 40);

// The shared page. Only the service writes to it; whoever reads it may see the change a moment later.
struct TraceMarkerPage {
    static constexpr std::size_t size = 4096; // of the file; all but the first field is 0 and reserved

    std::uint32_t isTracing = 0; // 0: nobody wants events
};

} // namespace platform
