// SPDX-License-Identifier: Apache-2.0
// The messages of one run of a session, from its start to its stop, and what is made of them.
//
// The session shares its run with the work that ends it, which may go on when the session itself has stopped
// (`RunEnd`). So a run knows nothing of its session but the ID, which its log lines need.
#pragma once

#include "foundation/Mutex.h"
#include "foundation/values/Value.h"
#include "ledger/Tally.h"
#include "session/MessageStore.h"
#include "session/StorageBudget.h"
#include "utility/KestoReportingUtility.h"
#include "utility/MessageKinds.h"
#include "utility/ServiceTraceCodes.h"

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <vector>

namespace session {

// Any thread, unless a comment says otherwise.
class Run {
public:
    Run(std::int64_t reporterID, std::shared_ptr<StorageBudget> budget);

    // What a session does with every message, in a run or not: normalises it, and records it by `record(message)`.
    template <typename Record>
    static void receive(std::int64_t reporterID, const foundation::Dictionary& message, AudioEventCategory category,
                        AudioEventType type, Record record)
    {
        KESTO_LOG(KestoReportingSessionCategory(), Debug, "sending message for session owned by {}", reporterID);
        record(utility::normaliseMessage(message, category, type));
        utility::emitTraceCode(utility::ServiceTraceCode::SessionMessageAccepted);
    }

    // Says whom the ledger charges with a message that is lost.
    using CulpritOf = std::function<ledger::Culprit()>;
    // Records the normalised message unless it repeats the previous one of its kind, and counts what became of it. True
    // if it was dropped as a repetition.
    bool record(ledger::Tally& tally, AudioEventCategory category, AudioEventType type,
                const foundation::Dictionary& message, const CulpritOf& culpritOf);
    // From now on large payloads are kept as they come: no analysis reads them any more (see `MessageStore`).
    void keepLargePayloadsAsTheyCome();

    // Each message as a dictionary of one entry, identifier to payload.
    [[nodiscard]] std::vector<foundation::Dictionary> messages() const;
    // How many messages of each kind it accepted.
    [[nodiscard]] foundation::Dictionary counts() const;
    // How many messages were lost for lack of memory.
    [[nodiscard]] std::uint64_t messagesLost() const;

    // The messages, without the lock, under which others would wait for a reader of a million of them. For the thread
    // that records.
    [[nodiscard]] const MessageStore& store() const { return store_; }
    // For every key of the messages, all its values, joined by commas; nothing without messages. If the budget has no
    // room for it, it is lost and logged like a message.
    [[nodiscard]] std::optional<foundation::Dictionary> createSummaryEvent(AudioServiceType serviceType);
    // On internal builds, writes the messages to a file below the diagnostic-log root. A failure is logged. For the
    // thread that records.
    void writeSummaryFile(AudioServiceType serviceType, const foundation::Dictionary& configuration) const;

private:
    const std::int64_t reporterID_;
    const std::shared_ptr<StorageBudget> budget_;
    mutable foundation::Mutex lock_;
    MessageStore store_; // changes under the lock
    std::uint64_t messagesLost_ KESTO_GUARDED_BY(lock_) = 0;
};

} // namespace session
