// SPDX-License-Identifier: Apache-2.0
// Callers that wait until their calls are answered.
#pragma once

#include "foundation/Mutex.h"
#include "kesto/kesto.h"

#include <chrono>
#include <cstdint>
#include <optional>
#include <vector>

namespace libkesto {

class CallTable;

class Flushes {
public:
    using Deadline = std::chrono::steady_clock::time_point;

    // Waits until everything before `position` in the queue is taken and answered, or lost. `ring` wakes the client's
    // thread for this. May throw std::bad_alloc. Any thread except the client's.
    template <typename Ring> kesto_status wait(std::uint64_t position, Deadline deadline, Ring ring)
    {
        const foundation::Lock lock(mutex_);
        if (isClosed_)
            return KESTO_CLOSED;
        Flush flush{position, {}, {}};
        waiting_.push_back(&flush);
        ring();
        while (!flush.result && std::chrono::steady_clock::now() < deadline)
            changed_.waitUntil(mutex_, deadline);
        std::erase(waiting_, &flush);
        return flush.result.value_or(KESTO_TIMED_OUT);
    }

    // The thread has taken the queue up to `readPosition`, and the last call had the number `lastCall`. The client's
    // thread.
    void serve(std::uint64_t readPosition, std::uint64_t lastCall, const CallTable& calls);
    // `endAll` ends all flushes that wait now; `close` also ends all later ones. The client's thread.
    void endAll(kesto_status status);
    void close();

private:
    struct Flush {
        std::uint64_t position;
        std::optional<std::uint64_t> lastCall; // the call to be answered; set when the position has been reached
        std::optional<kesto_status> result;
    };

    void endWaiting(kesto_status status) KESTO_REQUIRES(mutex_);

    foundation::Mutex mutex_;
    foundation::Condition changed_;
    std::vector<Flush*> waiting_ KESTO_GUARDED_BY(mutex_);
    bool isClosed_ KESTO_GUARDED_BY(mutex_) = false;
};

} // namespace libkesto
