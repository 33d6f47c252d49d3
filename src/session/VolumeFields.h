// SPDX-License-Identifier: Apache-2.0
// The entries of a message that the volume analysis reads.
//
// They stay encoded, in the store's own memory: the end of a session looks at every message, and unpacking all of them
// would cost more than the analysis.
#pragma once

#include "foundation/cbor/CborView.h"
#include "session/EntryReader.h"
#include "session/MessageStore.h"

#include <array>
#include <cstdint>
#include <deque>
#include <optional>
#include <string>
#include <string_view>

namespace session {

enum class VolumeKey : std::uint8_t {
    Timestamp,
    OutputRunning,
    Duration,
    SelectedFormat,
    ActiveDevices,
    SpatializationEnabled,
    SpatialAudioAccessoryFeature,
    RingerState,
    Volume,
    ChannelsPerFrame,
    Count
};

[[nodiscard]] std::string_view volumeKeyName(VolumeKey key);

// One thread at a time.
class VolumeFields {
public:
    using Key = VolumeKey;

    [[nodiscard]] bool has(Key key) const { return !item(key).bytes().empty(); }
    // The entry's value; null without one.
    [[nodiscard]] foundation::Value value(Key key) const { return has(key) ? item(key).value() : foundation::Value(); }
    // The value as a number, as it counts where a number or a truth value is expected.
    [[nodiscard]] foundation::Number number(Key key) const;
    [[nodiscard]] bool boolean(Key key) const;
    // Whether both have the same value of the key; only the encodings are compared.
    [[nodiscard]] bool isSame(const VolumeFields& other, Key key) const { return item(key).isSameAs(other.item(key)); }

    void set(Key key, foundation::CborItem item) { items_[static_cast<std::size_t>(key)] = item; }
    // Takes over all entries of the other.
    void merge(const VolumeFields& other);

private:
    [[nodiscard]] foundation::CborItem item(Key key) const { return items_[static_cast<std::size_t>(key)]; }

    std::array<foundation::CborItem, static_cast<std::size_t>(Key::Count)> items_;
};

// Reads the fields of payloads. They are valid as long as the reader and the store exist.
class VolumeFieldsReader {
public:
    [[nodiscard]] VolumeFields read(const MessageStore::Cursor& message);
    // Encodes the value and keeps it here.
    [[nodiscard]] foundation::CborItem keep(const foundation::Value& value);

private:
    EntryReader<std::optional<VolumeKey>> entries_;
    std::deque<std::string> kept_;
};

} // namespace session
