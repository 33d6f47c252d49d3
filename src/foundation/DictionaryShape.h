// The keys of dictionaries, in their order: what language runtimes call a shape.
//
// The messages of a player have the same keys in the same order, time after time. Dictionaries that share the one
// object for them are made, compared and let go without a look at any key.
#pragma once

#include "foundation/Reference.h"
#include "foundation/String.h"

#include <cstdint>
#include <optional>
#include <span>
#include <string_view>
#include <vector>

namespace foundation {

// Immutable. Any thread.
class DictionaryShape : public ReferenceCounted {
public:
    // The keys are distinct.
    [[nodiscard]] static Reference<DictionaryShape> make(std::vector<String> keys);
    static void destroy(const DictionaryShape* shape) noexcept { delete shape; }

    [[nodiscard]] std::span<const String> keys() const noexcept { return keys_; }
    // So few keys, so short, that one may be remembered for whoever comes, without thinking of memory.
    [[nodiscard]] bool isSmall() const noexcept;
    [[nodiscard]] std::optional<std::size_t> positionOf(std::string_view key) const noexcept;

private:
    explicit DictionaryShape(std::vector<String> keys);

    const std::vector<String> keys_;
    // Where there are many, their positions in the order of their characters. Sorted rather than hashed: no choice of
    // keys, however hostile, makes it slow.
    std::vector<std::uint32_t> sorted_;
};

// Makes keys distinct: a later value of a key replaces its first one. Returns how many are left; they stand at the
// front of both.
[[nodiscard]] std::size_t foldRepeatedKeys(std::span<String> keys, std::span<class Value> values);

} // namespace foundation
