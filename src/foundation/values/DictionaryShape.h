// SPDX-License-Identifier: Apache-2.0
// The keys of dictionaries, in their order: what language runtimes call a shape.
//
// The messages of a player have the same keys in the same order, time after time. Dictionaries that share one shape are
// made, compared and released without reading any key.
#pragma once

#include "foundation/values/Reference.h"
#include "foundation/values/String.h"

#include <cstdint>
#include <optional>
#include <span>
#include <string_view>
#include <utility>
#include <vector>

namespace foundation {

class Value;

// Immutable. Any thread.
class DictionaryShape : public ReferenceCounted {
public:
    // The keys are distinct.
    [[nodiscard]] static Reference<DictionaryShape> make(std::vector<String> keys);
    // Makes a shape of at least one key, with a value for each; keys may repeat. The last value of a key takes the
    // place of its first. Afterwards the first values belong to the distinct keys, in their order.
    [[nodiscard]] static Reference<DictionaryShape> fold(std::vector<String> keys, std::span<Value>& values);
    static void destroy(const DictionaryShape* shape) noexcept { delete shape; }

    [[nodiscard]] std::span<const String> keys() const noexcept { return keys_; }
    // Whether its keys are so few and short that a decoder may remember the shape at negligible memory.
    [[nodiscard]] bool isSmall() const noexcept;
    [[nodiscard]] std::optional<std::size_t> positionOf(std::string_view key) const noexcept;

private:
    DictionaryShape(std::vector<String> keys, std::vector<std::uint32_t> sorted) noexcept
        : keys_(std::move(keys)),
          sorted_(std::move(sorted))
    {
    }

    const std::vector<String> keys_;
    // For many keys, their positions in the order of their characters. Sorted and not hashed, so that hostile keys
    // cannot make it slow.
    const std::vector<std::uint32_t> sorted_;
};

} // namespace foundation
