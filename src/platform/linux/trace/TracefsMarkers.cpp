// One write, whose failure is ignored: the event is then lost.
#include "platform/linux/trace/TracefsMarkers.h"

#include "platform/linux/trace/TraceMarker.h"

#include <unistd.h>

namespace platform {

void TracefsMarkers::emit(std::uint32_t code, const std::array<std::uint64_t, 4>& arguments)
{
    const int marker = marker_.load(std::memory_order_relaxed);
    if (marker < 0)
        return;
    const TraceMarkerRecord record{.code = code, .arguments = arguments};
    [[maybe_unused]] const ssize_t written = ::write(marker, &record, sizeof record);
}

} // namespace platform
