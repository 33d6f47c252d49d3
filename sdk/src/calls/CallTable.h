// SPDX-License-Identifier: Apache-2.0
// The calls that wait for answers, and how many answers each can still get.
//
// Nearly all calls get one answer. Asking for the service type of reporter 0 gets two. A start is answered when its run
// ends, a second time if a trace ran, and never if its session is destroyed or replaced. But when a later stop, destroy
// or create of the same reporter is answered, no further answer to the start can come.
#pragma once

#include "Callback.h"
#include "Counters.h"
#include "wire/CallFrames.h"

#include <cstdint>
#include <map>
#include <set>
#include <utility>
#include <vector>

namespace libkesto {

// Answers a call with an error of the library, even if the call never reached a table.
void answerWithError(std::uint64_t number, kesto_operation operation, kesto_reporter reporter, const Callback& callback,
                     kesto_status status);

// The client's thread, which also calls the callbacks here.
class CallTable {
public:
    // The limit of starts that were answered and may be answered again. Beyond it a start gets no second answer.
    static constexpr std::size_t mostAnsweredStarts = 16 * 1024;

    explicit CallTable(Counters& counters) noexcept : counters_(counters) { }

    // Takes over the callback unless it throws.
    void add(std::uint64_t number, const CallHead& head);

    // Gives the answer to its call. False if no service answers such a call like this.
    [[nodiscard]] bool answer(const AnswerFrame& frame);

    // Answers all waiting calls with the error, and forgets them.
    void endAll(kesto_status status);

    // Without starts, which may stay unanswered for days.
    [[nodiscard]] std::size_t unanswered() const noexcept { return calls_.size(); }
    [[nodiscard]] bool isAnsweredUpTo(std::uint64_t number) const noexcept
    {
        return calls_.empty() || calls_.begin()->first > number;
    }

private:
    struct PendingCall {
        explicit PendingCall(const CallHead& head) noexcept;

        kesto_operation operation;
        kesto_reporter reporter;
        unsigned answersLeft; // of starts: the number that they must get
        Callback callback;
    };
    using Calls = std::map<std::uint64_t, PendingCall>;

    [[nodiscard]] bool deliver(const AnswerFrame& frame, const PendingCall& call);
    void deliverToStart(Calls::iterator start);
    void endStarts(kesto_reporter reporter, std::uint64_t before);
    void eraseStart(Calls::iterator start);
    [[nodiscard]] bool hasOlderStart(kesto_reporter reporter, std::uint64_t number) const;

    Calls calls_; // without the starts
    Calls starts_;
    std::set<std::pair<kesto_reporter, std::uint64_t>> startsByReporter_;
    std::vector<kesto_reporter> reporters_; // of the answer being delivered
    Counters& counters_;
};

} // namespace libkesto
