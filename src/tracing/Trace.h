// SPDX-License-Identifier: Apache-2.0
// One trace: its measurements and their results.
#pragma once

#include "tracing/TraceInterval.h"

#include <map>
#include <memory>

// Values by the name of the measurement: names ascending, the values of one name in the order of measurement.
using TraceResults = std::map<std::string, std::vector<std::uint64_t>>;

// One thread at a time.
class Trace {
public:
    // Only a trace that collects kernel events uses the kernel event trace service.
    Trace(std::string name, bool collectKernelTrace) : name_(std::move(name)), collectKernelTrace_(collectKernelTrace)
    {
    }

    [[nodiscard]] const std::string& name() const { return name_; }
    [[nodiscard]] bool collectKernelTrace() const { return collectKernelTrace_; }
    [[nodiscard]] const std::vector<std::unique_ptr<TraceData>>& data() const { return data_; }

    void addTraceDataToCollect(std::unique_ptr<TraceInterval> interval) { data_.push_back(std::move(interval)); }
    // Lets each measurement, in order, read all events. It stops after this many results, or after this many events
    // were read by all together (about a second of work), and logs how many measurements are left out. The first
    // measurement always runs.
    static constexpr std::size_t mostResults = 1'000'000;
    static constexpr std::size_t mostEventsRead = 50'000'000;
    void processTracepoints(const platform::KernelTraceSession& session, std::span<const trace_point> events);
    // How many measurements were left out.
    [[nodiscard]] std::size_t intervalsLeftOut() const { return intervalsLeftOut_; }
    // All results so far. The collected values stay: each further call adds all values once more.
    [[nodiscard]] TraceResults getResults();

private:
    const std::string name_;
    const bool collectKernelTrace_;
    std::size_t intervalsLeftOut_ = 0;
    TraceResults resultsByName_;
    std::vector<std::unique_ptr<TraceData>> data_;
};
