// SPDX-License-Identifier: Apache-2.0
// The rules are applied to the newest rows, and what comes of it is dropped.
#include "kesto-uplink/Suspects.h"

#include "kesto-uplink/outbox/Outbox.h"

#include <fmt/format.h>
#include <optional>

namespace kesto_uplink {

namespace {
constexpr std::int64_t newestEvents = 20'000;
}

std::vector<std::string> suspects(const Places& places, const UplinkConfiguration& configuration)
{
    Outbox outbox(places.database, configuration, newIdentity(0));
    Cursor place = outbox.beforeNewest(newestEvents);
    bool isEmpty = true;
    while (const auto batch = outbox.next(place, {}, 0)) {
        place = batch->last;
        isEmpty = false;
    }
    std::vector<std::string> sentences;
    if (!isEmpty)
        for (const auto& [line, what] : outbox.unused())
            sentences.push_back(fmt::format("{}:{}: {} among the newest in the event store: correct the line, or "
                                            "remove it",
                                            places.configuration.native(), line, what));
    return sentences;
}

} // namespace kesto_uplink
