// SPDX-License-Identifier: Apache-2.0
// The log's words for every reason for which events are lost, immediately and, at the latest, at the end.
#include "platform/linux/store/EventLosses.h"

#include "platform/linux/store/ManualClock.h"
#include "support/fakes/FakeLog.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace platform {
namespace {

using support::IsLine;
using testing::ElementsAre;
using testing::IsEmpty;

class EventLossesTest : public testing::TestWithParam<std::pair<StoreError, std::string>> {
protected:
    [[nodiscard]] static auto tells(const std::string& beginning)
    {
        return ElementsAre(IsLine(LogLevel::Error, "kerl", beginning + GetParam().second));
    }

    support::ManualClock clock;
    support::FakeLog log;
    std::optional<EventLosses> losses{std::in_place, "/state/analytics.sqlite3", clock, ProviderLog(log)};
};

TEST_P(EventLossesTest, AreToldWhenTheyAreReported)
{
    losses->add(GetParam().first, 7);
    EXPECT_THAT(log.take(), IsEmpty());
    losses->report();
    EXPECT_THAT(log.take(), tells("7 analytics events were lost (7 since the start): /state/analytics.sqlite3: "));
    losses->add(GetParam().first, 2);
    clock.advance(59);
    losses->report();
    EXPECT_THAT(log.take(), IsEmpty());
    clock.advance(1);
    losses->report();
    EXPECT_THAT(log.take(), tells("2 analytics events were lost (9 since the start): /state/analytics.sqlite3: "));
    losses.reset();
    EXPECT_THAT(log.take(), IsEmpty()) << "all losses were reported";
}

TEST_P(EventLossesTest, AreToldAtTheEndAtTheLatest)
{
    losses->add(GetParam().first, 1);
    losses.reset();
    EXPECT_THAT(log.take(), tells("1 analytics events were lost (1 since the start): /state/analytics.sqlite3: "));
}

TEST_P(EventLossesTest, AreAllToldToACallerWhoWaitsNoLonger)
{
    losses->add(GetParam().first, 7);
    losses->report();
    log.take();
    losses->add(GetParam().first, 2);
    losses->reportAll();
    EXPECT_THAT(log.take(), tells("2 analytics events were lost (9 since the start): /state/analytics.sqlite3: "));
    losses.reset();
    EXPECT_THAT(log.take(), IsEmpty()) << "all losses were reported";
}

INSTANTIATE_TEST_SUITE_P(
    OfEachReason, EventLossesTest,
    testing::Values(
        std::pair(StoreError::DiskFull, "the disk is full; make room, or lower maximum_size_mb in analytics.toml"),
        std::pair(StoreError::ReadOnly, "the database is read-only; let the user of the service write to it"),
        std::pair(StoreError::Locked,
                  "another program writes to the database; end it; programs should open the database read-only"),
        std::pair(StoreError::InUse,
                  "another process keeps its events in the same directory; give each service its own state directory"),
        std::pair(StoreError::CannotOpen,
                  "the database cannot be opened or made; let the user of the service write to its directory"),
        std::pair(StoreError::InputOutput, "the disk failed; look for its errors in the kernel's log"),
        std::pair(StoreError::Corrupt,
                  "the database is damaged and cannot be set aside; move it to another place by hand"),
        std::pair(StoreError::Newer,
                  "the database is of a later version and cannot be set aside; move it to another place by hand"),
        std::pair(StoreError::LogHeld,
                  "a program has been reading the database for too long; end it, or let it read in short transactions"),
        std::pair(StoreError::NotJson,
                  "their payloads hold NaN or infinity, which JSON cannot express; correct the "
                  "programs that send them"),
        std::pair(StoreError::Other, "SQLite refused; restart the service and report this")));

} // namespace
} // namespace platform
