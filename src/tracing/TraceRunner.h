// SPDX-License-Identifier: Apache-2.0
// Runs the traces of one reporting session: collects the kernel's events while the session runs, and at its end
// measures them and writes the results to a file.
//
// All work on a running trace is done on the runner's own "Tracing Queue". The thread that stops the traces waits until
// each is complete; so the two never use a trace at the same time, and need no locks. It is not that of the server
// queue, because a million events take a second.
#pragma once

#include "platform/PerformanceWriter.h"
#include "platform/WorkQueue.h"
#include "tracing/Trace.h"
#include "tracing/TraceEvents.h"

#include <filesystem>
#include <map>
#include <memory>
#include <string_view>
#include <vector>

struct TraceParams;

// Where the results are written.
[[nodiscard]] std::filesystem::path KestoReportingTracingLogsDirectory();

// Has one cycle: traces are added, run and stopped, then the runner is destroyed. If it is destroyed while they run, it
// drops them and does not write. One thread.
class TraceRunner {
public:
    // How many runners may exist at the same time, because each has a thread; a caller checks this before it makes one.
    static constexpr std::size_t mostAtOnce = 64;
    [[nodiscard]] static std::size_t numberOfRunners() noexcept;

    static constexpr std::string_view resultsFileName = "tracing_results.qdj";
    static constexpr std::string_view projectName = "KestoReporting";

    TraceRunner();
    virtual ~TraceRunner();
    TraceRunner(const TraceRunner&) = delete;
    TraceRunner& operator=(const TraceRunner&) = delete;

    // Adds one trace that measures an interval for each point, of any type. Without parameters it adds no trace.
    void createTraceFromTraceParams(const TraceParams* params);
    // Starts every trace. A trace that cannot start is logged, and will be stopped like the others.
    void runTraces();
    // Tells the trace to stop, of several the first, and does not wait: it collects no longer.
    void beginToStop();
    // Stops every trace, waits without a limit until each is complete, and writes all results. Ends the process, with
    // status 1, if the file cannot be opened. Another thread than before may call it.
    void stopTracingandProcessResults();

    [[nodiscard]] std::size_t getNumTraces() const { return traces_.size(); }
    // In the order in which they were added.
    [[nodiscard]] const std::vector<std::unique_ptr<Trace>>& traces() const { return traces_; }
    // How many traces were completed. While the traces run, only the tracing queue uses it.
    [[nodiscard]] std::uint32_t completedTraceCount() const { return completedTraceCount_; }
    [[nodiscard]] std::uint32_t getResultsVersion() const { return resultsVersion_; }

private:
    using TraceWithResults = std::pair<const Trace* const, TraceResults>;

    void setupTracing(Trace& trace);
    void startTracing(Trace& trace);
    void submitStop(Trace& trace);
    // These three run on the tracing queue.
    void stopTracing(Trace& trace);
    void tracingCompletionHandler(Trace& trace);
    void tearDownTracing(Trace& trace);
    void processEvents(Trace& trace);
    void fail(std::string problem);
    void keepProblem(std::string problem);

    void writeQuilldat();
    void remarkWhatIsMissing();
    static void printTraceResults(const TraceWithResults& results);

    const std::uint32_t resultsVersion_ = 4;
    std::unique_ptr<platform::PerformanceFile> perfWriter_;
    std::vector<std::unique_ptr<Trace>> traces_;
    bool isStopping_ = false; // not by the tracing queue
    std::uint32_t completedTraceCount_ = 0;
    std::unique_ptr<platform::Semaphore> tracingSemaphore_; // raised once for each completed trace
    std::shared_ptr<platform::WorkQueue> tracingQueue_;
    // Shared with the handler that fills it, which may run once more after the session was destroyed.
    std::map<const Trace*, std::shared_ptr<TraceEvents>> traceEvents_;
    std::map<const Trace*, TraceResults> traceResults_;

    // Data missing from the results. While the traces run, only the tracing queue uses these.
    std::uint64_t lostEvents_ = 0; // an upper bound
    std::size_t lostIntervals_ = 0; // that were not measured
    std::size_t lostPoints_ = 0; // points and traces of the parameters that were not read
    std::string problem_; // the first problem of the parameters or of a start; may be empty

    std::map<const Trace*, std::unique_ptr<platform::KernelTraceSession>> traceSessions_; // destroyed first
};
