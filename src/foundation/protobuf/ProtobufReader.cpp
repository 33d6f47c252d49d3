// SPDX-License-Identifier: Apache-2.0
// Each step takes something from the front and returns whether it was complete. The first step that fails empties the
// rest, so that every loop ends.
#include "foundation/protobuf/ProtobufReader.h"

#include <array>
#include <bit>
#include <cstring>
#include <limits>

namespace foundation {

std::string_view description(ProtobufError error) noexcept
{
    switch (error) {
    case ProtobufError::Truncated: return "the message ends inside a field";
    case ProtobufError::VarintTooLong: return "a number is too long";
    case ProtobufError::InvalidTag: return "a field has no valid number or wire type";
    case ProtobufError::UnmatchedEndGroup: return "a group ends that did not begin";
    case ProtobufError::TooDeep: return "groups are nested too deep";
    }
    return "unknown error";
}

bool ProtobufReader::fail(ProtobufError error) noexcept
{
    error_ = error;
    at_ = end_;
    return false;
}

// Each byte holds seven bits, the lowest first; its highest bit says that another byte follows. A number may have more
// bytes than it needs, but not more than the largest number of its type.
template <typename Integer> bool ProtobufReader::takeLongVarint(Integer& value) noexcept
{
    constexpr int bits = std::numeric_limits<Integer>::digits;
    constexpr int lastShift = (bits - 1) / 7 * 7;
    Integer taken = 0;
    for (int shift = 0; at_ != end_; shift += 7) {
        const auto byte = static_cast<std::uint8_t>(*at_++);
        if (shift == lastShift && byte >> (bits - lastShift) != 0) // a further byte is too much as well
            return fail(ProtobufError::VarintTooLong);
        taken |= static_cast<Integer>(byte & 0x7F) << shift;
        if (byte < 0x80) {
            value = taken;
            return true;
        }
    }
    return fail(ProtobufError::Truncated);
}

template bool ProtobufReader::takeLongVarint(std::uint32_t&) noexcept;
template bool ProtobufReader::takeLongVarint(std::uint64_t&) noexcept;

template <typename Integer> bool ProtobufReader::takeFixed(std::uint64_t& value) noexcept
{
    Integer taken = 0;
    if (static_cast<std::size_t>(end_ - at_) < sizeof taken)
        return fail(ProtobufError::Truncated);
    std::memcpy(&taken, at_, sizeof taken);
    at_ += sizeof taken;
    value = std::endian::native == std::endian::big ? std::byteswap(taken) : taken;
    return true;
}

// Takes the rest of a group, up to its end.
bool ProtobufReader::takeGroup(std::uint32_t number, std::string_view& content) noexcept
{
    const char* const begin = at_;
    std::array<std::uint32_t, deepestGroup> open; // their numbers, the outermost first
    open[0] = number;
    for (std::size_t depth = 1;;) {
        const char* const end = at_;
        ProtobufField field;
        if (!takeTag(field))
            return false;
        if (field.wireType == ProtobufWireType::Group) {
            if (depth == open.size())
                return fail(ProtobufError::TooDeep);
            open[depth++] = field.number;
        } else if (field.wireType == ProtobufWireType::EndGroup) {
            if (field.number != open[--depth])
                return fail(ProtobufError::UnmatchedEndGroup);
            if (depth == 0) {
                content = {begin, end};
                return true;
            }
        } else if (!takeValue(field))
            return false;
    }
}

bool ProtobufReader::takeRareValue(ProtobufField& field) noexcept
{
    switch (field.wireType) {
    case ProtobufWireType::Fixed64: return takeFixed<std::uint64_t>(field.integer);
    case ProtobufWireType::Fixed32: return takeFixed<std::uint32_t>(field.integer);
    case ProtobufWireType::Group: return takeGroup(field.number, field.bytes);
    default: return fail(ProtobufError::UnmatchedEndGroup);
    }
}

std::expected<void, ProtobufError> ProtobufReader::result() const noexcept
{
    if (error_)
        return std::unexpected(*error_);
    return {};
}

} // namespace foundation
