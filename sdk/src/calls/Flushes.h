// Callers that wait until what they gave has been answered.
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

    // Waits until everything that stood before `position` in the queue has been taken and answered, or lost. `ring`
    // tells the client's thread about it. May throw std::bad_alloc. Any thread but the client's.
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

    // The queue has been taken up to `readPosition`, its last call having the number `lastCall`. The client's thread.
    void serve(std::uint64_t readPosition, std::uint64_t lastCall, const CallTable& calls);
    // Ends all that wait now, and all that will ever wait. The client's thread.
    void endAll(kesto_status status);
    void close();

private:
    struct Flush {
        std::uint64_t position;
        std::optional<std::uint64_t> lastCall; // that has to be answered, once the position has been reached
        std::optional<kesto_status> result;
    };

    void endWaiting(kesto_status status) KESTO_REQUIRES(mutex_);

    foundation::Mutex mutex_;
    foundation::Condition changed_;
    std::vector<Flush*> waiting_ KESTO_GUARDED_BY(mutex_);
    bool isClosed_ KESTO_GUARDED_BY(mutex_) = false;
};

} // namespace libkesto
