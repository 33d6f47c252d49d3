// SPDX-License-Identifier: Apache-2.0
// How much of the store each of its users holds: a user of the machine, a process by its name, an application that the
// process names for a session. When the store is full, the oldest events of the largest holder go, so that one client
// cannot push out the events of all others.
//
// The largest is looked for from above: the user who holds most, of that user's processes the one that holds most, of
// its applications the one that holds most. So a process that reports under many names only divides its own share, and
// nothing goes of a user who holds no more than others.
#pragma once

#include "platform/linux/store/SqliteConnection.h"

#include <cstdint>
#include <map>
#include <optional>
#include <set>
#include <string>

namespace platform {

struct EventHolder {
    std::optional<std::uint32_t> user; // none: it is not known, as for events of the first edition
    std::string process; // empty: not known, or one of many
    std::string application; // the same

    friend auto operator<=>(const EventHolder&, const EventHolder&) = default;
};

// One thread at a time; the functions that change something, inside a transaction.
class EventHolders {
public:
    // What is beyond counts together, so that names that a client makes up do not fill the memory.
    static constexpr std::size_t mostApplications = 64; // of a process
    static constexpr std::size_t mostProcesses = 64; // of a user
    // What an event takes besides its payload, roughly.
    static constexpr std::int64_t bytesBesidesPayload = 64;

    struct Share {
        std::int64_t bytes = 0;
        std::int64_t oldest = 0; // no event has a lower ID
    };
    struct Largest {
        std::int64_t id = 0;
        EventHolder holder;
        bool isOnlyOne = false; // no other holds anything
        std::int64_t oldest = 0;
    };

    [[nodiscard]] static StoreExpected<EventHolders> open(SqliteConnection& connection);

    // Whose ID that is; one that is not known, if there is none.
    [[nodiscard]] EventHolder holderOf(std::int64_t id) const;
    // The ID of the holder, or of the one that it counts with.
    [[nodiscard]] StoreExpected<std::int64_t> idOf(EventHolder holder, std::int64_t nextEvent);
    void add(std::int64_t id, std::size_t payloadBytes);
    void add(std::int64_t id, std::size_t payloadBytes, std::int64_t event); // an event that is older than others
    void remove(std::int64_t id, std::int64_t payloadBytes);
    // Its events below that ID are gone.
    void setOldest(std::int64_t id, std::int64_t event);
    // It has no events, although some were counted.
    void setEmpty(std::int64_t id);
    [[nodiscard]] std::optional<Largest> largest() const;

    [[nodiscard]] StoreExpected<> writeChanges();
    void committed() { changed_.clear(); }
    // Reads the rows again. If that fails, the next transaction does, too.
    void rolledBack() { (void)load(); }

private:
    [[nodiscard]] StoreExpected<> load();
    void limit(EventHolder& holder) const;

    SqliteStatement select_;
    SqliteStatement insert_;
    SqliteStatement update_;
    SqliteStatement delete_;
    std::map<EventHolder, std::int64_t> ids_;
    std::map<std::int64_t, Share> shares_;
    std::set<std::int64_t> changed_;
};

} // namespace platform
