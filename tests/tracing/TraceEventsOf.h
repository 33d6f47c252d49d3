// SPDX-License-Identifier: Apache-2.0
// Short notations for events of a kernel trace.
#pragma once

#include "tracing/TraceData.h"

namespace support {

inline trace_point eventOf(std::uint32_t code, std::uint64_t timestamp, std::uint64_t thread = 1)
{
    return {.timestamp = timestamp, .threadID = thread, .eventCode = code};
}

} // namespace support
