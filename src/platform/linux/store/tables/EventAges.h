// SPDX-License-Identifier: Apache-2.0
// When events were kept, in the age time: a mark now and then says that the events below an ID were kept by then. So an
// event's age depends on nothing that stands in its row.
#pragma once

#include "platform/linux/store/SqliteConnection.h"
#include "platform/linux/store/tables/AgeClock.h"

#include <cstdint>

namespace platform {

// One thread at a time; the functions that write, inside a transaction.
class EventAges {
public:
    // An event may stay for so many seconds more than it should.
    static constexpr double secondsBetweenMarks = 3600;

    [[nodiscard]] static StoreExpected<EventAges> open(SqliteConnection& connection);

    // Marks that the events below the ID were kept by that time, unless the last mark is less than an hour ago.
    [[nodiscard]] StoreExpected<> mark(std::int64_t below, double time, double now);
    // The same, always.
    [[nodiscard]] StoreExpected<> markNow(std::int64_t below, double time);
    // The same, of events that are older than the last mark.
    [[nodiscard]] StoreExpected<> markEarlier(std::int64_t below, double time) const;
    [[nodiscard]] StoreExpected<> apply(const AgeClock::Correction& correction) const;
    // The ID below which all events were kept by that time.
    [[nodiscard]] StoreExpected<std::int64_t> keptBy(double time) const;
    // Forgets marks of events that are gone: all below the ID.
    [[nodiscard]] StoreExpected<> forget(std::int64_t below) const;
    void rolledBack() noexcept { lastMark_ = committedMark_; }
    void committed() noexcept { committedMark_ = lastMark_; }

private:
    SqliteStatement insert_;
    SqliteStatement shift_;
    SqliteStatement select_;
    SqliteStatement delete_;
    double lastMark_ = 0; // its time
    double committedMark_ = 0;
};

} // namespace platform
