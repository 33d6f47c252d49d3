// SPDX-License-Identifier: Apache-2.0
// The life of a trace: set up, started, ended, completed.
#include "tracing/TraceRunner.h"

#include "foundation/text/Format.h"
#include "platform/Platform.h"
#include "tracing/TraceParams.h"
#include "utility/LogCategories.h"

#include <atomic>
#include <cassert>

namespace {

constinit std::atomic<std::size_t> runners{0};

} // namespace

std::size_t TraceRunner::numberOfRunners() noexcept
{
    return runners;
}

TraceRunner::TraceRunner()
{
    platform::WorkQueues& queues = platform::current().workQueues;
    tracingSemaphore_ = queues.makeSemaphore(0);
    tracingQueue_ = queues.makeSerialQueue("Tracing Queue", {});
    ++runners;
}

TraceRunner::~TraceRunner()
{
    --runners;
}

void TraceRunner::createTraceFromTraceParams(const TraceParams* params)
{
    if (params == nullptr) {
        KESTO_LOG(KestoReportingTraceCategory(), Default, "Attempted to add nullptr to trace runner");
        return;
    }
    lostPoints_ += params->leftOut;
    keepProblem(params->problem);
    auto trace = std::make_unique<Trace>(params->name, params->traceType == TraceParams::kernelTrace);
    for (const auto& point : params->traceDataParams)
        trace->addTraceDataToCollect(
            std::make_unique<TraceInterval>(point.name, point.beginCode, point.endCode, point.matchByThread));
    traceEvents_.emplace(trace.get(), std::make_shared<TraceEvents>());
    traces_.push_back(std::move(trace));
}

void TraceRunner::runTraces()
{
    KESTO_LOG(KestoReportingTraceCategory(), Info, "Number of traces to perform: {}", traces_.size());
    for (const auto& trace : traces_) {
        KESTO_LOG(KestoReportingTraceCategory(), Info, "Performing trace : {}", trace->name());
        if (!trace->collectKernelTrace())
            continue;
        KESTO_LOG(KestoReportingTraceCategory(), Info, "Setting up tracing: {}", trace->name());
        setupTracing(*trace);
        KESTO_LOG(KestoReportingTraceCategory(), Info, "Starting tracing: {}", trace->name());
        startTracing(*trace);
    }
}

void TraceRunner::setupTracing(Trace& trace)
{
    auto session = platform::current().kernelTrace.createTraceSession();
    if (!session) {
        fail(foundation::format("the kernel trace is not available; {} collects no events", trace.name()));
        return;
    }
    session->setCompletionHandler([this, &trace] { tracingCompletionHandler(trace); });
    session->enableWallTimes(true);
    traceSessions_.insert_or_assign(&trace, std::move(session));
}

void TraceRunner::startTracing(Trace& trace)
{
    const auto session = traceSessions_.find(&trace);
    if (session == traceSessions_.end())
        return;
    const auto append = [events = traceEvents_.at(&trace)](const trace_point& event) { events->append(event); };
    if (const int error = session->second->filterEventRange(firstTraceCode, lastTraceCode, append); error != 0)
        fail(foundation::format("Could not set up ktrace range, error: {}", error));
    if (const int error = session->second->start(tracingQueue_); error != 0)
        fail(foundation::format("Could not start ktrace session, error: {}", error));
}

void TraceRunner::fail(std::string problem)
{
    KESTO_LOG(KestoReportingTraceCategory(), Error, "{}", problem);
    keepProblem(std::move(problem));
}

void TraceRunner::keepProblem(std::string problem)
{
    if (problem_.empty())
        problem_ = std::move(problem);
}

void TraceRunner::beginToStop()
{
    if (!std::exchange(isStopping_, true) && !traces_.empty())
        submitStop(*traces_.front());
}

void TraceRunner::stopTracingandProcessResults()
{
    beginToStop();
    for (const auto& trace : traces_) {
        if (trace != traces_.front())
            submitStop(*trace);
        tracingSemaphore_->wait();
        if (trace->collectKernelTrace())
            traceResults_.try_emplace(trace.get(), trace->getResults());
        KESTO_LOG(KestoReportingTraceCategory(), Info, "Completed trace.... {},   {} ", completedTraceCount_,
                  traces_.size());
    }
    writeQuilldat();
}

void TraceRunner::submitStop(Trace& trace)
{
    KESTO_LOG(KestoReportingTraceCategory(), Info, "Tearing down trace :  {}", trace.name());
    tracingQueue_->submit([this, &trace] {
        if (trace.collectKernelTrace())
            stopTracing(trace);
        else
            tracingCompletionHandler(trace);
    });
}

void TraceRunner::stopTracing(Trace& trace)
{
    assert(tracingQueue_->isCurrent());
    if (const auto session = traceSessions_.find(&trace); session != traceSessions_.end())
        session->second->end();
    else
        tracingCompletionHandler(trace); // no session will call it
}

void TraceRunner::tracingCompletionHandler(Trace& trace)
{
    assert(tracingQueue_->isCurrent());
    if (trace.collectKernelTrace()) {
        processEvents(trace);
        tearDownTracing(trace);
    }
    ++completedTraceCount_;
    tracingSemaphore_->signal();
}

void TraceRunner::processEvents(Trace& trace)
{
    const auto session = traceSessions_.find(&trace);
    if (session == traceSessions_.end())
        return;
    const TraceEvents& events = *traceEvents_.at(&trace);
    if (events.lost() != 0)
        KESTO_LOG(KestoReportingTraceCategory(), Error, "trace {} lost {} events for lack of memory", trace.name(),
                  events.lost());
    trace.processTracepoints(*session->second, events.all());
    lostEvents_ += session->second->lostEvents() + events.lost();
    lostIntervals_ += trace.intervalsLeftOut();
}

void TraceRunner::tearDownTracing(Trace& trace)
{
    traceSessions_.erase(&trace);
}
