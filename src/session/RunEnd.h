// SPDX-License-Identifier: Apache-2.0
// What a session's stop makes of its run, step by step: the volume events, on internal builds the file, and the summary
// event; then the messages are let go, and the trace stops.
//
// With a million messages this takes a second, for which no other client should wait. So the end of a run knows what
// the session was when it stopped, and does not need the session: its long steps may run on a thread of their own. Only
// handing over the volume events and the counts needs turns of the server queue.
#pragma once

#include "foundation/values/Value.h"
#include "ledger/Tally.h"
#include "session/Run.h"
#include "session/StorageBudget.h"
#include "sinks/SinkSession.h"

#include <cstdint>
#include <memory>
#include <vector>

class TraceRunner;

namespace session {

// One thread at a time. Call the steps in their order, each once.
class RunEnd {
public:
    // The session, as it was when it stopped.
    struct Facts {
        std::int64_t reporterID;
        AudioServiceType serviceType;
        foundation::Dictionary configuration;
        ledger::Culprit culprit;
        std::shared_ptr<StorageBudget> budget;
    };
    // The trace, if there is one, is running.
    RunEnd(Facts facts, std::shared_ptr<Run> run, std::unique_ptr<TraceRunner> trace);
    ~RunEnd();
    RunEnd(const RunEnd&) = delete;
    RunEnd& operator=(const RunEnd&) = delete;

    // 1. Derives the volume events. Any thread.
    void makeVolumeEvents();
    [[nodiscard]] bool hasVolumeEvents() const { return nextVolumeEvent_ < volumeEvents_.size(); }
    // 2. Records the next volume event and hands it to the analytics bridge, until none is left. Server queue.
    void sendVolumeEvent(platform::Turn& turn, const std::shared_ptr<sinks::SinkSession>& session);
    // 3. Writes the file and records the summary event. Any thread.
    void summarise();
    // 4. Lets go of the messages; leave it out where the session still has them. Any thread.
    void letGo() { run_.reset(); }
    // 5. Tells the trace to stop, without waiting for it. Any thread.
    void beginToStopTrace();
    // The same, if it was not told yet; waits for its events and writes its results. A thread that may wait.
    void stopTrace();
    [[nodiscard]] bool isTraced() const { return trace_ != nullptr; }
    // 6. Adds what the third step counted, and says how many messages of the run were lost for lack of memory.
    void addTo(ledger::Tally& tally) { tally.takeFrom(tally_); }
    [[nodiscard]] std::uint64_t messagesLost() const { return messagesLost_; }

private:
    void send(ledger::Tally& tally, const foundation::Dictionary& message, AudioEventCategory category,
              AudioEventType type);

    const Facts facts_;
    std::shared_ptr<Run> run_;
    std::unique_ptr<TraceRunner> trace_;
    StorageShare volumeShare_;
    std::vector<foundation::Dictionary> volumeEvents_;
    std::size_t nextVolumeEvent_ = 0;
    double paidForAByte_ = 0; // of the volume events
    ledger::Tally tally_; // of the third step, which has no turn
    std::uint64_t messagesLost_ = 0;
};

} // namespace session
