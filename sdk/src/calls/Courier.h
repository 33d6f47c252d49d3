// SPDX-License-Identifier: Apache-2.0
// The client's thread: takes calls from the mailbox, sends them, hands out the answers and, if the caller wants that,
// connects again after a connection has ended.
//
// When a connection ends, all unanswered calls are lost. They get their error before the change of state is reported,
// so that the state callback starts from nothing.
#pragma once

#include "ClientSettings.h"
#include "Counters.h"
#include "calls/CallTable.h"
#include "calls/Flushes.h"
#include "calls/Mailbox.h"
#include "calls/Streams.h"
#include "wire/ServiceConnection.h"

#include <atomic>
#include <chrono>
#include <cstdint>
#include <deque>
#include <optional>
#include <set>
#include <string>
#include <string_view>

namespace libkesto {

class Courier final : private CallTaker {
public:
    using Clock = std::chrono::steady_clock;
    using Milliseconds = std::chrono::milliseconds;

    // How often the thread looks into the mailbox while messages come, and after a time without messages.
    static constexpr Milliseconds shortestPause{5};
    static constexpr Milliseconds longestPause{100};
    // It takes no further calls while the socket has not accepted so many bytes.
    static constexpr std::size_t mostUnsentBytes = 64 * 1024;

    Courier(ClientSettings settings, Mailbox& mailbox, Streams& streams, Flushes& flushes, Counters& counters);

    // Returns after `stop`, when every call has its answer. The client's thread.
    void run() noexcept;
    // Answers the calls that were put in after `run` returned. The thread that frees the client, after that.
    void answerLateCalls() noexcept { loseWaitingCalls(KESTO_CLOSED); }
    // Any thread.
    void stop() noexcept;
    [[nodiscard]] kesto_state state() const noexcept { return state_.load(); }
    // Any thread.
    [[nodiscard]] const AttachableEmitter* emitter() const noexcept { return settings_.emitter.get(); }

    // Whether the state callback is running. Its calls, on the client's thread, go ahead of those in the mailbox: a
    // message that was sent while the client was connecting then finds the sessions that the callback creates.
    [[nodiscard]] bool isReportingState() const noexcept { return isReportingState_.load(std::memory_order_relaxed); }
    // Takes over the callback and the configuration's entries if it returns KESTO_OK. The client's thread.
    [[nodiscard]] kesto_status putFirst(const CallHead& head, std::string_view reporters = {},
                                        std::string_view entries = {}, std::string_view stamps = {}) noexcept;

private:
    void sendTheRest() noexcept;
    void step();
    void connect();
    void exchange();
    [[nodiscard]] std::expected<std::size_t, ConnectionFailure> receive();
    [[nodiscard]] bool take(const AnswerFrame& answer);
    void pauseBeforeRetry();
    void disconnect(ConnectionFailure failure);
    void close() noexcept;

    [[nodiscard]] bool canTakeCalls() const noexcept;
    void takeCalls();
    void takeRecord(std::string_view record);
    void takeCall(const Call& call) override; // of a stream
    void putOnTheWay(const Call& call);
    [[nodiscard]] std::optional<std::string_view> nextRecord() noexcept;
    void popRecord() noexcept;
    void rememberWhetherStarted(const CallHead& head);
    void loseWaitingCalls(kesto_status status) noexcept;

    [[nodiscard]] bool wait();
    [[nodiscard]] Milliseconds longestWait() noexcept;
    [[nodiscard]] bool looksByItself() const noexcept;
    void changeState(kesto_state state, ConnectionFailure failure = {KESTO_OK});

    const ClientSettings settings_;
    Mailbox& mailbox_;
    Streams& streams_;
    Flushes& flushes_;
    Counters& counters_;
    std::atomic<kesto_state> state_ = KESTO_STATE_CONNECTING;
    std::atomic<bool> isStopping_ = false;
    std::atomic<bool> isReportingState_ = false;

    // Only for the client's thread.
    ServiceConnection connection_;
    std::deque<std::string> firstCalls_; // go ahead of those in the mailbox
    std::size_t firstCallsBytes_ = 0;
    CallTable calls_;
    foundation::CborDecoder decoder_;
    Call call_; // the call being taken; a member, so that its memory is used again
    std::uint64_t lastCall_ = 0;
    std::set<kesto_reporter> startedReporters_;
    Milliseconds pause_ = shortestPause;
    Milliseconds retryPause_; // the pause after the next failure
    std::optional<Clock::time_point> retryAt_;
};

} // namespace libkesto
