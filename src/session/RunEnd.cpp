// SPDX-License-Identifier: Apache-2.0
// The steps of a run's end.
#define KESTO_LOG_NAME "KestoReportingSession"
#include "session/RunEnd.h"

#include "platform/Platform.h"
#include "session/KestoReportingSession.h"
#include "sinks/KestoReportingFennicBridge.h"
#include "tracing/TraceRunner.h"
#include "utility/KestoReportingUtility.h"

#include <optional>
#include <utility>

namespace session {

RunEnd::RunEnd(Facts facts, std::shared_ptr<Run> run, std::unique_ptr<TraceRunner> trace)
    : facts_(std::move(facts)),
      run_(std::move(run)),
      trace_(std::move(trace)),
      volumeShare_(facts_.budget)
{
}

RunEnd::~RunEnd() = default;

void RunEnd::makeVolumeEvents()
{
    const auto application = KestoReportingUtilityRetrieveAppName(facts_.configuration);
    const auto process = application.isNull() ? std::nullopt : std::optional(application);
    const double minimumPlaytime = KestoReportingUtilityVolumeMinimumPlayingTime(facts_.serviceType);
    volumeEvents_ = KestoReportingSession::createVolumeMessages(run_->store(), process, minimumPlaytime, volumeShare_);
    if (volumeEvents_.empty())
        return;
    KESTO_LOG(KestoReportingSessionCategory(), Default, "sending volume event for reporter {}", facts_.reporterID);
    std::size_t roughBytes = 0;
    for (const auto& event : volumeEvents_)
        roughBytes += event.roughBytes();
    paidForAByte_ = static_cast<double>(volumeShare_.bytes()) / static_cast<double>(roughBytes);
}

void RunEnd::sendVolumeEvent(platform::Turn& turn, const std::shared_ptr<sinks::SinkSession>& session)
{
    const auto event = std::exchange(volumeEvents_[nextVolumeEvent_++], {}); // freed as soon as the store has it
    volumeShare_.shrink(static_cast<std::size_t>(static_cast<double>(event.roughBytes()) * paidForAByte_));
    send(turn.tally, event, AudioEventCategoryVolume, AudioEventTypeSummary);
    KestoReportingFennicBridge::handleEvent(turn, event, AudioEventCategoryVolume, AudioEventTypeSummary, session);
}

void RunEnd::summarise()
{
    volumeEvents_ = {};
    volumeShare_.shrink(volumeShare_.bytes());
    run_->writeSummaryFile(facts_.serviceType, facts_.configuration);
    if (const auto summary = run_->createSummaryEvent(facts_.serviceType)) {
        KESTO_LOG(KestoReportingSessionCategory(), Default, "sending summary event for reporter {}", facts_.reporterID);
        run_->keepLargePayloadsAsTheyCome();
        send(tally_, *summary, AudioEventCategoryUndefined, AudioEventTypeUnknown);
    }
    messagesLost_ = run_->messagesLost();
}

void RunEnd::beginToStopTrace()
{
    if (trace_)
        trace_->beginToStop();
}

void RunEnd::stopTrace()
{
    if (const auto trace = std::move(trace_))
        trace->stopTracingandProcessResults();
}

void RunEnd::send(ledger::Tally& tally, const foundation::Dictionary& message, AudioEventCategory category,
                  AudioEventType type)
{
    Run::receive(facts_.reporterID, message, category, type, [&](const foundation::Dictionary& normalised) {
        run_->record(tally, category, type, normalised, [this] { return facts_.culprit; });
    });
}

} // namespace session
