// SPDX-License-Identifier: Apache-2.0
// The marks are few: two an hour at most, for as long as events are kept. An earlier mark of the same events stays,
// because it says more.
#include "platform/linux/store/tables/EventAges.h"

#include <initializer_list>
#include <string_view>
#include <utility>

namespace platform {

StoreExpected<EventAges> EventAges::open(SqliteConnection& connection)
{
    EventAges ages;
    const std::initializer_list<std::pair<SqliteStatement*, std::string_view>> wanted = {
        {&ages.insert_, "INSERT OR IGNORE INTO ages(below, kept) VALUES (?, ?)"},
        {&ages.shift_, "UPDATE ages SET kept = kept - ?2 WHERE below <= ?1"},
        {&ages.select_, "SELECT coalesce(max(below), 0) FROM ages WHERE kept <= ?"},
        {&ages.delete_, "DELETE FROM ages WHERE below <= ?"}};
    for (const auto& [statement, sql] : wanted) {
        auto prepared = connection.prepare(sql);
        if (!prepared)
            return std::unexpected(prepared.error());
        *statement = std::move(*prepared);
    }
    const auto last = connection.prepare("SELECT max(kept) FROM ages");
    if (!last)
        return std::unexpected(last.error());
    if (const auto row = last->step(); !row)
        return std::unexpected(row.error());
    ages.lastMark_ = ages.committedMark_ = last->isNull(0) ? -secondsBetweenMarks : last->real(0);
    return ages;
}

StoreExpected<> EventAges::mark(std::int64_t below, double time, double now)
{
    return now - lastMark_ < secondsBetweenMarks ? StoreExpected<>() : markNow(below, time);
}

StoreExpected<> EventAges::markNow(std::int64_t below, double time)
{
    lastMark_ = time;
    return markEarlier(below, time);
}

StoreExpected<> EventAges::markEarlier(std::int64_t below, double time) const
{
    insert_.bind(1, below);
    insert_.bind(2, time);
    return insert_.run();
}

StoreExpected<> EventAges::apply(const AgeClock::Correction& correction) const
{
    shift_.bind(1, correction.below);
    shift_.bind(2, correction.seconds);
    return shift_.run();
}

StoreExpected<std::int64_t> EventAges::keptBy(double time) const
{
    select_.bind(1, time);
    const auto row = select_.step();
    if (!row)
        return std::unexpected(row.error());
    const std::int64_t below = select_.integer(0);
    select_.reset();
    return below;
}

StoreExpected<> EventAges::forget(std::int64_t below) const
{
    delete_.bind(1, below);
    return delete_.run();
}

} // namespace platform
