// SPDX-License-Identifier: Apache-2.0
// Reads payloads one after the other, entry by entry, where most entries repeat those of the payload before.
//
// A player sends the same keys in the same order, and most values do not change. So the reader compares each entry,
// still encoded, with the entry at the same place in the previous payload of its kind: equal bytes are an equal entry.
// One comparison then saves decoding the entry.
//
// An entry that did not change is returned as the same item as before. So a reader of a million messages keeps the item
// from which it derived something, and asks `isSameAs` whether it has to derive it again.
#pragma once

#include "foundation/cbor/CborView.h"
#include "session/MessageStore.h"

#include <algorithm>
#include <array>
#include <cassert>
#include <cstdint>
#include <string_view>
#include <vector>

namespace session {

// `Note` is what the caller wants to know about a key; it is kept with the place. One thread at a time.
template <typename Note> class EntryReader {
public:
    // Calls `visit(note, item)` for each entry, in order. Calls `learn(key)` for the note unless the previous payload
    // gave it. The payload must be encoded. The items are valid as long as the store records nothing.
    template <typename Learn, typename Visit>
    void read(std::uint32_t kind, const MessageStore::Payload& payload, Learn learn, Visit visit)
    {
        assert(payload.kept() == nullptr);
        auto& places = places_[kind % places_.size()];
        std::string_view rest = foundation::CborItem(payload.encoded()).content();
        for (std::size_t index = 0; !rest.empty(); ++index) {
            if (index == places.size() && index < mostPlaces)
                places.emplace_back();
            Place& place = places[std::min(index, mostPlaces - 1)];
            if (place.entry.empty() || !rest.starts_with(place.entry))
                place.take(rest, learn);
            rest.remove_prefix(place.entry.size());
            visit(place.note, place.item);
        }
    }

private:
    struct Place {
        std::string_view entry; // encoded, the key and the value
        std::string_view key; // of the key alone, encoded
        foundation::CborItem item; // the value
        Note note{};

        template <typename Learn> void take(std::string_view from, Learn learn)
        {
            if (key.empty() || !from.starts_with(key)) {
                const auto name = foundation::CborItem::at(from.data());
                key = name.bytes();
                note = learn(name.content());
            }
            item = foundation::CborItem::at(from.data() + key.size());
            entry = from.substr(0, key.size() + item.bytes().size());
        }
    };
    // Further kinds share these places: they are read as well, but not remembered for long.
    static constexpr std::size_t mostKinds = 8;
    static constexpr std::size_t mostPlaces = 64;

    std::array<std::vector<Place>, mostKinds> places_;
};

} // namespace session
