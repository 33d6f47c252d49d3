// SPDX-License-Identifier: Apache-2.0
// A measurement of a trace: each object reads all events of a finished trace and keeps the values that it measures.
//
// A trace may hold millions of events and tens of thousands of results. Both are plain data in vectors: reading an
// event takes some nanoseconds and allocates nothing.
#pragma once

#include "platform/KernelTrace.h"

#include <cstdint>
#include <span>
#include <string>
#include <utility>
#include <vector>

using trace_point = platform::KernelTraceEvent;

// One thread at a time.
class TraceData {
public:
    virtual ~TraceData() = default;
    TraceData(const TraceData&) = delete;
    TraceData& operator=(const TraceData&) = delete;

    // Measures the events, which are in the order of time, and appends the results. The session delivered the events
    // and knows the unit of their time.
    virtual void processTracepoints(const platform::KernelTraceSession& session,
                                    std::span<const trace_point> events) = 0;

    [[nodiscard]] const std::string& name() const { return name_; }
    [[nodiscard]] bool hasResults() const { return !results_.empty(); }
    // In the order of measurement.
    [[nodiscard]] const std::vector<std::uint64_t>& getResults() const { return results_; }
    // How many intervals were completed.
    [[nodiscard]] std::uint32_t getNumTimesTraced() const { return numTimesTraced_; }
    // The sum of the results divided by the number of intervals; infinity or NaN without intervals.
    [[nodiscard]] float getAverageResult() const;

protected:
    explicit TraceData(std::string name) : name_(std::move(name)) { }

    void addResult(std::uint64_t result) { results_.push_back(result); }
    // The first makes room for so many more results, so that adding them does not move the earlier ones; the second
    // releases unused room.
    void makeRoom(std::size_t more) { results_.reserve(results_.size() + more); }
    void giveBackRoom() { results_.shrink_to_fit(); }
    void countCompletedInterval() { ++numTimesTraced_; }

private:
    const std::string name_;
    std::vector<std::uint64_t> results_;
    std::uint32_t numTimesTraced_ = 0;
};
