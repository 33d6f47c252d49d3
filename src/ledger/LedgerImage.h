// SPDX-License-Identifier: Apache-2.0
// The ledger as bytes: in memory, and in the file that survives the process. The service counts in these bytes, so a
// killed service loses no count.
//
// Counts that belong together change together: they stand in two slots, of which the newer valid one counts. A process
// that is killed while it fills the older one leaves the newer one as it was.
#pragma once

#include "ledger/Culprit.h"
#include "ledger/Tally.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <vector>

namespace ledger {

// What the store holds.
struct StoreState {
    std::uint64_t events = 0;
    std::uint64_t bytes = 0; // of its files
    double oldest = 0; // of its events: seconds since 1970, or 0

    friend bool operator==(const StoreState&, const StoreState&) = default;
};

inline constexpr std::size_t culpritsKept = 10; // the largest of each charge

struct CulpritCount {
    Culprit culprit;
    std::uint64_t count = 0;
};

using LargestCulprits = std::array<std::vector<CulpritCount>, chargeCount>; // by their counts, the largest first

// All that a ledger knows at one moment.
struct Account {
    double began = 0; // seconds since 1970: when the ledger began
    Tally::Counts counts = {}; // since then
    StoreState store;
    LargestCulprits culprits;

    [[nodiscard]] std::uint64_t operator[](Counter counter) const noexcept
    {
        return counts[static_cast<std::size_t>(counter)];
    }
    // How many events are in the store, according to the counts.
    [[nodiscard]] std::uint64_t stored() const noexcept { return (*this)[Counter::Kept] - sum(Charge::Removed); }
    // The sum of the counters of that charge.
    [[nodiscard]] std::uint64_t sum(Charge charge) const noexcept;
};

// A layout of fixed size in the machine's own byte order: it never leaves the machine.
struct LedgerImage {
    static constexpr std::array<char, 8> expectedMagic = {'K', 'S', 'T', 'O', 'L', 'D', 'G', '1'};
    static constexpr std::size_t mostCounters = 128;
    static constexpr std::size_t bytesOfPaths = 4096;
    using Words = std::array<std::uint64_t, mostCounters>;

    struct Slot {
        std::uint64_t sequence; // 0: being filled
        std::uint64_t checksum;
        Words counts;
        StoreState store;
    };
    struct CulpritRow {
        std::uint64_t count; // 0: none
        std::uint32_t user;
        std::array<char, 68> process; // cut, and filled up with zeros
        std::array<char, 128> application;
    };
    struct CulpritSlot {
        std::uint64_t sequence; // of the slot of counts from which on they count
        std::uint64_t checksum;
        std::array<std::array<CulpritRow, culpritsKept>, chargeCount> rows;
    };

    std::array<char, 8> magic;
    double began; // seconds since 1970
    std::array<char, bytesOfPaths> paths; // of the counters in their order, each ended by a line end
    Words live; // counted one by one, besides those of the slots
    std::array<Slot, 2> slots;
    std::array<CulpritSlot, 2> culprits;

    // Makes it hold the account, and nothing of before.
    void begin(const Account& account);
    // Makes it hold the same as the other, in which threads may count one by one meanwhile.
    void copyFrom(LedgerImage& other);
    // Adds what was counted one by one in the other since `copied` was copied from it, while threads count here.
    void addCountedSince(const Words& copied, LedgerImage& other);
    // Whether a ledger of this version can go on counting in it.
    [[nodiscard]] bool canGoOn() const;

    // The slot that counts now.
    [[nodiscard]] const Slot& newest() const { return slots[slots[1].sequence > slots[0].sequence ? 1 : 0]; }
    // Adds to the counts, and replaces the state of the store if there is one. One thread at a time.
    void add(const Tally& tally, const std::optional<StoreState>& store);
    [[nodiscard]] LargestCulprits largestCulprits() const;
    // They count together with what is added next.
    void replaceCulprits(const LargestCulprits& largest);
    // Forgets culprits of something that was never added, because the process was killed before.
    void dropUncountedCulprits();
};

// What stands in an image, which may be of another version: counts that this version does not know are left out.
// Nothing if it is not an image of a ledger. `image` may be a copy of bytes that a process was writing.
[[nodiscard]] std::optional<Account> accountIn(const LedgerImage& image);

} // namespace ledger
