// SPDX-License-Identifier: Apache-2.0
// Writing the wire format of protocol buffers: field by field, each appended to the bytes of the message.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

namespace foundation {

// Field numbers are 1 to 2^29 - 1. One thread at a time.
class ProtobufWriter {
public:
    // Appends to `out`, which outlives the writer.
    explicit ProtobufWriter(std::string& out) noexcept : out_(out) { }

    // Makes room for so many more bytes: a caller that knows a message's rough length lets the string grow only once.
    void reserve(std::size_t additional) { out_.reserve(out_.size() + additional); }

    // In as few bytes as the number takes.
    void writeVarint(std::uint32_t field, std::uint64_t value);
    // Shorter than 2 GiB.
    void writeString(std::uint32_t field, std::string_view text);

    // The most bytes of a field besides those of its text: the tag, and the longest number.
    static constexpr std::size_t longestHead = 5 + 10;

private:
    std::string& out_;
};

} // namespace foundation
