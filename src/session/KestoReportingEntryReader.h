// Reading payload after payload, entry by entry, where each says mostly what the one before it said.
//
// A player sends the same keys in the same order, and most of its values are what they were. So what stands at a place
// is compared, still encoded, with what stood there in the payload of its kind before: equal bytes are an equal entry.
// One comparison then saves taking the entry apart, and saves the reader of a million messages to derive from it
// what it has derived already.
#pragma once

#include "foundation/cbor/CborView.h"
#include "session/KestoReportingMessageStore.h"

#include <algorithm>
#include <array>
#include <cstdint>
#include <string_view>
#include <vector>

// `Note` is what the reader wants to know of a key; it is kept with the place. Valid as long as the store records
// nothing. One thread at a time.
template <typename Note> class KestoReportingEntryReader {
public:
    // Calls `visit(note, value)` for each entry, in order. `learn(key)` is asked for the note, unless it is known from
    // the payload before. The value is a `foundation::CborItem`, or a `foundation::Value` where the payload is not
    // encoded. An item that equals the one before at its place is that item: its bytes stand where they stood.
    template <typename Learn, typename Visit>
    void read(std::uint32_t kind, const KestoReportingMessageStore::Payload& payload, Learn learn, Visit visit)
    {
        if (payload.kept() != nullptr) {
            for (const auto& [key, value] : *payload.kept()) {
                Note note = learn(key.view());
                visit(note, value);
            }
            return;
        }
        auto& places = places_[kind % places_.size()];
        std::string_view rest = foundation::CborItem(payload.encoded()).content();
        for (std::size_t index = 0; !rest.empty(); ++index) {
            if (index == places.size() && index < mostPlaces)
                places.emplace_back();
            Place& place = places[std::min(index, mostPlaces - 1)];
            if (place.entry.empty() || !rest.starts_with(place.entry))
                place.take(rest, learn);
            rest.remove_prefix(place.entry.size());
            visit(place.note, place.value);
        }
    }

private:
    struct Place {
        std::string_view entry; // encoded, the key and the value
        std::string_view key; // the same of the key alone
        foundation::CborItem value;
        Note note{};

        template <typename Learn> void take(std::string_view from, Learn learn)
        {
            if (key.empty() || !from.starts_with(key)) {
                const auto item = foundation::CborItem::at(from.data());
                key = item.bytes();
                note = learn(item.content());
            }
            value = foundation::CborItem::at(from.data() + key.size());
            entry = from.substr(0, key.size() + value.bytes().size());
        }
    };
    // More of both share what there is: they are read as well, only not remembered for long.
    static constexpr std::size_t mostKinds = 8;
    static constexpr std::size_t mostPlaces = 64;

    std::array<std::vector<Place>, mostKinds> places_;
};
