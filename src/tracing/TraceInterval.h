// SPDX-License-Identifier: Apache-2.0
// The time from an event of one code to the next event of another: on the same thread, or on any thread.
//
// A start that is followed by another start, and a stop without a start, are discarded and counted. If both codes are
// the same, their event begins the interval.
#pragma once

#include "tracing/TraceData.h"

class TraceInterval : public TraceData {
public:
    TraceInterval(std::string name, std::uint32_t beginCode, std::uint32_t endCode, bool matchByThread)
        : TraceData(std::move(name)),
          beginCode_(beginCode),
          endCode_(endCode),
          matchByThread_(matchByThread)
    {
    }

    [[nodiscard]] std::uint32_t beginCode() const { return beginCode_; }
    [[nodiscard]] std::uint32_t endCode() const { return endCode_; }
    // Whether start and stop must come from the same thread.
    [[nodiscard]] bool matchByThread() const { return matchByThread_; }

    // Results are unsigned nanoseconds; an end before its start wraps around.
    void processTracepoints(const platform::KernelTraceSession& session, std::span<const trace_point> events) override;
    virtual void processTracepointsSingleThread(const platform::KernelTraceSession& session,
                                                std::span<const trace_point> events);
    // A start at time 0 does not count.
    virtual void processTracepointsAnyThread(const platform::KernelTraceSession& session,
                                             std::span<const trace_point> events);

private:
    void complete(const platform::KernelTraceSession& session, std::uint64_t start, std::uint64_t end);

    const std::uint32_t beginCode_;
    const std::uint32_t endCode_;
    const bool matchByThread_;
};
