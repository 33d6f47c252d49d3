// A session's handling of a message: it normalises it, compares it with the previous one of its kind, and records it.
#define KESTO_LOG_NAME "KestoReportingSession"
#include "platform/Platform.h"
#include "session/KestoReportingSession.h"
#include "utility/KestoReportingUtility.h"
#include "utility/ServerQueue.h"
#include "utility/ServiceTraceCodes.h"

#include <chrono>
#include <random>

void KestoReportingSession::sendMessage(ledger::Tally& tally, const std::optional<foundation::Dictionary>& message,
                                        AudioEventCategory category, AudioEventType type, [[maybe_unused]] bool sync,
                                        const MessageReply& reply)
{
    utility::assertServerQueue();
    KESTO_LOG(KestoReportingSessionCategory(), Debug, "sending message for session owned by {}", reporterID_);
    createMessageIdentifier(tally, category, type,
                            utility::normaliseMessage(message.value_or(foundation::Dictionary()), category, type));
    utility::emitTraceCode(utility::ServiceTraceCode::SessionMessageAccepted);
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
    using ledger::Counter;
    tally.add(Counter::Deliveries);
    const foundation::Lock lock(nestedAggregatedPayloadDataLock_);
    if (!nestedAggregatedPayloadData_) {
        tally.add(Counter::Inert);
        return false;
    }
    switch (nestedAggregatedPayloadData_->record(category, type, message)) {
    case session::MessageStore::Outcome::Recorded: tally.add(Counter::Recorded); return false;
    case session::MessageStore::Outcome::Redundant:
        tally.add(Counter::Repeated);
        KESTO_LOG(KestoReportingSessionCategory(), Debug, "dropping redundant event");
        return true;
    case session::MessageStore::Outcome::Full: break;
    }
    tally.add(Counter::RefusedForMemory, culprit());
    if (messagesLost_++ == 0)
        KESTO_LOG(KestoReportingSessionCategory(), Error,
                  "no memory left for the messages of session {}; they are lost until sessions stop", reporterID_);
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
    const foundation::Lock lock(nestedAggregatedPayloadDataLock_);
    if (!nestedAggregatedPayloadData_)
        return std::nullopt;
    const session::MessageStore& store = *nestedAggregatedPayloadData_;
    std::vector<foundation::Dictionary> messages;
    store.forEach([&](const session::MessageStore::Message& message) {
        messages.push_back({{foundation::String(store.identifier(message)), message.payload.dictionary()}});
    });
    return messages;
}

std::optional<foundation::Dictionary> KestoReportingSession::messageIdentifierCounts() const
{
    const foundation::Lock lock(nestedAggregatedPayloadDataLock_);
    if (!nestedAggregatedPayloadData_)
        return std::nullopt;
    return nestedAggregatedPayloadData_->counts();
}
