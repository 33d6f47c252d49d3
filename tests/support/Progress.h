// SPDX-License-Identifier: Apache-2.0
// A state that threads share, and for which they can wait.
#pragma once

#include <chrono>
#include <condition_variable>
#include <mutex>

namespace support {

constexpr std::chrono::seconds longestWait{30}; // a test that waits this long fails

// Any thread.
class Progress {
public:
    // Changes the state that the predicates read.
    template <typename Change> void change(Change change)
    {
        const std::scoped_lock lock(mutex_);
        change();
        changed_.notify_all();
    }
    template <typename Predicate> [[nodiscard]] bool waitFor(Predicate predicate)
    {
        std::unique_lock lock(mutex_);
        return changed_.wait_for(lock, longestWait, predicate);
    }
    template <typename Look> auto look(Look look)
    {
        const std::scoped_lock lock(mutex_);
        return look();
    }

private:
    std::mutex mutex_;
    std::condition_variable changed_;
};

} // namespace support
