// SPDX-License-Identifier: Apache-2.0
// The ledger: what came in, what became of it, and what was left out, why and by whose doing. There is one ledger in
// the process, and everything that drops, refuses or loses something counts it here.
//
// Counts that belong together are gathered in a Tally and posted at once. A single event, such as a new connection, is
// counted by itself.
#pragma once

#include "foundation/Mutex.h"
#include "ledger/LastMinute.h"
#include "ledger/LedgerImage.h"
#include "ledger/Workload.h"

#include <array>
#include <atomic>
#include <cstddef>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <span>

namespace ledger {

// Any thread.
class Ledger {
public:
    // Beyond so many culprits of a charge, a new one takes the place of the one with the smallest count.
    static constexpr std::size_t mostCulprits = 128;

    // Counts in its own memory.
    Ledger();
    // Counts in the image, which outlives it, and goes on from what that holds.
    explicit Ledger(LedgerImage& image);
    Ledger(const Ledger&) = delete;
    Ledger& operator=(const Ledger&) = delete;

    // Costs some nanoseconds.
    void count(Counter counter, std::uint64_t number = 1) noexcept;
    void count(Counter counter, const Culprit& culprit, std::uint64_t number = 1);
    // Costs some hundred nanoseconds.
    void post(const Tally& tally, const std::optional<StoreState>& store = std::nullopt);

    // What stands in the ledger now: since it began, and since the start of the process.
    [[nodiscard]] Account account() const;
    [[nodiscard]] Account sinceStart() const;
    // How many messages were delivered, and how many events were offered to the store, in the last minute.
    struct Rates {
        std::uint64_t deliveries = 0;
        std::uint64_t events = 0;
    };
    [[nodiscard]] Rates lastMinute() const;

    // Who makes the service work, since the start of the process.
    [[nodiscard]] Workloads& workloads() noexcept { return workloads_; }
    [[nodiscard]] const Workloads& workloads() const noexcept { return workloads_; }

    // Does the work while nothing is posted, so that it may move the image's bytes to another place behind the same
    // address. Single counts go on meanwhile.
    template <typename Work> void withoutPosts(Work work)
    {
        const foundation::Lock lock(lock_);
        work();
    }

    // The ledger calls the handler at the next change, on the thread that makes it, and then not again until it is set
    // again. The handler must not use the ledger.
    void callAtNextChange(std::move_only_function<void()> handler);

private:
    using Culprits = std::map<Culprit, std::uint64_t>;

    [[nodiscard]] Tally::Counts counts() const KESTO_REQUIRES(lock_);
    void charge(std::span<const Tally::Charged> charged) KESTO_REQUIRES(lock_);
    static void charge(Culprits& culprits, const Culprit& culprit, std::uint64_t count);
    [[nodiscard]] static std::vector<CulpritCount> largest(const Culprits& culprits);
    void reportChange() noexcept;

    const std::unique_ptr<LedgerImage> ownImage_;
    mutable foundation::Mutex lock_;
    LedgerImage& image_; // all but `live` only under the lock
    Tally::Counts countsAtStart_ = {};
    std::array<Culprits, chargeCount> culprits_ KESTO_GUARDED_BY(lock_); // since the ledger began
    std::array<Culprits, chargeCount> culpritsSinceStart_ KESTO_GUARDED_BY(lock_);
    LastMinute deliveries_ KESTO_GUARDED_BY(lock_);
    LastMinute events_ KESTO_GUARDED_BY(lock_);
    Workloads workloads_;
    std::atomic<bool> isChangeAwaited_ = false;
    std::move_only_function<void()> changeHandler_ KESTO_GUARDED_BY(changeLock_);
    foundation::Mutex changeLock_;
};

} // namespace ledger
