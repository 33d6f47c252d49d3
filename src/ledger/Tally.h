// SPDX-License-Identifier: Apache-2.0
// Counts that belong together and reach the ledger together: what one turn of the server queue did, or one batch of the
// store. So the ledger's sums hold at every moment, and also in what a killed service leaves behind.
#pragma once

#include "ledger/Counter.h"
#include "ledger/Culprit.h"

#include <array>
#include <bit>
#include <cstdint>
#include <span>
#include <vector>

namespace ledger {

// One thread at a time.
class Tally {
public:
    using Counts = std::array<std::uint64_t, counterCount>;
    struct Charged {
        Charge charge;
        Culprit culprit;
        std::uint64_t count;
    };
    // What goes beyond is charged to no known culprit.
    static constexpr std::size_t mostCharged = 256;

    void add(Counter counter, std::uint64_t count = 1) noexcept
    {
        const auto place = static_cast<std::size_t>(counter);
        counts_[place] += count;
        touched_[place / 64] |= std::uint64_t{1} << place % 64;
    }
    // Adds to a counter that has a charge, and to what the culprit is charged with.
    void add(Counter counter, const Culprit& culprit, std::uint64_t count = 1);
    // Adds what the other counted; it is then empty.
    void takeFrom(Tally& other);
    void clear();

    [[nodiscard]] bool empty() const noexcept { return (touched_[0] | touched_[1]) == 0; }
    // Calls `visit` with the place of each counter that something was added to. A turn touches few of them.
    template <typename Visit> void forEachTouched(Visit visit) const
    {
        for (std::size_t word = 0; word < touched_.size(); ++word)
            for (std::uint64_t bits = touched_[word]; bits != 0; bits &= bits - 1)
                visit(64 * word + static_cast<std::size_t>(std::countr_zero(bits)));
    }
    [[nodiscard]] std::uint64_t operator[](Counter counter) const noexcept
    {
        return counts_[static_cast<std::size_t>(counter)];
    }
    [[nodiscard]] const Counts& counts() const noexcept { return counts_; }
    [[nodiscard]] std::span<const Charged> charged() const noexcept { return charged_; }

private:
    void charge(Charge charge, const Culprit& culprit, std::uint64_t count);

    Counts counts_ = {};
    std::vector<Charged> charged_;
    std::array<std::uint64_t, 2> touched_ = {}; // a bit for each counter
    static_assert(counterCount <= 128);
};

} // namespace ledger
