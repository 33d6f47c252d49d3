// SPDX-License-Identifier: Apache-2.0
// Reads one argument of each event of the code.
#include "tracing/TracePoint.h"

void TracePoint::processTracepoints(const platform::KernelTraceSession&, std::span<const trace_point> events)
{
    const std::size_t index = std::size_t{argumentIndex_} - 1;
    if (index >= trace_point().arguments.size())
        return;
    for (const trace_point& event : events)
        if (event.eventCode == beginCode_)
            addResult(event.arguments[index]);
}
