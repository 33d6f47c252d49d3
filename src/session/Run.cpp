// SPDX-License-Identifier: Apache-2.0
// What becomes of each message that a run gets.
#define KESTO_LOG_NAME "KestoReportingSession"
#include "session/Run.h"

#include "platform/Platform.h"
#include "utility/KestoReportingUtility.h"

#include <string>
#include <utility>

namespace session {

Run::Run(std::int64_t reporterID, std::shared_ptr<StorageBudget> budget)
    : reporterID_(reporterID),
      budget_(std::move(budget)),
      store_(budget_)
{
}

bool Run::record(ledger::Tally& tally, AudioEventCategory category, AudioEventType type,
                 const foundation::Dictionary& message, const CulpritOf& culpritOf)
{
    using ledger::Counter;
    tally.add(Counter::Deliveries);
    const foundation::Lock lock(lock_);
    switch (store_.record(category, type, message)) {
    case MessageStore::Outcome::Recorded: tally.add(Counter::Recorded); return false;
    case MessageStore::Outcome::Redundant:
        tally.add(Counter::Repeated);
        KESTO_LOG(KestoReportingSessionCategory(), Debug, "dropping redundant event");
        return true;
    case MessageStore::Outcome::Full: break;
    }
    tally.add(Counter::RefusedForMemory, culpritOf());
    if (messagesLost_++ == 0)
        KESTO_LOG(KestoReportingSessionCategory(), Error,
                  "no memory left for the messages of session {}; they are lost until sessions stop", reporterID_);
    return false;
}

void Run::keepLargePayloadsAsTheyCome()
{
    const foundation::Lock lock(lock_);
    store_.keepLargePayloadsAsTheyCome();
}

std::vector<foundation::Dictionary> Run::messages() const
{
    const foundation::Lock lock(lock_);
    std::vector<foundation::Dictionary> messages;
    store_.forEach([&](const MessageStore::Message& message) {
        messages.push_back({{foundation::String(store_.identifier(message)), message.payload.dictionary()}});
    });
    return messages;
}

foundation::Dictionary Run::counts() const
{
    const foundation::Lock lock(lock_);
    return store_.counts();
}

std::uint64_t Run::messagesLost() const
{
    const foundation::Lock lock(lock_);
    return messagesLost_;
}

} // namespace session
