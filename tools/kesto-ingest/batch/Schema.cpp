// SPDX-License-Identifier: Apache-2.0
// The kinds of rows.
#include "kesto-ingest/batch/Schema.h"

#include <algorithm>
#include <array>

namespace kesto_ingest {

namespace {

constexpr bool required = true;
constexpr bool optional = false;

constexpr Field deviceFields[] = {
    {Key::Device, FieldType::Digits, required, ""},
    {Key::Epoch, FieldType::Digits, required, ""},
    {Key::Kind, FieldType::Text, required, ""},
    {Key::Model, FieldType::Label, optional, "model"},
    {Key::Version, FieldType::Label, optional, "version"},
    {Key::Sent, FieldType::Moment, required, "sent"},
    {Key::First, FieldType::Identity, required, "first_id"},
    {Key::Last, FieldType::Identity, required, "last_id"},
};

constexpr Field eventFields[] = {
    {Key::Device, FieldType::Digits, required, ""},
    {Key::Epoch, FieldType::Digits, required, ""},
    {Key::Kind, FieldType::Text, required, ""},
    {Key::Id, FieldType::Identity, required, "id"},
    {Key::Time, FieldType::Moment, required, "time"},
    {Key::Name, FieldType::Text, required, "name"},
    {Key::Payload, FieldType::Object, required, "payload"},
    {Key::ActiveDevices, FieldType::Name, optional, "audio_device"},
    {Key::LateCycles, FieldType::Number, optional, "late_cycles"},
    {Key::Session, FieldType::Identity, optional, "session"},
    {Key::Happened, FieldType::Number, optional, "happened"},
    {Key::Application, FieldType::Text, optional, "application"},
};

constexpr Field stretchFields[] = {
    {Key::Device, FieldType::Digits, required, ""},
    {Key::Epoch, FieldType::Digits, required, ""},
    {Key::Kind, FieldType::Text, required, ""},
    {Key::Id, FieldType::Identity, required, "id"},
    {Key::Recording, FieldType::Flag, required, "recording"},
    {Key::Began, FieldType::Moment, required, ""},
    {Key::Seconds, FieldType::Length, required, "microseconds"},
    {Key::Session, FieldType::Identity, optional, "session"},
    {Key::DeviceName, FieldType::Text, optional, "audio_device"},
    {Key::Format, FieldType::Text, optional, "format"},
    {Key::Channels, FieldType::Count, optional, "channels"},
    {Key::Volume, FieldType::Share, optional, "volume_millionths"},
    {Key::Application, FieldType::Text, optional, "application"},
    {Key::Ending, FieldType::Text, optional, "ending"},
};

constexpr Field sessionFields[] = {
    {Key::Device, FieldType::Digits, required, ""},
    {Key::Epoch, FieldType::Digits, required, ""},
    {Key::Kind, FieldType::Text, required, ""},
    {Key::Id, FieldType::Identity, required, "id"},
    {Key::Reporter, FieldType::Integer, optional, "reporter"},
    {Key::Service, FieldType::Text, optional, "service"},
    {Key::Application, FieldType::Text, optional, "application"},
    {Key::Process, FieldType::Text, optional, "process"},
    {Key::Began, FieldType::Moment, required, "began"},
    {Key::Ended, FieldType::Number, optional, "ended"},
};

constexpr std::array<RowKind, tableCount> kinds = {
    RowKind{"device", Table::Batches, Key::Sent, Key::Sent, "", deviceFields},
    RowKind{"event", Table::Events, Key::Happened, Key::Time, "happened_us", eventFields},
    RowKind{"stretch", Table::Stretches, Key::Began, Key::Began, "began_us", stretchFields},
    RowKind{"session", Table::Sessions, Key::Began, Key::Began, "", sessionFields},
};

constexpr std::array<std::string_view, keyCount> keyNames = {
    "device",  "epoch",   "kind",        "model",          "version",    "sent",     "first",       "last",
    "id",      "time",    "name",        "payload",        "session",    "happened", "application", "recording",
    "began",   "seconds", "device_name", "format",         "channels",   "volume",   "ending",      "reporter",
    "service", "process", "ended",       "active_devices", "late_cycles"};

std::optional<Key> findKey(std::string_view name, Key first, Key last) noexcept
{
    for (auto place = static_cast<std::size_t>(first); place <= static_cast<std::size_t>(last); ++place)
        if (keyNames[place] == name)
            return static_cast<Key>(place);
    return std::nullopt;
}

} // namespace

std::string_view name(Table table) noexcept
{
    constexpr std::array<std::string_view, tableCount> names = {"batches", "events", "stretches", "sessions"};
    return names[static_cast<std::size_t>(table)];
}

const RowKind* kindNamed(std::string_view name) noexcept
{
    const auto* const kind = std::ranges::find(kinds, name, &RowKind::name);
    return kind == kinds.end() ? nullptr : kind;
}

std::string_view name(Key key) noexcept
{
    return keyNames[static_cast<std::size_t>(key)];
}

std::optional<Key> keyNamed(std::string_view name) noexcept
{
    return findKey(name, Key::Device, Key::Ended);
}

std::optional<Key> payloadKeyNamed(std::string_view name) noexcept
{
    return findKey(name, Key::ActiveDevices, Key::LateCycles);
}

} // namespace kesto_ingest
