// SPDX-License-Identifier: Apache-2.0
// Reading the wire format of protocol buffers, in which a message is a row of fields: a number, a wire type, and a
// value with a length that the wire type determines.
//
// The reader returns field by field, each with its whole value, so that a caller picks the fields that it knows and can
// ignore the others. It copies and allocates nothing: text lies in the input. It checks every length against the
// remaining bytes, and does not recurse into nested groups.
#pragma once

#include <cstdint>
#include <expected>
#include <optional>
#include <string_view>
#include <utility>

namespace foundation {

enum class ProtobufError : std::uint8_t {
    Truncated, // the bytes end inside a field
    VarintTooLong, // a number that does not end in time, or takes more bits than its place has
    InvalidTag, // a field without a number, or of a wire type that does not exist
    UnmatchedEndGroup, // the end of a group that did not begin, or of another one
    TooDeep // more nested groups than allowed
};

// The error as text for a log line, such as "the message ends inside a field".
[[nodiscard]] std::string_view description(ProtobufError error) noexcept;

// How the value of a field is written; the numbers are those of the wire.
enum class ProtobufWireType : std::uint8_t { Varint, Fixed64, LengthDelimited, Group, EndGroup, Fixed32 };

struct ProtobufField {
    std::uint32_t number = 0; // 1 to 2^29 - 1
    ProtobufWireType wireType = ProtobufWireType::Varint; // never EndGroup
    std::uint64_t integer = 0; // of Varint, Fixed32 and Fixed64
    std::string_view bytes; // of LengthDelimited; of Group the fields in it, which are well-formed
};

// One thread at a time. The bytes must outlive the reader and the fields that it returns.
class ProtobufReader {
public:
    // As many as other implementations allow.
    static constexpr unsigned deepestGroup = 100;

    explicit ProtobufReader(std::string_view bytes) noexcept : at_(bytes.data()), end_(bytes.data() + bytes.size()) { }

    // The next field; nothing at the end, or if the next bytes are broken.
    [[nodiscard]] std::optional<ProtobufField> next() noexcept;
    // Success if all fields so far were well-formed, else the error that ended the reading.
    [[nodiscard]] std::expected<void, ProtobufError> result() const noexcept;

private:
    bool fail(ProtobufError error) noexcept;
    template <typename Integer> bool takeVarint(Integer& value) noexcept;
    template <typename Integer> bool takeLongVarint(Integer& value) noexcept;
    template <typename Integer> bool takeFixed(std::uint64_t& value) noexcept;
    bool takeBytes(std::string_view& bytes) noexcept;
    bool takeTag(ProtobufField& field) noexcept;
    bool takeValue(ProtobufField& field) noexcept;
    bool takeRareValue(ProtobufField& field) noexcept;
    bool takeGroup(std::uint32_t number, std::string_view& content) noexcept;

    const char* at_;
    const char* end_;
    std::optional<ProtobufError> error_;
};

// The steps for nearly every field are inline, so that the compiler makes one loop of them: that takes half the time.

template <typename Integer> bool ProtobufReader::takeVarint(Integer& value) noexcept
{
    if (at_ == end_ || static_cast<signed char>(*at_) < 0)
        return takeLongVarint(value);
    value = static_cast<std::uint8_t>(*at_++);
    return true;
}

inline bool ProtobufReader::takeBytes(std::string_view& bytes) noexcept
{
    std::uint32_t length = 0;
    if (!takeVarint(length))
        return false;
    if (static_cast<std::size_t>(end_ - at_) < length)
        return fail(ProtobufError::Truncated);
    bytes = {at_, length};
    at_ += length;
    return true;
}

inline bool ProtobufReader::takeTag(ProtobufField& field) noexcept
{
    std::uint32_t tag = 0;
    if (!takeVarint(tag))
        return false;
    field.number = tag >> 3;
    field.wireType = static_cast<ProtobufWireType>(tag & 7);
    return (field.number != 0 && field.wireType <= ProtobufWireType::Fixed32) || fail(ProtobufError::InvalidTag);
}

inline bool ProtobufReader::takeValue(ProtobufField& field) noexcept
{
    switch (field.wireType) {
    case ProtobufWireType::Varint: return takeVarint(field.integer);
    case ProtobufWireType::LengthDelimited: return takeBytes(field.bytes);
    default: return takeRareValue(field);
    }
}

inline std::optional<ProtobufField> ProtobufReader::next() noexcept
{
    std::optional<ProtobufField> field(std::in_place); // where it stays: a copy costs as much as the reading
    if (at_ == end_ || !takeTag(*field) || !takeValue(*field))
        field.reset();
    return field;
}

} // namespace foundation
