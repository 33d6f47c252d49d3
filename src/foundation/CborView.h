// Looking into encoded values without decoding them.
//
// A session keeps its messages encoded, and what it derives from them needs a few keys of each of a million
// messages. Walking over the bytes finds them at a fraction of the cost of unpacking, and without memory.
// Only for bytes that `appendCbor` wrote: nothing is checked.
#pragma once

#include "foundation/Value.h"

#include <cstddef>
#include <cstdint>
#include <iterator>
#include <string>
#include <string_view>

namespace foundation {

// One encoded value. Valid as long as the bytes. Any thread.
class CborItem {
public:
    constexpr CborItem() noexcept = default;
    constexpr explicit CborItem(std::string_view bytes) noexcept : bytes_(bytes) { }

    [[nodiscard]] std::string_view bytes() const noexcept { return bytes_; }
    [[nodiscard]] Value::Kind kind() const noexcept;
    // The value's text, of a string only.
    [[nodiscard]] std::string_view string() const noexcept;
    // The value unpacked.
    [[nodiscard]] Value value() const;
    // Appends the value's text, as `Value::appendText` does.
    void appendText(std::string& out) const;

private:
    std::string_view bytes_;
};

// What an encoded array holds, or what an encoded dictionary holds, keys and values in turn.
class CborItems {
public:
    class Iterator {
    public:
        using value_type = CborItem;
        using difference_type = std::ptrdiff_t;

        Iterator() = default;
        explicit Iterator(std::string_view rest) : rest_(rest) { readItem(); }
        CborItem operator*() const noexcept { return item_; }
        Iterator& operator++()
        {
            readItem();
            return *this;
        }
        void operator++(int) { readItem(); }
        friend bool operator==(const Iterator& iterator, std::default_sentinel_t) noexcept
        {
            return iterator.item_.bytes().empty();
        }

    private:
        void readItem();

        std::string_view rest_;
        CborItem item_;
    };

    explicit CborItems(std::string_view container);
    [[nodiscard]] Iterator begin() const { return Iterator(items_); }
    [[nodiscard]] static std::default_sentinel_t end() noexcept { return {}; }

private:
    std::string_view items_;
};

// Calls `visit` with key and value of each entry of an encoded dictionary.
template <typename Visit> void forEachCborEntry(std::string_view dictionary, Visit visit)
{
    const CborItems items(dictionary);
    for (auto item = items.begin(); item != items.end(); ++item) {
        const std::string_view key = (*item).string();
        ++item;
        visit(key, *item);
    }
}

} // namespace foundation
