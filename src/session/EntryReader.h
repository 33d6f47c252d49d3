// Reading payload after payload, entry by entry, where each says mostly what the one before it said.
//
// A player sends the same keys in the same order, and most of its values are what they were. So what stands at a place
// is compared, still encoded, with what stood there in the payload of its kind before: equal bytes are an equal entry.
// One comparison then saves taking the entry apart.
//
// An entry that is as before is given as the item that it was before. So a reader of a million messages keeps the item
// from which it derived something, and asks `isSameAs` whether it has to derive it again.
#pragma once

#include "foundation/cbor/Cbor.h"
#include "foundation/cbor/CborView.h"
#include "session/MessageStore.h"

#include <algorithm>
#include <array>
#include <cstdint>
#include <deque>
#include <string>
#include <string_view>
#include <vector>

namespace session {

// `Note` is what the reader wants to know of a key; it is kept with the place. One thread at a time.
template <typename Note> class EntryReader {
public:
    // Calls `visit(note, item)` for each entry, in order. `learn(key)` is asked for the note, unless it is known from
    // the payload before. The items are valid as long as the entry reader, and the store records nothing.
    template <typename Learn, typename Visit>
    void read(std::uint32_t kind, const MessageStore::Payload& payload, Learn learn, Visit visit)
    {
        auto& places = places_[kind % places_.size()];
        std::string_view rest = foundation::CborItem(encoded(payload)).content();
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
        std::string_view key; // the same of the key alone
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
    // More of both share what there is: they are read as well, only not remembered for long.
    static constexpr std::size_t mostKinds = 8;
    static constexpr std::size_t mostPlaces = 64;

    std::string_view encoded(const MessageStore::Payload& payload)
    {
        if (payload.kept() == nullptr)
            return payload.encoded();
        foundation::appendCbor(*payload.kept(), encodedHere_.emplace_back());
        return encodedHere_.back();
    }

    std::deque<std::string> encodedHere_; // which the store keeps unencoded
    std::array<std::vector<Place>, mostKinds> places_;
};

} // namespace session
