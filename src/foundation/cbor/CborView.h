// SPDX-License-Identifier: Apache-2.0
// Looking into encoded values without decoding them.
//
// A session keeps its messages encoded, and its results need a few keys of each of a million messages. Walking over the
// bytes finds these keys at a fraction of the cost of unpacking, and without memory; the functions of every step are
// inline. Only for bytes that `appendCbor` wrote: these functions check nothing.
#pragma once

#include "foundation/cbor/CborHead.h"
#include "foundation/values/Value.h"

#include <cstddef>
#include <iterator>
#include <string>
#include <string_view>

namespace foundation {

// One encoded value. Valid as long as the bytes. Any thread.
class CborItem {
public:
    // No value: only `bytes` may be called, and returns none.
    constexpr CborItem() noexcept = default;
    constexpr explicit CborItem(std::string_view bytes) noexcept : bytes_(bytes) { }
    // The item at that place; other bytes may follow it.
    static CborItem at(const char* place) noexcept { return CborItem({place, sizeAt(place)}); }

    [[nodiscard]] std::string_view bytes() const noexcept { return bytes_; }
    // Whether both have the same bytes, and so the same value. Equal addresses mean this without a comparison.
    [[nodiscard]] bool isSameAs(CborItem other) const noexcept
    {
        return bytes_.size() == other.bytes_.size() && (bytes_.data() == other.bytes_.data() || bytes_ == other.bytes_);
    }
    [[nodiscard]] Value::Kind kind() const noexcept;
    // These answer as `Value` does.
    [[nodiscard]] std::string_view stringView() const noexcept
    {
        return kind() == Value::Kind::String ? content() : std::string_view();
    }
    [[nodiscard]] std::optional<Number> number() const noexcept { return cborNumber(headAt(bytes_.data()).head); }
    [[nodiscard]] std::string text() const { return value().text(); }
    // The value unpacked.
    [[nodiscard]] Value value() const;
    // The bytes behind the head: those of a string, of an array's elements, or of a dictionary's keys and values.
    [[nodiscard]] std::string_view content() const noexcept { return bytes_.substr(headAt(bytes_.data()).size); }

private:
    struct SizedHead {
        CborHead head;
        std::size_t size;
    };

    static SizedHead headAt(const char* place) noexcept
    {
        const auto first = static_cast<std::uint8_t>(*place++);
        const auto head = [first](std::size_t size, std::uint64_t argument) -> SizedHead {
            return {{static_cast<CborMajor>(first >> 5), static_cast<std::uint8_t>(first & 0x1F), argument}, size};
        };
        switch (first & 0x1F) {
        case 24: return head(2, cborBigEndian<std::uint8_t>(place));
        case 25: return head(3, cborBigEndian<std::uint16_t>(place));
        case 26: return head(5, cborBigEndian<std::uint32_t>(place));
        case 27: return head(9, cborBigEndian<std::uint64_t>(place));
        default: return head(1, first & 0x1F);
        }
    }

    static std::size_t sizeAt(const char* place) noexcept
    {
        const auto [head, size] = headAt(place);
        switch (head.major) {
        case CborMajor::Bytes:
        case CborMajor::Text: return size + head.argument;
        case CborMajor::Array:
        case CborMajor::Map:
        case CborMajor::Tag: return nestedSizeAt(place);
        default: return size;
        }
    }
    static std::size_t nestedSizeAt(const char* place) noexcept;

    std::string_view bytes_;
};

// The items of an encoded array, or of an encoded dictionary: keys and values in turn.
class CborItems {
public:
    class Iterator {
    public:
        using value_type = CborItem;
        using difference_type = std::ptrdiff_t;

        Iterator() = default;
        explicit Iterator(std::string_view items) : place_(items.data()), end_(place_ + items.size()) { }
        CborItem operator*() const noexcept { return CborItem::at(place_); }
        Iterator& operator++() noexcept
        {
            place_ += (**this).bytes().size();
            return *this;
        }
        void operator++(int) noexcept { ++*this; }
        friend bool operator==(const Iterator& iterator, std::default_sentinel_t) noexcept
        {
            return iterator.place_ == iterator.end_;
        }

    private:
        const char* place_ = nullptr;
        const char* end_ = nullptr;
    };

    explicit CborItems(CborItem container) : items_(container.content()) { }
    [[nodiscard]] Iterator begin() const { return Iterator(items_); }
    [[nodiscard]] static std::default_sentinel_t end() noexcept { return {}; }

private:
    std::string_view items_;
};

inline Value::Kind CborItem::kind() const noexcept
{
    const CborHead head = headAt(bytes_.data()).head;
    switch (head.major) {
    case CborMajor::Bytes: return Value::Kind::Data;
    case CborMajor::Text: return Value::Kind::String;
    case CborMajor::Array: return Value::Kind::Array;
    case CborMajor::Map: return Value::Kind::Dictionary;
    case CborMajor::Tag: return Value::Kind::Date;
    case CborMajor::Simple: return head.additional == CborHead::Null ? Value::Kind::Null : Value::Kind::Number;
    default: return Value::Kind::Number;
    }
}

} // namespace foundation
