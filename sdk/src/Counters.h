// SPDX-License-Identifier: Apache-2.0
// Counts of sent, answered and lost messages, which can be read at any time.
#pragma once

#include "kesto/kesto.h"

#include <atomic>
#include <cstddef>
#include <cstdint>

namespace libkesto {

// One count. Any thread.
class Counter {
public:
    void operator++() noexcept { count_.fetch_add(1, std::memory_order_relaxed); }
    [[nodiscard]] std::uint64_t get() const noexcept { return count_.load(std::memory_order_relaxed); }

private:
    std::atomic<std::uint64_t> count_ = 0;
};

struct Counters {
    static constexpr std::size_t cacheLine = 64;

    // Callers change these.
    alignas(cacheLine) Counter queued;
    Counter droppedQueueFull;
    Counter droppedNotConnected;
    Counter droppedUnusable;
    // The client's thread changes these.
    alignas(cacheLine) Counter sent;
    Counter answered;
    Counter refused;
    Counter lost;
    Counter connections;
    Counter unexpectedAnswers;

    [[nodiscard]] kesto_statistics statistics() const noexcept
    {
        return {.queued = queued.get(),
                .sent = sent.get(),
                .answered = answered.get(),
                .refused = refused.get(),
                .lost = lost.get(),
                .dropped_queue_full = droppedQueueFull.get(),
                .dropped_not_connected = droppedNotConnected.get(),
                .dropped_unusable = droppedUnusable.get(),
                .connections = connections.get(),
                .unexpected_answers = unexpectedAnswers.get()};
    }
};

} // namespace libkesto
