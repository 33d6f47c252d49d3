// One trace: what it measures, and the values that were found.
#pragma once

#include "tracing/TraceInterval.h"

#include <map>
#include <memory>

// Values by the name of what was measured: names ascending, the values of one in the order in which they were found.
using TraceResults = std::map<std::string, std::vector<std::uint64_t>>;

// One thread at a time.
class Trace {
public:
    // Only a trace that collects kernel events is run through the kernel event trace service.
    Trace(std::string name, bool collectKernelTrace) : name_(std::move(name)), collectKernelTrace_(collectKernelTrace)
    {
    }

    [[nodiscard]] const std::string& name() const { return name_; }
    [[nodiscard]] bool collectKernelTrace() const { return collectKernelTrace_; }
    [[nodiscard]] const std::vector<std::unique_ptr<TraceData>>& data() const { return data_; }

    void addTraceDataToCollect(std::unique_ptr<TraceInterval> interval) { data_.push_back(std::move(interval)); }
    // Lets each of them, in their order, read all events. Those that are left when there are so many results, or when
    // all together have read so many events (a second or so of work, for which the service waits), do not, with a line
    // that says how many; the first always does.
    static constexpr std::size_t mostResults = 1'000'000;
    static constexpr std::size_t mostEventsRead = 50'000'000;
    void processTracepoints(const platform::KernelTraceSession& session, std::span<const trace_point> events);
    // How many were left out.
    [[nodiscard]] std::size_t intervalsLeftOut() const { return intervalsLeftOut_; }
    // Everything that was found. What one call has gathered stays: the next returns every value once more.
    [[nodiscard]] TraceResults getResults();

private:
    const std::string name_;
    const bool collectKernelTrace_;
    std::size_t intervalsLeftOut_ = 0;
    TraceResults resultsByName_;
    std::vector<std::unique_ptr<TraceData>> data_;
};
