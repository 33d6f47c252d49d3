// SPDX-License-Identifier: Apache-2.0
// The trace of a session: when a session is traced, with the parameters file that its configuration names.
#define KESTO_LOG_NAME "KestoReportingSession"
#include "platform/Platform.h"
#include "session/KestoReportingSession.h"
#include "tracing/TraceParams.h"
#include "tracing/TraceParamsParser.h"
#include "tracing/TraceRunner.h"
#include "utility/KestoReportingUtility.h"

#include <system_error>

const foundation::String KestoReportingTraceTypeKtrace("ktrace");

namespace {

constexpr std::string_view traceTypeKey = "KestoReportingTraceType";
constexpr std::string_view traceFileKey = "KestoReportingPellorinPlistFilePath";

bool allowsKernelTrace(const foundation::Dictionary& configuration)
{
    const foundation::Value* type = configuration.find(traceTypeKey);
    if (type == nullptr || type->isNull())
        return true;
    const auto text = type->string();
    return text && text->isSameObject(KestoReportingTraceTypeKtrace);
}

} // namespace

bool KestoReportingSession::mayBeTraced() const
{
    platform::Platform& platform = platform::current();
    return serviceType_ == AudioServiceTypeTest && platform.featureFlags.isEnabled("Sonalis", "Tracing")
        && platform.kernelTrace.isAvailable();
}

void KestoReportingSession::setupTracing(const std::optional<std::string>& fileName)
{
    if (!fileName) {
        KESTO_LOG(KestoReportingSessionCategory(), Error, "TracefileName empty. Failed to setup tracing");
        return;
    }
    tracingFileName_ = fileName;
    traceParams_ = TraceParamsParser(*fileName).loadTraceParams();
    try {
        traceRunner_ = std::make_unique<TraceRunner>();
    } catch (const std::system_error& error) { // no thread for its queue
        tracingFileName_.reset();
        traceParams_.reset();
        KESTO_LOG(KestoReportingSessionCategory(), Error, "session {} is not traced: {}", reporterID_,
                  error.code().message());
        return;
    }
    traceRunner_->createTraceFromTraceParams(traceParams_.get());
    startedTracing_ = false;
    KESTO_LOG(KestoReportingSessionCategory(), Info, "Setting up tracing for {}", serviceName_);
}

void KestoReportingSession::startTracing()
{
    if (startedTracing_ || !mayBeTraced())
        return;
    const foundation::Dictionary configuration = this->configuration();
    const foundation::Value* file = configuration.find(traceFileKey);
    if (!allowsKernelTrace(configuration) || file == nullptr || file->isNull())
        return;
    if (TraceRunner::numberOfRunners() >= TraceRunner::mostAtOnce) {
        KESTO_LOG(KestoReportingSessionCategory(), Error, "session {} is not traced: {} other sessions are",
                  reporterID_, TraceRunner::mostAtOnce);
        return;
    }
    const std::string path = file->text();
    if (path.size() > longestTracingFileName) {
        KESTO_LOG(KestoReportingSessionCategory(), Error,
                  "session {} is not traced: the path of its parameters file has {} bytes; a path has at most {}",
                  reporterID_, path.size(), longestTracingFileName);
        return;
    }
    KESTO_LOG(KestoReportingSessionCategory(), Debug, "Got the tracefile {}, setting up trace", path);
    setupTracing(path);
    if (!tracingFileName_)
        return;
    startedTracing_ = true;
    traceRunner_->runTraces();
}

// The trace that the session's stop stops, or null.
std::unique_ptr<TraceRunner> KestoReportingSession::takeRunningTrace()
{
    if (!startedTracing_ || !mayBeTraced() || !allowsKernelTrace(configuration()))
        return nullptr;
    startedTracing_ = false;
    traceParams_.reset();
    tracingFileName_.reset();
    return std::move(traceRunner_);
}
