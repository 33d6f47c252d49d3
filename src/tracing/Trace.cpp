// SPDX-License-Identifier: Apache-2.0
// Passes the events to each measurement and collects the results.
#include "tracing/Trace.h"

#include "utility/LogCategories.h"

void Trace::processTracepoints(const platform::KernelTraceSession& session, std::span<const trace_point> events)
{
    std::size_t results = 0;
    std::size_t eventsRead = 0;
    for (const auto& data : data_) {
        const bool isTooMuch = eventsRead != 0 && eventsRead + events.size() > mostEventsRead;
        if (results >= mostResults || isTooMuch) {
            ++intervalsLeftOut_;
            continue;
        }
        data->processTracepoints(session, events);
        results += data->getResults().size();
        eventsRead += events.size();
    }
    if (intervalsLeftOut_ != 0)
        KESTO_LOG(KestoReportingTraceCategory(), Error,
                  "trace {} has read {} events and has {} results; {} of its intervals are left out", name_, eventsRead,
                  results, intervalsLeftOut_);
}

TraceResults Trace::getResults()
{
    for (const auto& data : data_) {
        if (!data->hasResults())
            continue;
        auto& results = resultsByName_[data->name()];
        results.insert(results.end(), data->getResults().begin(), data->getResults().end());
    }
    return resultsByName_;
}
