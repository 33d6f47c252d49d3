// SPDX-License-Identifier: Apache-2.0
// A session's handling of a message: it normalises it, compares it with the previous one of its kind, and records it.
#define KESTO_LOG_NAME "KestoReportingSession"
#include "platform/Platform.h"
#include "session/KestoReportingSession.h"
#include "utility/KestoReportingUtility.h"
#include "utility/ServerQueue.h"

#include <chrono>
#include <random>

void KestoReportingSession::sendMessage(ledger::Tally& tally, const std::optional<foundation::Dictionary>& message,
                                        AudioEventCategory category, AudioEventType type, [[maybe_unused]] bool sync,
                                        const MessageReply& reply)
{
    utility::assertServerQueue();
    session::Run::receive(
        reporterID_, message.value_or(foundation::Dictionary()), category, type,
        [&](const foundation::Dictionary& normalised) { createMessageIdentifier(tally, category, type, normalised); });
    if (reply)
        reply(std::nullopt);
}

void KestoReportingSession::sendMessage(ledger::Tally& tally, const std::optional<foundation::Dictionary>& message,
                                        AudioEventCategory category, AudioEventType type, const MessageReply& reply)
{
    sendMessage(tally, message, category, type, false, reply);
}

bool KestoReportingSession::createMessageIdentifier(ledger::Tally& tally, AudioEventCategory category,
                                                    AudioEventType type, const foundation::Dictionary& message)
{
    const foundation::Lock lock(runLock_);
    if (run_)
        return run_->record(tally, category, type, message, [this] { return culprit(); });
    tally.add(ledger::Counter::Deliveries);
    tally.add(ledger::Counter::Inert);
    return false;
}

void KestoReportingSession::sendSingleMessage(const foundation::Dictionary&, AudioEventCategory, AudioEventType,
                                              AudioServiceType serviceType, const foundation::Dictionary&,
                                              const MessageReply&)
{
    constexpr std::chrono::nanoseconds delay(1'000'000'000);
    constexpr std::int64_t mostDelta = 59;
    thread_local std::minstd_rand random{std::random_device()()};
    const std::int64_t delta =
        serviceType == AudioServiceTypeAlarms ? std::uniform_int_distribution<std::int64_t>(0, mostDelta)(random) : 0;
    KESTO_LOG(KestoReportingSessionCategory(), Debug, "sending single message after delta {} for service {}", delta,
              serviceType);
    platform::WorkQueues& queues = platform::current().workQueues;
    queues.submitAfter(delay, queues.backgroundQueue(), [] { });
}

std::optional<std::vector<foundation::Dictionary>> KestoReportingSession::nestedAggregatedPayloadData() const
{
    const auto run = this->run();
    return run ? std::optional(run->messages()) : std::nullopt;
}

std::optional<foundation::Dictionary> KestoReportingSession::messageIdentifierCounts() const
{
    const auto run = this->run();
    return run ? std::optional(run->counts()) : std::nullopt;
}
