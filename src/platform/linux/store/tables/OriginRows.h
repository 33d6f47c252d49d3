// SPDX-License-Identifier: Apache-2.0
// The rows of sources and sessions: who sent the events that the database holds.
#pragma once

#include "platform/linux/store/SqliteConnection.h"
#include "platform/linux/store/tables/KnownOrigins.h"
#include "platform/linux/store/tables/StoreSchema.h"

#include <cstdint>
#include <optional>

namespace platform {

// One thread at a time; the functions below `open` inside a transaction.
class OriginRows {
public:
    struct Rows { // those of one event; none: not known
        std::optional<std::int64_t> source;
        std::optional<std::int64_t> session;
    };

    [[nodiscard]] static StoreExpected<OriginRows> open(SqliteConnection& connection);

    // Ends the rows that an earlier run of the service left open, as far as the next event.
    [[nodiscard]] StoreExpected<> closeEarlierRun(const StoreCounts& counts);
    // The rows of an event's origin, which are made where they are missing.
    [[nodiscard]] StoreExpected<Rows> of(const Origin& origin, KnownOrigins& known, StoreCounts& counts);
    // Writes the rows of sources and sessions that changed or ended.
    [[nodiscard]] StoreExpected<> writeChanges(KnownOrigins& known, const StoreCounts& counts);
    // Removes the rows that no event and no stretch refers to any more.
    [[nodiscard]] StoreExpected<> removeUnused();

private:
    [[nodiscard]] StoreExpected<std::optional<std::int64_t>> sourceRow(std::uint64_t number, KnownOrigins& known,
                                                                       StoreCounts& counts);
    [[nodiscard]] StoreExpected<std::optional<std::int64_t>> sessionRow(std::uint64_t number, KnownOrigins& known,
                                                                        StoreCounts& counts);
    [[nodiscard]] StoreExpected<> write(const KnownOrigin<SourceBegin>& source, const KnownOrigins& known,
                                        std::int64_t nextEvent);
    [[nodiscard]] StoreExpected<> write(const KnownOrigin<SessionBegin>& session, std::optional<std::int64_t> source,
                                        std::int64_t nextEvent);

    SqliteStatement writeSource_;
    SqliteStatement writeSession_;
    SqliteStatement closeSources_;
    SqliteStatement closeSessions_;
    SqliteStatement removeSources_;
    SqliteStatement removeSessions_;
};

} // namespace platform
