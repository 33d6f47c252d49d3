// The client's thread: takes calls from the mailbox, sends them, hands out the answers, and makes a new connection
// when the old one is gone and the caller wants that.
//
// When a connection ends, everything that was taken and not answered is lost, and answered so, before anybody is told
// of the change: whoever hears of it starts from nothing.
#pragma once

#include "ClientSettings.h"
#include "Counters.h"
#include "calls/CallTable.h"
#include "calls/Flushes.h"
#include "calls/Mailbox.h"
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

class Courier {
public:
    using Clock = std::chrono::steady_clock;
    using Milliseconds = std::chrono::milliseconds;

    // How often the thread looks into the mailbox while messages come, and when none have come for a while.
    static constexpr Milliseconds shortestPause{5};
    static constexpr Milliseconds longestPause{100};
    // No further calls are taken while so much waits for the socket to take it.
    static constexpr std::size_t mostUnsentBytes = 64 * 1024;

    Courier(ClientSettings settings, Mailbox& mailbox, Flushes& flushes, Counters& counters);
    // Answers what callers put in after `run` had ended. The thread that frees the client.
    ~Courier();

    // Returns after `stop`, when everything has been answered. The client's thread.
    void run() noexcept;
    // Any thread.
    void stop() noexcept;
    [[nodiscard]] kesto_state state() const noexcept { return state_.load(); }
    // Any thread.
    [[nodiscard]] const AttachableEmitter* emitter() const noexcept { return settings_.emitter.get(); }

    // Whether the caller is being told of a change of state. What it gives then, on the client's thread, goes ahead of
    // what waits in the mailbox: a message that was sent while the connection was made finds the sessions that are made
    // with it.
    [[nodiscard]] bool isTellingState() const noexcept { return isTellingState_.load(std::memory_order_relaxed); }
    // Takes over the callback and the configuration's entries when it answers KESTO_OK. The client's thread.
    [[nodiscard]] kesto_status putFirst(const CallHead& head, std::string_view reporters,
                                        std::string_view entries) noexcept;

private:
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
    Flushes& flushes_;
    Counters& counters_;
    std::atomic<kesto_state> state_ = KESTO_STATE_CONNECTING;
    std::atomic<bool> isStopping_ = false;
    std::atomic<bool> isTellingState_ = false;

    // The client's thread's.
    ServiceConnection connection_;
    std::deque<std::string> firstCalls_; // records that go ahead of the mailbox's
    std::size_t firstCallsBytes_ = 0;
    CallTable calls_;
    foundation::CborDecoder decoder_;
    Call call_; // the one being taken; kept for its memory
    std::uint64_t lastCall_ = 0;
    std::set<kesto_reporter> startedReporters_;
    Milliseconds pause_ = shortestPause;
    Milliseconds retryPause_; // before the next attempt but one
    std::optional<Clock::time_point> retryAt_;
};

} // namespace libkesto
