// SPDX-License-Identifier: Apache-2.0
// Reading and writing the slots.
#include "ledger/LedgerImage.h"

#include <algorithm>
#include <atomic>
#include <cassert>
#include <cstring>
#include <limits>
#include <string_view>
#include <type_traits>

namespace ledger {
namespace {

static_assert(std::is_trivially_copyable_v<LedgerImage>);
static_assert(counterCount <= LedgerImage::mostCounters);

// A checksum tells a slot that a loss of power cut off from a whole one. It is a weighted sum, so that a change of few
// words changes it cheaply.
constexpr std::uint64_t weight(std::size_t place) noexcept
{
    return (2 * place + 1) * 0x9E3779B97F4A7C15;
}

template <typename Content> std::uint64_t weightedSum(const Content& content, std::size_t firstPlace)
{
    static_assert(std::is_trivially_copyable_v<Content> && sizeof content % sizeof(std::uint64_t) == 0);
    std::array<std::uint64_t, sizeof content / sizeof(std::uint64_t)> words;
    std::memcpy(words.data(), &content, sizeof content);
    std::uint64_t sum = 0;
    for (std::size_t place = 0; place < words.size(); ++place)
        sum += words[place] * weight(firstPlace + place);
    return sum;
}

constexpr std::size_t placeOfStore = LedgerImage::mostCounters;
constexpr std::uint64_t weightOfSequence = weight(placeOfStore + sizeof(StoreState) / sizeof(std::uint64_t));

std::uint64_t checksumOf(const LedgerImage::Slot& slot)
{
    return weightedSum(slot.counts, 0) + weightedSum(slot.store, placeOfStore) + slot.sequence * weightOfSequence;
}

std::uint64_t checksumOf(const LedgerImage::CulpritSlot& slot)
{
    return weightedSum(slot.rows, 1) + slot.sequence * weight(0);
}

// The whole slot with the higher number that is not above `last`; null if there is none.
template <typename Slot>
const Slot* newestWhole(const std::array<Slot, 2>& slots,
                        std::uint64_t last = std::numeric_limits<std::uint64_t>::max())
{
    const Slot* newest = nullptr;
    for (const Slot& slot : slots)
        if (slot.sequence != 0 && slot.sequence <= last && slot.checksum == checksumOf(slot)
            && (newest == nullptr || slot.sequence > newest->sequence))
            newest = &slot;
    return newest;
}

// The compiler keeps the order of the steps, so a process that is killed between two of them leaves a slot that does
// not count. `fill` gets the older slot, which still has its old content, and the newer one.
template <typename Slot, typename Fill> void replaceOlder(std::array<Slot, 2>& slots, std::uint64_t sequence, Fill fill)
{
    const std::size_t newer = slots[1].sequence > slots[0].sequence ? 1 : 0;
    Slot& slot = slots[1 - newer];
    slot.sequence = 0;
    std::atomic_signal_fence(std::memory_order_seq_cst);
    fill(slot, slots[newer]);
    std::atomic_signal_fence(std::memory_order_seq_cst);
    slot.sequence = sequence;
}

template <std::size_t size> void putText(std::string_view text, std::array<char, size>& out)
{
    out = {};
    std::ranges::copy(text.substr(0, size), out.begin());
}

template <std::size_t size> std::string text(const std::array<char, size>& chars)
{
    return {chars.begin(), std::ranges::find(chars, '\0')};
}

std::array<char, LedgerImage::bytesOfPaths> pathsOfThisVersion()
{
    std::array<char, LedgerImage::bytesOfPaths> paths = {};
    char* end = paths.data();
    for (const CounterRow& row : counterRows()) {
        assert(end + row.path.size() < paths.data() + paths.size());
        end = std::ranges::copy(row.path, end).out;
        *end++ = '\n';
    }
    return paths;
}

// Calls `visit` with each path and its place.
template <typename Visit> void forEachPath(const LedgerImage& image, Visit visit)
{
    std::string_view rest(image.paths.data(), image.paths.size());
    for (std::size_t place = 0; place < LedgerImage::mostCounters; ++place) {
        const std::size_t end = rest.find('\n');
        if (end == std::string_view::npos)
            return;
        visit(rest.substr(0, end), place);
        rest.remove_prefix(end + 1);
    }
}

void fill(LedgerImage::CulpritSlot& slot, const LargestCulprits& largest)
{
    slot.rows = {};
    for (std::size_t charge = 0; charge < chargeCount; ++charge)
        for (std::size_t place = 0; place < std::min(largest[charge].size(), culpritsKept); ++place) {
            const auto& [culprit, count] = largest[charge][place];
            LedgerImage::CulpritRow& row = slot.rows[charge][place];
            row.count = count;
            row.user = culprit.user;
            putText(culprit.process, row.process);
            putText(culprit.application, row.application);
        }
}

LargestCulprits read(const LedgerImage::CulpritSlot& slot)
{
    LargestCulprits largest;
    for (std::size_t charge = 0; charge < chargeCount; ++charge)
        for (const auto& [count, user, process, application] : slot.rows[charge])
            if (count != 0)
                largest[charge].push_back({{user, text(process), text(application)}, count});
    return largest;
}

} // namespace

std::uint64_t Account::sum(Charge charge) const noexcept
{
    std::uint64_t sum = 0;
    for (const CounterRow& row : counterRows())
        if (chargeOf(row.counter) == charge)
            sum += (*this)[row.counter];
    return sum;
}

void LedgerImage::add(const Tally& tally, const std::optional<StoreState>& state)
{
    replaceOlder(slots, newest().sequence + 1, [&](Slot& slot, const Slot& newest) {
        slot.counts = newest.counts;
        slot.store = state.value_or(newest.store);
        std::uint64_t change = 0;
        tally.forEachTouched([&](std::size_t place) {
            slot.counts[place] += tally.counts()[place];
            change += tally.counts()[place] * weight(place);
        });
        if (state)
            change += weightedSum(*state, placeOfStore) - weightedSum(newest.store, placeOfStore);
        slot.checksum = newest.checksum + change + weightOfSequence;
    });
}

void LedgerImage::replaceCulprits(const LargestCulprits& largest)
{
    const std::uint64_t sequence = newest().sequence + 1;
    replaceOlder(culprits, sequence, [&](CulpritSlot& slot, const CulpritSlot&) {
        fill(slot, largest);
        slot.checksum = weightedSum(slot.rows, 1) + sequence * weight(0);
    });
}

void LedgerImage::dropUncountedCulprits()
{
    for (CulpritSlot& slot : culprits)
        if (slot.sequence > newest().sequence)
            slot.sequence = 0;
}

LargestCulprits LedgerImage::largestCulprits() const
{
    const CulpritSlot* counting = newestWhole(culprits, newest().sequence);
    return counting == nullptr ? LargestCulprits() : read(*counting);
}

std::optional<Account> accountIn(const LedgerImage& image)
{
    const LedgerImage::Slot* slot = newestWhole(image.slots);
    if (image.magic != LedgerImage::expectedMagic || slot == nullptr)
        return std::nullopt;
    Account account{.began = image.began, .counts = {}, .store = slot->store, .culprits = image.largestCulprits()};
    forEachPath(image, [&](std::string_view path, std::size_t place) {
        if (const auto counter = counterOf(path))
            account.counts[static_cast<std::size_t>(*counter)] = slot->counts[place] + image.live[place];
    });
    return account;
}

bool LedgerImage::canGoOn() const
{
    return magic == expectedMagic && paths == pathsOfThisVersion() && newestWhole(slots) == &newest();
}

void LedgerImage::copyFrom(LedgerImage& other)
{
    magic = other.magic;
    began = other.began;
    paths = other.paths;
    slots = other.slots;
    culprits = other.culprits;
    for (std::size_t place = 0; place < mostCounters; ++place)
        live[place] = std::atomic_ref(other.live[place]).load();
}

void LedgerImage::addCountedSince(const Words& copied, LedgerImage& other)
{
    for (std::size_t place = 0; place < mostCounters; ++place)
        std::atomic_ref(live[place]).fetch_add(std::atomic_ref(other.live[place]).load() - copied[place]);
}

void LedgerImage::begin(const Account& account)
{
    *this = {};
    began = account.began;
    paths = pathsOfThisVersion();
    std::ranges::copy(account.counts, slots[0].counts.begin());
    slots[0].store = account.store;
    slots[0].sequence = 1;
    slots[0].checksum = checksumOf(slots[0]);
    fill(culprits[0], account.culprits);
    culprits[0].sequence = 1;
    culprits[0].checksum = checksumOf(culprits[0]);
    magic = expectedMagic;
}

} // namespace ledger
