// Runs the traces of one reporting session: collects the kernel's events while the session runs, and at its end
// measures them and writes the results to a file.
//
// Everything that happens to a running trace happens on the runner's own "Tracing Queue". Whoever stops the traces
// waits until each is complete; so the two never touch a trace at the same time, and there are no locks.
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

// Goes through one cycle: traces are added, run and stopped, then the runner is destroyed. Destroyed while they run, it
// lets go of them and writes nothing. One thread.
class TraceRunner {
public:
    // How many may live at once, for each has a thread; whoever makes one more looks first.
    static constexpr std::size_t mostAtOnce = 64;
    [[nodiscard]] static std::size_t numberOfRunners() noexcept;

    static constexpr std::string_view resultsFileName = "tracing_results.qdj";
    static constexpr std::string_view projectName = "KestoReporting";

    TraceRunner();
    virtual ~TraceRunner();
    TraceRunner(const TraceRunner&) = delete;
    TraceRunner& operator=(const TraceRunner&) = delete;

    // Adds one trace that measures an interval for each of the points, whatever their types. No parameters, no trace.
    void createTraceFromTraceParams(const TraceParams* params);
    // Starts every trace. What cannot be started is logged, and will be stopped like the others.
    void runTraces();
    // Stops every trace, waits, however long that takes, until it is complete, and writes the results of all of them.
    // Ends the process, with status 1, if the file cannot be opened.
    void stopTracingandProcessResults();

    [[nodiscard]] std::size_t getNumTraces() const { return traces_.size(); }
    // In the order in which they were added.
    [[nodiscard]] const std::vector<std::unique_ptr<Trace>>& traces() const { return traces_; }
    // How many traces were completed. While the traces run it is the tracing queue's.
    [[nodiscard]] std::uint32_t completedTraceCount() const { return completedTraceCount_; }
    [[nodiscard]] std::uint32_t getResultsVersion() const { return resultsVersion_; }

private:
    using TraceWithResults = std::pair<const Trace* const, TraceResults>;

    void setupTracing(Trace& trace);
    void startTracing(Trace& trace);
    // These three on the tracing queue.
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
    std::uint32_t completedTraceCount_ = 0;
    std::unique_ptr<platform::Semaphore> tracingSemaphore_; // raised once for each completed trace
    std::shared_ptr<platform::WorkQueue> tracingQueue_;
    // Shared with the handler that fills it, which may outlive the session by an event.
    std::map<const Trace*, std::shared_ptr<TraceEvents>> traceEvents_;
    std::map<const Trace*, TraceResults> traceResults_;

    // What is missing in the results. While the traces run it is the tracing queue's.
    std::uint64_t lostEvents_ = 0; // at most
    std::size_t lostIntervals_ = 0; // that were not measured
    std::size_t lostPoints_ = 0; // of the parameters, with traces, that were not read
    std::string problem_; // the first, with the parameters or with a start; empty: none

    std::map<const Trace*, std::unique_ptr<platform::KernelTraceSession>> traceSessions_; // go first
};
