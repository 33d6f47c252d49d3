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
    {"device", FieldType::Digits, required, "device"},
    {"epoch", FieldType::Digits, required, "epoch"},
    {"kind", FieldType::Text, required, ""},
    {"model", FieldType::Label, optional, "model"},
    {"version", FieldType::Label, optional, "version"},
    {"sent", FieldType::Moment, required, "sent"},
    {"first", FieldType::Identity, required, "first_id"},
    {"last", FieldType::Identity, required, "last_id"},
};

constexpr Field eventFields[] = {
    {"device", FieldType::Digits, required, "device"},
    {"epoch", FieldType::Digits, required, "epoch"},
    {"kind", FieldType::Text, required, ""},
    {"id", FieldType::Identity, required, "id"},
    {"time", FieldType::Moment, required, "time"},
    {"name", FieldType::Text, required, "name"},
    {"payload", FieldType::Object, required, "payload"},
    {"payload.active_devices", FieldType::Name, optional, "audio_device"},
    {"payload.late_cycles", FieldType::Number, optional, "late_cycles"},
    {"session", FieldType::Identity, optional, "session"},
    {"happened", FieldType::Number, optional, "happened"},
    {"application", FieldType::Text, optional, "application"},
};

constexpr Field stretchFields[] = {
    {"device", FieldType::Digits, required, "device"},
    {"epoch", FieldType::Digits, required, "epoch"},
    {"kind", FieldType::Text, required, ""},
    {"id", FieldType::Identity, required, "id"},
    {"recording", FieldType::Flag, required, "recording"},
    {"began", FieldType::Moment, required, ""},
    {"seconds", FieldType::Length, required, "microseconds"},
    {"session", FieldType::Identity, optional, "session"},
    {"device_name", FieldType::Text, optional, "audio_device"},
    {"format", FieldType::Text, optional, "format"},
    {"channels", FieldType::Count, optional, "channels"},
    {"volume", FieldType::Share, optional, "volume_millionths"},
    {"application", FieldType::Text, optional, "application"},
    {"ending", FieldType::Text, optional, "ending"},
};

constexpr Field sessionFields[] = {
    {"device", FieldType::Digits, required, "device"},
    {"epoch", FieldType::Digits, required, "epoch"},
    {"kind", FieldType::Text, required, ""},
    {"id", FieldType::Identity, required, "id"},
    {"reporter", FieldType::Integer, optional, "reporter"},
    {"service", FieldType::Text, optional, "service"},
    {"application", FieldType::Text, optional, "application"},
    {"process", FieldType::Text, optional, "process"},
    {"began", FieldType::Moment, required, "began"},
    {"ended", FieldType::Number, optional, "ended"},
};

constexpr std::array<RowKind, tableCount> kinds = {
    RowKind{"device", Table::Batches, "sent", "", "", deviceFields},
    RowKind{"event", Table::Events, "happened", "time", "happened_us", eventFields},
    RowKind{"stretch", Table::Stretches, "began", "", "began_us", stretchFields},
    RowKind{"session", Table::Sessions, "began", "", "", sessionFields},
};

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

bool hasField(std::string_view key) noexcept
{
    return std::ranges::any_of(kinds, [key](const RowKind& kind) {
        return std::ranges::find(kind.fields, key, &Field::key) != kind.fields.end();
    });
}

} // namespace kesto_ingest
