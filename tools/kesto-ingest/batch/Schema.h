// SPDX-License-Identifier: Apache-2.0
// Which keys each kind of row has, with their types and bounds, and which column of the database each becomes.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
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

// Of all kinds of rows together.
enum class Key : std::uint8_t {
    Device,
    Epoch,
    Kind,
    Model,
    Version,
    Sent,
    First,
    Last,
    Id,
    Time,
    Name,
    Payload,
    Session,
    Happened,
    Application,
    Recording,
    Began,
    Seconds,
    DeviceName,
    Format,
    Channels,
    Volume,
    Ending,
    Reporter,
    Service,
    Process,
    Ended,
    ActiveDevices, // the payload's own, as the next
    LateCycles
};
constexpr std::size_t keyCount = static_cast<std::size_t>(Key::LateCycles) + 1;

enum class Table : std::uint8_t { Batches, Events, Stretches, Sessions };
constexpr std::size_t tableCount = 4;

struct Field {
    Key key;
    FieldType type;
    bool isRequired; // if not, a value that does not fit is left out
    std::string_view column; // empty: it is none, or one with which every row begins
};

struct RowKind {
    std::string_view name;
    Table table;
    Key moment; // its week chooses the partition
    Key otherMoment; // in its place, if that is not told or no date can express it; or the same
    std::string_view microseconds; // the column that has this moment in whole microseconds; empty: none
    std::span<const Field> fields;
};

constexpr std::size_t longestLabel = 128;
constexpr std::size_t longestText = 16 * 1024;
constexpr std::size_t longestName = 256;
constexpr double latestMoment = 4'294'967'295; // the end of 32 bits

[[nodiscard]] std::string_view name(Table table) noexcept;
// Null if there is none of that name.
[[nodiscard]] const RowKind* kindNamed(std::string_view name) noexcept;
[[nodiscard]] std::string_view name(Key key) noexcept;
// A key of a row; none if no kind has it.
[[nodiscard]] std::optional<Key> keyNamed(std::string_view name) noexcept;
// One of the payload's own keys that rows tell, too.
[[nodiscard]] std::optional<Key> payloadKeyNamed(std::string_view name) noexcept;

} // namespace kesto_ingest
