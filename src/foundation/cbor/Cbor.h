// SPDX-License-Identifier: Apache-2.0
// The room of CBOR: values as bytes and bytes as values. It reads from memory, and knows of no connection.
//
// Values as CBOR (RFC 8949): the format of the wire, and the compact form in which a session keeps its messages.
//
// The reader is the project's own, because the same few lines decode a frame from a hostile client, remember the keys
// that every message repeats, and walk a recorded payload without unpacking it. The benchmarks compare it with libcbor.
//
// Null, booleans, integers, floats (16 bits are read as 32), text, arrays, maps with text keys, byte strings
// (data) and epoch-based dates (tag 1) have a value; lengths may be indefinite. Everything else is refused.
#pragma once

#include "foundation/values/Value.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <expected>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace foundation {

enum class CborError : std::uint8_t {
    Truncated, // the bytes end inside an item
    TrailingBytes, // bytes follow the item
    TooDeep, // more nested containers than allowed
    Malformed, // not well-formed CBOR
    InvalidUtf8, // text that is not UTF-8
    KeyNotText, // a map key of another type
    Unsupported, // well-formed, but no value of ours: undefined, other tags and simple values
    IntegerOutOfRange // below -2^63
};

// The error as text for a log line, such as "text is not valid UTF-8".
[[nodiscard]] std::string_view description(CborError error) noexcept;

// How deep foreign bytes may nest.
constexpr unsigned cborMaximumDepth = 32;

// Appends the value's encoding: shortest heads, definite lengths, floats in the width of their kind.
void appendCbor(const Value& value, std::string& out);
void appendCbor(const Dictionary& dictionary, std::string& out);

// The size of that encoding in bytes; and the encoding, written to memory that has room for it: returns the end.
[[nodiscard]] std::size_t cborSize(const Dictionary& dictionary) noexcept;
char* putCbor(const Dictionary& dictionary, char* place) noexcept;

// The heads, for code that knows a message's shape and encodes the message without building values.
void appendCborInteger(std::uint64_t value, std::string& out);
void appendCborText(std::string_view text, std::string& out);
void appendCborArrayHead(std::uint64_t count, std::string& out);
void appendCborMapHead(std::uint64_t count, std::string& out);
// An array of integers, in one step for very many.
void appendCborArray(std::span<const std::int64_t> integers, std::string& out);
inline void appendCborNull(std::string& out)
{
    out.push_back('\xF6');
}

// Decodes items from foreign bytes. Each connection has one decoder. It remembers short keys and the shapes of small
// maps, so that keys that every message repeats are made only once. One thread at a time.
class CborDecoder {
public:
    // Decodes the bytes, which hold exactly one item with at most so many nested containers.
    [[nodiscard]] std::expected<Value, CborError> decode(std::string_view bytes,
                                                         unsigned maximumDepth = cborMaximumDepth);
    // Not less than the memory (`Value::roughBytes`) of the value that was decoded last, and far less work to know.
    [[nodiscard]] std::size_t mostMemory() const noexcept { return mostMemory_; }

private:
    friend class CborReader;
    // A string with these characters, if it is remembered.
    [[nodiscard]] const String* find(std::string_view key) const;
    // A new string, remembered if it is short.
    [[nodiscard]] String remember(std::string_view key);

    // The place of the shape of a map of so many entries that begins with that key.
    [[nodiscard]] Reference<DictionaryShape>& shapeOf(std::string_view firstKey, std::uint64_t count);

    static constexpr std::size_t longestRememberedKey = 64;
    static constexpr std::size_t rememberedKeys = 256;
    static constexpr std::size_t rememberedShapes = 16;
    std::size_t mostMemory_ = 0;
    std::vector<String> keys_; // by a hash of their characters; a new key replaces the one at its place
    std::array<Reference<DictionaryShape>, rememberedShapes> shapes_; // by a hash, too
};

} // namespace foundation
