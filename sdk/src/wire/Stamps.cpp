// SPDX-License-Identifier: Apache-2.0
// Only the few items of CBOR that two keys, a double and a number of seconds take. The encoder of messages appends to a
// string, which would allocate.
#include "wire/Stamps.h"

#include <algorithm>
#include <bit>
#include <cmath>

namespace libkesto {
namespace {

// Of CBOR (RFC 8949): the types of items, in the upper three bits of a head, and the head of a double.
constexpr unsigned unsignedInteger = 0;
constexpr unsigned text = 3;
constexpr char doubleHead = '\xFB';
constexpr unsigned bitsOfAByte = 8;

} // namespace

std::int64_t wholeSeconds(double uptime) noexcept
{
    return std::llround(uptime);
}

Stamps::Stamps(Moment moment, bool withTimestamp, bool withUptime) noexcept
{
    if (withTimestamp) {
        putKey(timestampKey);
        put(doubleHead);
        putBigEndian(std::bit_cast<std::uint64_t>(moment.secondsSince1970), sizeof(double));
    }
    if (withUptime) {
        putKey(uptimeKey);
        putHead(unsignedInteger, static_cast<std::uint64_t>(std::max<std::int64_t>(0, wholeSeconds(moment.uptime))));
    }
}

void Stamps::putBigEndian(std::uint64_t value, unsigned bytes) noexcept
{
    for (unsigned left = bytes; left > 0; --left)
        put(static_cast<char>(value >> bitsOfAByte * (left - 1)));
}

// Small values stand in the head itself; larger ones follow it in one, two, four or eight bytes.
void Stamps::putHead(unsigned majorType, std::uint64_t value) noexcept
{
    constexpr unsigned typeShift = 5;
    constexpr unsigned firstFollowing = 24;
    const unsigned head = majorType << typeShift;
    if (value < firstFollowing)
        return put(static_cast<char>(head | value));
    unsigned step = 0;
    while (step < 3 && value >> bitsOfAByte * (1U << step) != 0)
        ++step;
    put(static_cast<char>(head | (firstFollowing + step)));
    putBigEndian(value, 1U << step);
}

void Stamps::putKey(std::string_view key) noexcept
{
    putHead(text, key.size());
    size_ = static_cast<std::size_t>(std::ranges::copy(key, bytes_.data() + size_).out - bytes_.data());
    ++count_;
}

} // namespace libkesto
