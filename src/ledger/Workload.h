// SPDX-License-Identifier: Apache-2.0
// Who makes the service work: how many calls each process made, how long they took, and how many bytes came from it.
//
// Each client has a workload while it is connected. The totals of those that went are kept by user and process: beyond
// a number of them, the one that took the least time becomes one of the others, which have no name.
#pragma once

#include "foundation/Mutex.h"

#include <atomic>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <utility>
#include <vector>

namespace ledger {

struct Work {
    std::uint64_t calls = 0;
    std::chrono::nanoseconds time{}; // on the server queue
    std::uint64_t bytes = 0; // received

    Work& operator+=(const Work& other) noexcept;
    friend bool operator==(const Work&, const Work&) = default;
};

// The users and processes that took the most time, the largest first, and the rest together.
struct WorkByWhom {
    struct Entry {
        std::uint32_t user;
        std::string process; // its name, from the kernel; empty until it is known
        Work work;
    };
    std::vector<Entry> largest;
    Work others;
};

// What one client makes the service do.
class Workload {
public:
    // The thread that reads from the client.
    void received(std::uint64_t calls, std::uint64_t bytes) noexcept
    {
        add(calls_, calls);
        add(bytes_, bytes);
    }
    // One thread at a time.
    void took(std::chrono::nanoseconds time) noexcept { add(nanoseconds_, static_cast<std::uint64_t>(time.count())); }
    // Any thread.
    [[nodiscard]] Work work() const noexcept;

private:
    // Each number has one writer at a time.
    static void add(std::atomic<std::uint64_t>& number, std::uint64_t more) noexcept
    {
        number.store(number.load(std::memory_order_relaxed) + more, std::memory_order_relaxed);
    }

    std::atomic<std::uint64_t> calls_ = 0;
    std::atomic<std::uint64_t> nanoseconds_ = 0;
    std::atomic<std::uint64_t> bytes_ = 0;
};

// Any thread.
class Workloads {
public:
    static constexpr std::size_t mostGone = 128;
    static constexpr std::size_t mostNamed = 10;

    // A new one for a client of the user. When its last owner releases it, it is one of those that went.
    [[nodiscard]] std::shared_ptr<Workload> open(std::uint32_t user);
    // The name of the client's process.
    void setProcess(const Workload& workload, std::string process);
    [[nodiscard]] WorkByWhom byWhom() const;

private:
    using Name = std::pair<std::uint32_t, std::string>; // user and process
    using Works = std::map<Name, Work>;

    struct State {
        foundation::Mutex lock;
        std::map<const Workload*, Name> present KESTO_GUARDED_BY(lock);
        Works gone KESTO_GUARDED_BY(lock);
        Work others KESTO_GUARDED_BY(lock); // that went and have no name any more

        void close(const Workload& workload);
    };

    const std::shared_ptr<State> state_ = std::make_shared<State>(); // each workload owns it, too
};

} // namespace ledger
