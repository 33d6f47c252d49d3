// SPDX-License-Identifier: Apache-2.0
// The end of a runner's work: a summary of each name in the log, and every value in the results file.
#define KESTO_LOG_NAME "TraceRunner"
#include "platform/Platform.h"
#include "tracing/TraceRunner.h"
#include "utility/EndProcess.h"
#include "utility/LogCategories.h"

#include <algorithm>

std::filesystem::path KestoReportingTracingLogsDirectory()
{
    return platform::current().fileSystem.diagnosticLogRoot() / "Audio/Traces";
}

void TraceRunner::writeQuilldat()
{
    constexpr unsigned directoryPermissions = 0777;
    constexpr int exitStatus = 1;
    KESTO_LOG(KestoReportingTraceCategory(), Info, "Completed trace....In write perf data.... {}",
              traceResults_.size());
    const std::filesystem::path directory = KestoReportingTracingLogsDirectory();
    if (const auto made = platform::current().fileSystem.createDirectories(directory, directoryPermissions); !made)
        KESTO_LOG(KestoReportingTraceCategory(), Error, "can't create logging directory at {}: {}", directory.string(),
                  made.error().message());

    perfWriter_ = platform::current().performanceWriter.open(directory / resultsFileName, projectName, resultsVersion_);
    if (!perfWriter_) {
        KESTO_LOG(KestoReportingTraceCategory(), Info, "Failed to open quilldat writer");
        utility::endProcess(exitStatus);
    }
    for (const auto& traceWithResults : traceResults_) {
        printTraceResults(traceWithResults);
        for (const auto& [name, values] : traceWithResults.second)
            for (const std::uint64_t value : values)
                perfWriter_->write(name, static_cast<double>(value), platform::PerformanceUnit::Nanoseconds);
    }
    remarkWhatIsMissing();
    perfWriter_.reset();
}

// Readers of the file check these remarks before they rely on its records.
void TraceRunner::remarkWhatIsMissing()
{
    ledger::Ledger& ledger = platform::current().ledger;
    ledger.count(ledger::Counter::TraceEventsLost, lostEvents_);
    ledger.count(ledger::Counter::TraceIntervalsLost, lostIntervals_);
    ledger.count(ledger::Counter::TracePointsLost, lostPoints_);
    perfWriter_->remark("lostEvents", lostEvents_);
    perfWriter_->remark("lostIntervals", lostIntervals_);
    perfWriter_->remark("lostPoints", lostPoints_);
    if (!problem_.empty())
        perfWriter_->remark("problem", problem_);
}

void TraceRunner::printTraceResults(const TraceWithResults& results)
{
    for (const auto& [name, values] : results.second) {
        const auto [least, most] = std::ranges::minmax(values);
        KESTO_LOG(KestoReportingTraceCategory(), Info, "Writing out {} result for {}, min: {}, max: {} ", values.size(),
                  name, least, most);
    }
}
