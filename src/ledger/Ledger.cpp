// SPDX-License-Identifier: Apache-2.0
// Posting counts, and reading what stands in the ledger.
#include "ledger/Ledger.h"

#include <algorithm>
#include <ranges>
#include <utility>

namespace ledger {

Ledger::Ledger() : ownImage_(std::make_unique<LedgerImage>()), image_(*ownImage_)
{
    image_.begin({});
}

Ledger::Ledger(LedgerImage& image) : image_(image)
{
    image_.dropUncountedCulprits();
    countsAtStart_ = counts();
    const LargestCulprits known = image_.largestCulprits();
    for (std::size_t charge = 0; charge < chargeCount; ++charge)
        for (const auto& [culprit, count] : known[charge])
            culprits_[charge].emplace(culprit, count);
}

void Ledger::count(Counter counter, std::uint64_t number) noexcept
{
    if (number == 0)
        return;
    std::atomic_ref(image_.live[static_cast<std::size_t>(counter)]).fetch_add(number, std::memory_order_relaxed);
    reportChange();
}

void Ledger::count(Counter counter, const Culprit& culprit, std::uint64_t number)
{
    Tally tally;
    tally.add(counter, culprit, number);
    post(tally);
}

void Ledger::post(const Tally& tally, const std::optional<StoreState>& store)
{
    if (tally.empty() && !store)
        return;
    {
        const auto now = LastMinute::Clock::now();
        const foundation::Lock lock(lock_);
        charge(tally.charged());
        image_.add(tally, store);
        deliveries_.add(tally[Counter::Deliveries], now);
        events_.add(tally[Counter::Events], now);
    }
    reportChange();
}

void Ledger::charge(std::span<const Tally::Charged> charged)
{
    if (charged.empty())
        return;
    for (const auto& [kind, culprit, count] : charged) {
        charge(culprits_[static_cast<std::size_t>(kind)], culprit, count);
        charge(culpritsSinceStart_[static_cast<std::size_t>(kind)], culprit, count);
    }
    LargestCulprits largestOfAll;
    std::ranges::transform(culprits_, largestOfAll.begin(), largest);
    image_.replaceCulprits(largestOfAll);
}

void Ledger::charge(Culprits& culprits, const Culprit& culprit, std::uint64_t count)
{
    if (culprits.size() == mostCulprits && !culprits.contains(culprit))
        culprits.erase(std::ranges::min_element(culprits, {}, &Culprits::value_type::second));
    culprits[culprit] += count;
}

std::vector<CulpritCount> Ledger::largest(const Culprits& culprits)
{
    std::vector<CulpritCount> result(std::min(culprits.size(), culpritsKept));
    std::ranges::partial_sort_copy(
        std::views::transform(culprits, [](const auto& each) { return CulpritCount{each.first, each.second}; }), result,
        std::ranges::greater(), &CulpritCount::count, &CulpritCount::count);
    return result;
}

Tally::Counts Ledger::counts() const
{
    const LedgerImage::Slot& slot = image_.newest();
    Tally::Counts counts;
    for (std::size_t place = 0; place < counterCount; ++place)
        counts[place] = slot.counts[place] + std::atomic_ref(image_.live[place]).load(std::memory_order_relaxed);
    return counts;
}

Account Ledger::account() const
{
    const foundation::Lock lock(lock_);
    Account account{.began = image_.began, .counts = counts(), .store = image_.newest().store, .culprits = {}};
    std::ranges::transform(culprits_, account.culprits.begin(), largest);
    return account;
}

Account Ledger::sinceStart() const
{
    const foundation::Lock lock(lock_);
    Account account{.began = image_.began, .counts = counts(), .store = image_.newest().store, .culprits = {}};
    for (std::size_t place = 0; place < counterCount; ++place)
        account.counts[place] -= countsAtStart_[place];
    std::ranges::transform(culpritsSinceStart_, account.culprits.begin(), largest);
    return account;
}

Ledger::Rates Ledger::lastMinute() const
{
    const auto now = LastMinute::Clock::now();
    const foundation::Lock lock(lock_);
    return {.deliveries = deliveries_.sum(now), .events = events_.sum(now)};
}

void Ledger::callAtNextChange(std::move_only_function<void()> handler)
{
    const foundation::Lock lock(changeLock_);
    changeHandler_ = std::move(handler);
    isChangeAwaited_.store(true, std::memory_order_release);
}

void Ledger::reportChange() noexcept
{
    if (!isChangeAwaited_.load(std::memory_order_relaxed) || !isChangeAwaited_.exchange(false))
        return;
    std::move_only_function<void()> handler;
    {
        const foundation::Lock lock(changeLock_);
        handler = std::exchange(changeHandler_, nullptr);
    }
    if (handler)
        handler();
}

} // namespace ledger
