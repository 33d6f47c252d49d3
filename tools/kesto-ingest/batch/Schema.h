// SPDX-License-Identifier: Apache-2.0
// Which keys each kind of row has, with their types and bounds, and which column of the database each becomes.
#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <string_view>

namespace kesto_ingest {

enum class FieldType : std::uint8_t {
    Digits, // 32 hexadecimal digits, lower case
    Identity, // an integer of 63 bits, not negative
    Moment, // seconds since 1970 UTC that a date of the database can express
    Number, // finite
    Length, // seconds that a moment can have; a column of whole microseconds
    Share, // a number; a column of whole millionths of 0 to 1
    Count, // an integer of 32 bits, not negative
    Integer, // of 64 bits
    Flag, // a boolean
    Label, // a short text, which stands in every row of a batch
    Text,
    Name, // a text, or what is told in its place; cut to the length that a device's name has in a report
    Object // JSON
};

enum class Table : std::uint8_t { Batches, Events, Stretches, Sessions };
constexpr std::size_t tableCount = 4;

struct Field {
    std::string_view key; // "payload.KEY" is one of the payload's own keys
    FieldType type;
    bool isRequired; // if not, a value that does not fit is left out
    std::string_view column; // empty: it is no column
};

struct RowKind {
    std::string_view name;
    Table table;
    std::string_view moment; // the key of the moment whose week chooses the partition
    std::string_view otherMoment; // the key in its place, if that is not told or no date can express it
    std::string_view microseconds; // the column that has this moment in whole microseconds; empty: none
    std::span<const Field> fields;
};

constexpr std::size_t mostFields = 32; // of all kinds together
constexpr std::size_t longestLabel = 128;
constexpr std::size_t longestText = 16 * 1024;
constexpr std::size_t longestName = 256;
constexpr double latestMoment = 4'294'967'295; // the end of 32 bits

[[nodiscard]] std::string_view name(Table table) noexcept;
// Null if there is none of that name.
[[nodiscard]] const RowKind* kindNamed(std::string_view name) noexcept;
// Of any kind.
[[nodiscard]] bool hasField(std::string_view key) noexcept;

} // namespace kesto_ingest
