// SPDX-License-Identifier: Apache-2.0
// The events of one trace while it runs, in memory that all traces share.
//
// Clients decide how many events come. So every trace has a first room, and further memory comes from one budget of the
// process; when that is used up, events are lost and counted.
#pragma once

#include "tracing/TraceData.h"

#include <cstddef>

// One thread at a time; different threads may use different lists at the same time.
class TraceEvents {
public:
    static constexpr std::size_t firstRoom = 10'000; // in events
    // Beyond the first room of each: some 96 MB.
    static constexpr std::size_t mostOfAllTraces = 1'000'000;

    TraceEvents() { events_.reserve(firstRoom); }
    ~TraceEvents();
    TraceEvents(const TraceEvents&) = delete;
    TraceEvents& operator=(const TraceEvents&) = delete;

    void append(const trace_point& event)
    {
        if (events_.size() == events_.capacity() && !grow()) [[unlikely]]
            ++lost_;
        else
            events_.push_back(event);
    }

    [[nodiscard]] std::span<const trace_point> all() const { return events_; }
    // How many events were lost because there was no room.
    [[nodiscard]] std::uint64_t lost() const { return lost_; }

private:
    bool grow();

    std::vector<trace_point> events_;
    std::size_t taken_ = 0; // from the budget
    std::uint64_t lost_ = 0;
};
