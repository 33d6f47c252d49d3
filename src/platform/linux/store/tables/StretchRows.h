// SPDX-License-Identifier: Apache-2.0
// The rows of stretches: those that are over, and, for the next start of a service that is killed, those that run.
//
// A stretch that is over gets its ID from the sequence of the events, so it is as old as the events around it and goes
// with them.
#pragma once

#include "platform/linux/store/SqliteConnection.h"
#include "platform/linux/store/stretches/Stretches.h"

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace platform {

// One thread at a time; the functions that write, inside a transaction.
class StretchRows {
public:
    // What rows of both tables have in common.
    struct Owner {
        std::int64_t holder = 0; // whose share of the room it takes
        std::optional<std::int64_t> session; // a row of `sessions`
    };
    // One that ran when the service was killed.
    struct Unfinished {
        Owner owner;
        Stretch stretch; // without its length; it began by the service's clock
    };
    struct Range { // of IDs
        std::int64_t from = 0;
        std::int64_t below = 0;
        std::optional<std::int64_t> holder; // none: of all
    };
    struct Removed {
        std::int64_t holder = 0;
        std::int64_t bytes = 0;
    };

    [[nodiscard]] static StoreExpected<StretchRows> open(SqliteConnection& connection);

    // What a row takes besides what every row takes.
    [[nodiscard]] static std::size_t bytesOf(const PlayingState& state) noexcept;

    [[nodiscard]] StoreExpected<> insert(std::int64_t id, const Owner& owner, const Stretch& stretch) const;
    // Writes the row of one that runs, in the place of an earlier one.
    [[nodiscard]] StoreExpected<> insertOpen(const Owner& owner, const Stretches::Change& change) const;
    [[nodiscard]] StoreExpected<> removeOpen(Stretches::Key key) const;
    [[nodiscard]] StoreExpected<std::vector<Unfinished>> unfinished() const;
    [[nodiscard]] StoreExpected<> forgetUnfinished() const;

    // Whether there is one below the ID.
    [[nodiscard]] StoreExpected<bool> areBelow(std::int64_t id) const;
    [[nodiscard]] StoreExpected<std::vector<Removed>> remove(const Range& range) const;

private:
    SqliteStatement insert_;
    SqliteStatement insertOpen_;
    SqliteStatement removeOpen_;
    SqliteStatement selectOpen_;
    SqliteStatement forgetOpen_;
    SqliteStatement areBelow_;
    SqliteStatement remove_;
};

} // namespace platform
