// Reading the wire format of protocol buffers, in which a message is a row of fields: a number, a wire type, and a
// value whose length the wire type tells.
//
// The reader takes field by field, each with its whole value, so that whoever reads picks the fields that it knows and
// has passed the others already. It copies and allocates nothing: text lies in the input. It believes no length
// before the bytes are there, and does not recurse, however deep groups nest.
#pragma once

#include <cstdint>
#include <expected>
#include <optional>
#include <string_view>

namespace foundation {

enum class ProtobufError : std::uint8_t {
    Truncated, // the bytes end inside a field
    VarintTooLong, // a number that does not end in time, or takes more bits than its place has
    InvalidTag, // a field without a number, or of a wire type that does not exist
    UnmatchedEndGroup, // the end of a group that did not begin, or of another one
    TooDeep // more groups inside each other than allowed
};

// The error as words for a log line, such as "the message ends inside a field".
[[nodiscard]] std::string_view description(ProtobufError error) noexcept;

// How the value of a field is written; the numbers are those of the wire.
enum class ProtobufWireType : std::uint8_t { Varint, Fixed64, LengthDelimited, Group, EndGroup, Fixed32 };

struct ProtobufField {
    std::uint32_t number = 0; // 1 to 2^29 - 1
    ProtobufWireType wireType = ProtobufWireType::Varint; // never EndGroup
    std::uint64_t integer = 0; // of Varint, Fixed32 and Fixed64
    std::string_view bytes; // of LengthDelimited; of Group the fields in it, which are well-formed
};

// One thread at a time. The bytes outlive the reader, and the fields that it gave.
class ProtobufReader {
public:
    // As many as other implementations allow.
    static constexpr unsigned deepestGroup = 100;

    explicit ProtobufReader(std::string_view bytes) noexcept : at_(bytes.data()), end_(bytes.data() + bytes.size()) { }

    // The next field; nothing when there is none, or when what follows is broken.
    [[nodiscard]] std::optional<ProtobufField> next() noexcept;
    // Whether all fields so far were well-formed, and if not, what ended the reading.
    [[nodiscard]] std::expected<void, ProtobufError> result() const noexcept;

private:
    bool fail(ProtobufError error) noexcept;
    template <typename Integer> bool takeVarint(Integer& value) noexcept;
    template <typename Integer> bool takeFixed(std::uint64_t& value) noexcept;
    bool takeBytes(std::string_view& bytes) noexcept;
    bool takeTag(ProtobufField& field) noexcept;
    bool takeValue(ProtobufField& field) noexcept;
    bool takeGroup(std::uint32_t number, std::string_view& content) noexcept;

    const char* at_;
    const char* end_;
    std::optional<ProtobufError> error_;
};

} // namespace foundation
