// The calls that wait for answers, and what is known about how many answers each will get.
//
// Nearly all calls get one. Asking for the service type of reporter 0 gets two. A start is answered when its run
// ends, a second time if a trace ran, and never when its session is destroyed or replaced; but whatever the service
// had to say about it has been said when a later stop, destroy or create of that reporter is answered.
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

// Answers a call with an error of the library's own. For calls that never reached a table, too.
void answerWithError(std::uint64_t number, kesto_operation operation, kesto_reporter reporter, const Callback& callback,
                     kesto_status status);

// The client's thread. Callbacks are called from here.
class CallTable {
public:
    // Starts that were answered and may be answered again. Who has more of them gets no second answers.
    static constexpr std::size_t mostAnsweredStarts = 16 * 1024;

    explicit CallTable(Counters& counters) noexcept : counters_(counters) { }

    // Takes over the callback, unless it throws.
    void add(std::uint64_t number, const CallHead& head);

    // Hands an answer to the call that it is for. False when no service answers such a call like that.
    [[nodiscard]] bool answer(const AnswerFrame& frame);

    // Answers what is unanswered with an error, and forgets everything.
    void endAll(kesto_status status);

    // Starts aside, which may stay unanswered for days.
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
        unsigned answersLeft; // of starts: how many they must get
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
