// SPDX-License-Identifier: Apache-2.0
// The budget is used only when a list grows, so that keeping an event costs no more than copying it.
#include "tracing/TraceEvents.h"

#include <algorithm>
#include <atomic>

namespace {

constinit std::atomic<std::size_t> room{TraceEvents::mostOfAllTraces}; // that no trace has taken

std::size_t takeRoom(std::size_t wanted)
{
    std::size_t left = room.load(std::memory_order_relaxed);
    while (!room.compare_exchange_weak(left, left - std::min(left, wanted), std::memory_order_relaxed)) { }
    return std::min(left, wanted);
}

} // namespace

TraceEvents::~TraceEvents()
{
    room.fetch_add(taken_, std::memory_order_relaxed);
}

bool TraceEvents::grow()
{
    const std::size_t more = takeRoom(events_.capacity());
    taken_ += more;
    events_.reserve(events_.capacity() + more);
    return more != 0;
}
