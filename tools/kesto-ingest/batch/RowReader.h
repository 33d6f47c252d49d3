// SPDX-License-Identifier: Apache-2.0
// Reads one line of a batch: a JSON object with the keys, types and bounds of the schema. Keys that the schema does not
// have are ignored, because later releases of devices send more.
//
// Numbers stay the text that they came as, so that none loses a digit on its way.
#pragma once

#include "kesto-ingest/batch/JsonText.h"
#include "kesto-ingest/batch/Schema.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <expected>
#include <string>
#include <string_view>

namespace kesto_ingest {

enum class ValueKind : std::uint8_t { Absent, Null, False, True, Number, Text, Object, List };

struct RowEntry {
    ValueKind kind = ValueKind::Absent;
    std::string_view text; // of a number or a text; of the payload, the content of a text of JSON that holds it
    double number = 0; // of a field whose type is of real numbers
};

// One row at a time; it keeps its memory for the next. One thread.
class RowReader {
public:
    // The error says what is wrong with the line; the reader then holds no row.
    [[nodiscard]] std::expected<void, std::string> read(std::string_view line);

    // Of the row that was read last.
    [[nodiscard]] const RowKind& kind() const noexcept { return *kind_; }
    // Null if the row does not have the key.
    [[nodiscard]] const RowEntry* find(Key key) const noexcept
    {
        const RowEntry& entry = entries_[static_cast<std::size_t>(key)];
        return entry.kind > ValueKind::Null ? &entry : nullptr;
    }
    // Empty if the row does not have the key.
    [[nodiscard]] std::string_view text(Key key) const noexcept;
    // 0 if the row does not have the key.
    [[nodiscard]] double number(Key key) const noexcept;
    [[nodiscard]] std::uint64_t identity(Key key) const noexcept;

private:
    [[nodiscard]] std::expected<void, std::string> parse(std::string_view line);
    [[nodiscard]] std::expected<void, std::string> checkFields();

    std::array<RowEntry, keyCount> entries_; // by key; their texts are in the next two
    std::string line_; // as parsing it has changed it
    EmbeddedJson payload_;
    const RowKind* kind_ = nullptr;
};

} // namespace kesto_ingest
