// The keys of dictionaries, in their order: what language runtimes call a shape.
//
// The messages of a player have the same keys in the same order, time after time. Dictionaries that share the one
// object for them are made, compared and let go without a look at any key.
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
    // Of keys that may repeat, at least one, and a value for each: a later value of a key replaces its first one. As
    // many of the values stay, in front, as there are distinct keys.
    [[nodiscard]] static Reference<DictionaryShape> fold(std::vector<String> keys, std::span<Value>& values);
    static void destroy(const DictionaryShape* shape) noexcept { delete shape; }

    [[nodiscard]] std::span<const String> keys() const noexcept { return keys_; }
    // So few keys, so short, that one may be remembered for whoever comes, without thinking of memory.
    [[nodiscard]] bool isSmall() const noexcept;
    [[nodiscard]] std::optional<std::size_t> positionOf(std::string_view key) const noexcept;

private:
    DictionaryShape(std::vector<String> keys, std::vector<std::uint32_t> sorted) noexcept
        : keys_(std::move(keys)),
          sorted_(std::move(sorted))
    {
    }

    const std::vector<String> keys_;
    // Where there are many, their positions in the order of their characters. Sorted rather than hashed: no choice of
    // keys, however hostile, makes it slow.
    const std::vector<std::uint32_t> sorted_;
};

} // namespace foundation
