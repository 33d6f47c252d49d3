// Looking into an encoded dictionary without decoding it.
//
// A session keeps its messages encoded, and what it derives from them needs a few keys of each of a million
// messages. Walking over the bytes finds them at a fraction of the cost of unpacking, and without memory.
// Only for bytes that `appendCbor` wrote: nothing is checked.
#pragma once

#include "foundation/Value.h"

#include <cstddef>
#include <iterator>
#include <string>
#include <string_view>

namespace foundation {

// One encoded item. Valid as long as the bytes. Any thread.
class CborItem {
public:
    constexpr CborItem() noexcept = default;
    constexpr explicit CborItem(std::string_view bytes) noexcept : bytes_(bytes) { }

    [[nodiscard]] std::string_view bytes() const noexcept { return bytes_; }
    [[nodiscard]] Value value() const;
    // Appends the value's text, as `Value::appendText` does.
    void appendText(std::string& out) const;

private:
    std::string_view bytes_;
};

// The entries of an encoded dictionary, in its order.
class CborMap {
public:
    struct Entry {
        std::string_view key;
        CborItem value;
    };

    class Iterator {
    public:
        using value_type = Entry;
        using difference_type = std::ptrdiff_t;

        Iterator() = default;
        explicit Iterator(std::string_view rest) : rest_(rest) { readEntry(); }
        const Entry& operator*() const noexcept { return entry_; }
        const Entry* operator->() const noexcept { return &entry_; }
        Iterator& operator++()
        {
            readEntry();
            return *this;
        }
        void operator++(int) { readEntry(); }
        friend bool operator==(const Iterator& iterator, std::default_sentinel_t) noexcept { return iterator.atEnd_; }

    private:
        void readEntry();

        std::string_view rest_;
        Entry entry_;
        bool atEnd_ = false;
    };

    explicit CborMap(std::string_view encoded);
    [[nodiscard]] Iterator begin() const { return Iterator(entries_); }
    [[nodiscard]] static std::default_sentinel_t end() noexcept { return {}; }

private:
    std::string_view entries_;
};

} // namespace foundation
