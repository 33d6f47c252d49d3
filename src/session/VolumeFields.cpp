// SPDX-License-Identifier: Apache-2.0
// Finding the volume analysis's fields among the entries of a message.
#include "session/VolumeFields.h"

#include "foundation/cbor/Cbor.h"
#include "utility/KestoReportingUtility.h"

namespace session {

namespace {

using Key = VolumeKey;

constexpr std::array<std::string_view, static_cast<std::size_t>(Key::Count)> names{utility::timestampKey,
                                                                                   "session_output_running",
                                                                                   "session_duration",
                                                                                   "session_selected_format",
                                                                                   "active_devices",
                                                                                   "spatializationEnabled",
                                                                                   "spatial-audio-accessory-feature",
                                                                                   "ringerstate",
                                                                                   "PomoSessionVolume",
                                                                                   "mChannelsPerFrame"};

// The length comes first: it tells nearly all keys of a message apart.
constexpr std::optional<Key> keyOf(std::string_view name)
{
    const auto candidates = [&]() -> std::array<Key, 2> {
        switch (name.size()) {
        case 11: return {Key::RingerState, Key::RingerState};
        case 14: return {Key::ActiveDevices, Key::ActiveDevices};
        case 16: return {Key::Duration, Key::Duration};
        case 17: return {Key::Volume, Key::ChannelsPerFrame};
        case 21: return {Key::SpatializationEnabled, Key::SpatializationEnabled};
        case 22: return {Key::OutputRunning, Key::OutputRunning};
        case 23: return {Key::SelectedFormat, Key::SelectedFormat};
        case 24: return {Key::Timestamp, Key::Timestamp};
        case 31: return {Key::SpatialAudioAccessoryFeature, Key::SpatialAudioAccessoryFeature};
        default: return {Key::Count, Key::Count};
        }
    }();
    for (const Key key : candidates)
        if (key != Key::Count && names[static_cast<std::size_t>(key)] == name)
            return key;
    return std::nullopt;
}

// Every key must stand in both tables.
constexpr bool findsEveryKey()
{
    for (std::size_t key = 0; key < names.size(); ++key)
        if (keyOf(names[key]) != static_cast<Key>(key))
            return false;
    return true;
}
static_assert(findsEveryKey());

} // namespace

std::string_view volumeKeyName(VolumeKey key)
{
    return names[static_cast<std::size_t>(key)];
}

foundation::Number VolumeFields::number(Key key) const
{
    if (!has(key))
        return {};
    const auto number = item(key).number();
    return number ? *number : foundation::Number(value(key).asDouble());
}

bool VolumeFields::boolean(Key key) const
{
    if (!has(key))
        return false;
    const auto number = item(key).number();
    return number ? number->booleanValue() : value(key).asBoolean();
}

void VolumeFields::merge(const VolumeFields& other)
{
    for (std::size_t index = 0; index < items_.size(); ++index)
        if (!other.items_[index].bytes().empty())
            items_[index] = other.items_[index];
}

VolumeFields VolumeFieldsReader::read(const MessageStore::Cursor& message)
{
    VolumeFields fields;
    entries_.read(message.kind(), message.payload(), keyOf, [&](std::optional<Key> key, foundation::CborItem item) {
        if (key)
            fields.set(*key, item);
    });
    return fields;
}

foundation::CborItem VolumeFieldsReader::keep(const foundation::Value& value)
{
    std::string& encoded = kept_.emplace_back();
    foundation::appendCbor(value, encoded);
    return foundation::CborItem(encoded);
}

} // namespace session
