// SPDX-License-Identifier: Apache-2.0
// Up to a few keys, comparing them one by one beats any index; beyond, they are sorted.
#include "foundation/values/DictionaryShape.h"

#include "foundation/values/Value.h"

#include <algorithm>
#include <cassert>
#include <numeric>
#include <utility>

namespace foundation {
namespace {

constexpr std::size_t fewKeys = 16;

// The sorted positions of many keys; empty for few keys.
std::vector<std::uint32_t> sortedPositions(std::span<const String> keys)
{
    if (keys.size() <= fewKeys)
        return {};
    std::vector<std::uint32_t> positions(keys.size());
    std::iota(positions.begin(), positions.end(), 0U);
    std::ranges::sort(positions, {}, [keys](auto position) { return std::pair(keys[position].view(), position); });
    return positions;
}

} // namespace

Reference<DictionaryShape> DictionaryShape::make(std::vector<String> keys)
{
    auto sorted = sortedPositions(keys);
    return Reference<DictionaryShape>::adopt(new DictionaryShape(std::move(keys), std::move(sorted)));
}

bool DictionaryShape::isSmall() const noexcept
{
    constexpr std::size_t mostKeys = 32;
    constexpr std::size_t longestKey = 64;
    return keys_.size() <= mostKeys
        && std::ranges::all_of(keys_, [](const String& key) { return key.view().size() <= longestKey; });
}

std::optional<std::size_t> DictionaryShape::positionOf(std::string_view key) const noexcept
{
    if (sorted_.empty()) {
        const auto found = std::ranges::find(keys_, key, &String::view);
        return found == keys_.end() ? std::nullopt : std::optional(static_cast<std::size_t>(found - keys_.begin()));
    }
    const auto keyAt = [this](std::uint32_t position) { return keys_[position].view(); };
    const auto found = std::ranges::lower_bound(sorted_, key, {}, keyAt);
    return found == sorted_.end() || keyAt(*found) != key ? std::nullopt : std::optional<std::size_t>(*found);
}

namespace {

// Tells most keys apart without looking at all of their characters: a number below 64.
unsigned fingerprint(std::string_view key) noexcept
{
    if (key.empty())
        return 0;
    const auto at = [key](std::size_t index) { return static_cast<std::uint8_t>(key[index]); };
    return (static_cast<unsigned>(key.size()) + 5U * at(0) + 11U * at(key.size() / 2) + 23U * at(key.size() - 1)) % 64;
}

// For each position, the position of the first equal key. Keys hardly ever repeat, and the fingerprints show this
// quickly.
std::vector<std::uint32_t> firstOfFew(std::span<const String> keys)
{
    std::vector<std::uint32_t> firsts(keys.size());
    std::uint64_t seen = 0;
    for (std::uint32_t position = 0; position < keys.size(); ++position) {
        const std::uint64_t bit = std::uint64_t{1} << fingerprint(keys[position]);
        firsts[position] = (seen & bit) == 0
            ? position
            : static_cast<std::uint32_t>(std::ranges::find(keys, keys[position]) - keys.begin());
        seen |= bit;
    }
    return firsts;
}

std::vector<std::uint32_t> firstOfMany(std::span<const String> keys, std::span<const std::uint32_t> sorted)
{
    std::vector<std::uint32_t> firsts(keys.size());
    std::uint32_t first = sorted.front();
    for (const std::uint32_t position : sorted) {
        if (keys[position] != keys[first])
            first = position;
        firsts[position] = first;
    }
    return firsts;
}

// Moves the distinct keys to the front; `firsts` has for each position that of the first equal key. Returns the number
// of distinct keys.
std::size_t moveToFront(std::span<std::uint32_t> firsts, std::span<String> keys, std::span<Value> values)
{
    std::uint32_t kept = 0;
    for (std::uint32_t position = 0; position < keys.size(); ++position) {
        const std::uint32_t first = firsts[position];
        if (first != position) {
            values[firsts[first]] = std::move(values[position]);
            continue;
        }
        const std::uint32_t place = firsts[position] = kept++;
        if (place == position)
            continue;
        keys[place] = std::move(keys[position]);
        values[place] = std::move(values[position]);
    }
    return kept;
}

} // namespace

Reference<DictionaryShape> DictionaryShape::fold(std::vector<String> keys, std::span<Value>& values)
{
    assert(!keys.empty() && keys.size() == values.size());
    auto sorted = sortedPositions(keys);
    auto firsts = sorted.empty() ? firstOfFew(keys) : firstOfMany(keys, sorted);
    const std::size_t distinct = moveToFront(firsts, keys, values);
    if (distinct == keys.size())
        return Reference<DictionaryShape>::adopt(new DictionaryShape(std::move(keys), std::move(sorted)));
    keys.resize(distinct);
    values = values.first(distinct);
    return make(std::move(keys));
}

} // namespace foundation
