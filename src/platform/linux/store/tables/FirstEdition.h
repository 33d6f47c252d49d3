// SPDX-License-Identifier: Apache-2.0
// Events of the first edition of the database on their way into the second.
//
// The first edition kept a message twice, once for each of its events. Its table stays beside the new ones when the
// file is opened, so that new events can be kept at once. Its events move a few at a time, oldest first, each with its
// ID, each group in one transaction: a service that is killed in between goes on where it was, with nothing lost and
// nothing twice.
#pragma once

#include "platform/linux/store/SqliteConnection.h"
#include "platform/linux/store/tables/StoreSchema.h"

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

namespace platform {

// A message as both editions have it, with the ID of its first event.
struct MovedMessage {
    std::int64_t id = 0;
    double time = 0;
    std::optional<double> happened;
    std::string name;
    std::string secondName; // empty: one event
    std::string payload;
};

// One thread at a time.
class FirstEdition {
public:
    // How many events move in one transaction, so few that new events hardly wait; a few, if they are large.
    static constexpr std::int64_t eventsAtOnce = 1024;
    static constexpr std::size_t mostBytesAtOnce = 1024 * 1024;

    // Nothing if the file has no such events.
    [[nodiscard]] static StoreExpected<std::optional<FirstEdition>> open(SqliteConnection& connection);

    // The next messages. Empty: all were moved.
    [[nodiscard]] StoreExpected<std::vector<MovedMessage>> next();
    // Removes them from the first edition with the running transaction. Counts the events that are missing behind them.
    [[nodiscard]] StoreExpected<> remove(const std::vector<MovedMessage>& moved, StoreCounts& counts);

private:
    SqliteStatement select_;
    SqliteStatement delete_;
    SqliteStatement oldest_;
    std::int64_t end_ = 0; // the ID behind the last event of the first edition
};

} // namespace platform
