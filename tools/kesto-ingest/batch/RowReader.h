// SPDX-License-Identifier: Apache-2.0
// Reads one line of a batch: a JSON object with the keys, types and bounds of the schema. Keys that the schema does not
// have are ignored, because later releases of devices send more.
//
// Numbers stay the text that they came as, so that none loses a digit on its way.
#pragma once

#include "kesto-ingest/batch/Schema.h"

#include <array>
#include <cstdint>
#include <expected>
#include <string>
#include <string_view>

namespace kesto_ingest {

enum class ValueKind : std::uint8_t { Null, False, True, Number, Text, Object, List };

struct RowEntry {
    std::string key;
    ValueKind kind = ValueKind::Null;
    std::string text; // of a number or a text, and the compact JSON of an object
};

// One row at a time; it keeps its memory for the next. One thread.
class RowReader {
public:
    // The error says what is wrong with the line; the reader then holds no row.
    [[nodiscard]] std::expected<void, std::string> read(std::string_view line);

    // Of the row that was read last.
    [[nodiscard]] const RowKind& kind() const noexcept { return *kind_; }
    // Null if the row does not have the key; the keys are those of the schema.
    [[nodiscard]] const RowEntry* find(std::string_view key) const noexcept;
    [[nodiscard]] std::string_view text(std::string_view key) const noexcept;
    [[nodiscard]] double number(std::string_view key) const noexcept;
    [[nodiscard]] std::uint64_t identity(std::string_view key) const noexcept;

private:
    [[nodiscard]] std::expected<void, std::string> parse(std::string_view line);
    [[nodiscard]] std::expected<void, std::string> checkFields();

    std::array<RowEntry, mostFields> entries_;
    std::size_t size_ = 0;
    const RowKind* kind_ = nullptr;
};

} // namespace kesto_ingest
