// SPDX-License-Identifier: Apache-2.0
// Messages of protocol buffers as text for people, in the text format that the protocol's own tools write and read:
// each field is a line, and objects are indented, in braces.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

namespace foundation {

// Names are those of fields. One thread at a time.
class ProtobufTextFormatter {
public:
    // Appends to `out`, which outlives the formatter.
    explicit ProtobufTextFormatter(std::string& out) noexcept : out_(out) { }

    void beginObject(std::string_view name);
    void endObject(); // of the last begun object

    void format(std::string_view name, std::uint64_t value);
    // In quotation marks; characters that are not printable ASCII become escapes.
    void format(std::string_view name, std::string_view text);

private:
    void indent() { out_.append(2 * depth_, ' '); }

    std::string& out_;
    std::size_t depth_ = 0;
};

} // namespace foundation
