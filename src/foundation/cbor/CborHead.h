// SPDX-License-Identifier: Apache-2.0
// The head of every CBOR item: the kind of the item, and one number. For the readers and writers of this folder.
#pragma once

#include "foundation/values/Number.h"

#include <bit>
#include <cstdint>
#include <cstring>
#include <optional>
#include <utility>

namespace foundation {

enum class CborMajor : std::uint8_t { Unsigned, Negative, Bytes, Text, Array, Map, Tag, Simple };

struct CborHead {
    // The values of `additional` in a head of major type `Simple`.
    enum Simple : std::uint8_t { False = 20, True = 21, Null = 22, Float16 = 25, Float32 = 26, Float64 = 27 };
    static constexpr std::uint8_t indefiniteLength = 31; // the value of `additional` in the others

    CborMajor major = CborMajor::Simple;
    std::uint8_t additional = Null;
    std::uint64_t argument = 0;

    [[nodiscard]] bool isIndefinite() const noexcept { return additional == indefiniteLength; }
};

// The integer of those bytes, the highest first.
template <typename Integer> [[nodiscard]] Integer cborBigEndian(const char* bytes) noexcept
{
    Integer value;
    std::memcpy(&value, bytes, sizeof value);
    return std::endian::native == std::endian::little ? std::byteswap(value) : value;
}

// The number, if the head holds it completely; nothing for any other head. The reader itself handles floats of 16 bits,
// which the service never writes, and integers below -2^63.
[[nodiscard]] inline std::optional<Number> cborNumber(const CborHead& head) noexcept
{
    const bool fitsSigned = std::in_range<std::int64_t>(head.argument);
    switch (head.major) {
    case CborMajor::Unsigned:
        return fitsSigned ? Number(static_cast<std::int64_t>(head.argument)) : Number(head.argument);
    case CborMajor::Negative:
        return fitsSigned ? std::optional(Number(-1 - static_cast<std::int64_t>(head.argument))) : std::nullopt;
    case CborMajor::Simple: break;
    default: return std::nullopt;
    }
    switch (head.additional) {
    case CborHead::False: return Number(false);
    case CborHead::True: return Number(true);
    case CborHead::Float32: return Number(std::bit_cast<float>(static_cast<std::uint32_t>(head.argument)));
    case CborHead::Float64: return Number(std::bit_cast<double>(head.argument));
    default: return std::nullopt;
    }
}

} // namespace foundation
