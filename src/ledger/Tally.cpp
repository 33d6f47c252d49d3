// SPDX-License-Identifier: Apache-2.0
// Adding and moving counts.
#include "ledger/Tally.h"

#include <algorithm>
#include <cassert>

namespace ledger {

void Tally::add(Counter counter, const Culprit& culprit, std::uint64_t count)
{
    if (count == 0)
        return;
    add(counter, count);
    assert(chargeOf(counter));
    charge(*chargeOf(counter), culprit, count);
}

void Tally::charge(Charge charge, const Culprit& culprit, std::uint64_t count)
{
    const auto same = [&](const Charged& other) { return other.charge == charge && other.culprit == culprit; };
    if (const auto known = std::ranges::find_if(charged_, same); known != charged_.end())
        known->count += count;
    else if (charged_.size() < mostCharged)
        charged_.push_back({charge, culprit, count});
}

void Tally::takeFrom(Tally& other)
{
    other.forEachTouched([&](std::size_t place) { add(static_cast<Counter>(place), other.counts_[place]); });
    for (const auto& [kind, culprit, count] : other.charged_)
        charge(kind, culprit, count);
    other.clear();
}

void Tally::clear()
{
    forEachTouched([this](std::size_t place) { counts_[place] = 0; });
    touched_ = {};
    charged_.clear();
}

} // namespace ledger
