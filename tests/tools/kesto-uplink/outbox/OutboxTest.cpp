// SPDX-License-Identifier: Apache-2.0
// What leaves a store, in which batches, and what is left out and why.
#include "kesto-uplink/outbox/Outbox.h"

#include "support/TemporaryDirectory.h"
#include "tools/kesto-uplink/MadeEventStore.h"
#include "tools/kesto-uplink/outbox/Sent.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <optional>
#include <random>

namespace kesto_uplink_test {
namespace {

using kesto_uplink::Batch;
using kesto_uplink::Cursor;
using kesto_uplink::Outbox;
using kesto_uplink::OutboxLimits;
using kesto_uplink::Rule;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Pair;
using testing::SizeIs;
using Action = Rule::Action;

constexpr const char* epoch = "0123456789abcdef0123456789abcdef";
constexpr const char* start = "com.quarn.kesto.Playback.Start";
constexpr const char* other = "com.quarn.music.Playback.Start";

class UplinkOutbox : public testing::Test {
protected:
    UplinkOutbox()
    {
        configuration.allowed.events = {
            {.names = "com.quarn.kesto.*", .rules = {{.key = "key", .action = Action::Keep}}}};
        configuration.allowed.stretches.emplace();
        configuration.allowed.sessions = std::vector<Rule>{{.key = "application", .action = Action::Keep}};
    }

    [[nodiscard]] Outbox outbox(const OutboxLimits& limits = {}) const
    {
        return {database, configuration, {.pseudonym = std::string(32, 'd'), .hashKey = "key"}, limits};
    }
    [[nodiscard]] std::optional<Batch> next(std::int64_t after = 0, const std::set<std::int64_t>& open = {},
                                            const OutboxLimits& limits = {}) const
    {
        return outbox(limits).next({epoch, after}, open, 5000);
    }

    const support::TemporaryDirectory directory;
    const std::filesystem::path database = directory / "analytics.sqlite3";
    kesto_uplink::UplinkConfiguration configuration;
};

TEST_F(UplinkOutbox, HasNothingWithoutAStore)
{
    EXPECT_FALSE(next());
    EXPECT_EQ(outbox().newest(), Cursor());
    const MadeEventStore store(database);
    EXPECT_FALSE(next());
    EXPECT_EQ(outbox().newest(), (Cursor{epoch, 0}));
}

TEST_F(UplinkOutbox, MakesOneBatchOfAFewRows)
{
    MadeEventStore store(database);
    store.addEvent(start, R"({"key":1,"secret":2})");
    store.addEvent(other, R"({"key":1})");
    store.addStretch();
    const auto batch = next();
    ASSERT_TRUE(batch);
    EXPECT_EQ(batch->first, (Cursor{epoch, 1}));
    EXPECT_EQ(batch->last, (Cursor{epoch, 3}));
    EXPECT_EQ(batch->messageID, std::string(32, 'd') + ":" + epoch + ":1:3");
    EXPECT_EQ(batch->rows, 2);
    EXPECT_EQ(batch->oldest, 1000);
    EXPECT_EQ(unpacked(batch->bytes), batch->lines);
    const auto rows = rowsIn(batch->lines);
    ASSERT_THAT(rows, SizeIs(3));
    EXPECT_EQ(textIn(rows[0], "kind"), "device");
    EXPECT_EQ(textIn(rows[0], "sent"), "5000");
    EXPECT_EQ(textIn(rows[0], "first"), "1");
    EXPECT_EQ(textIn(rows[0], "last"), "3");
    EXPECT_EQ(textIn(rows[1], "payload"), R"({"key":1})");
    EXPECT_EQ(textIn(rows[2], "kind"), "stretch");
    EXPECT_THAT(batch->leftOut.notAllowed, ElementsAre(Pair(other, 1)));
    EXPECT_EQ(batch->leftOut.rows(), 1);
    EXPECT_EQ(batch->leftOut.lostToAge, 0);
    EXPECT_FALSE(next(3));
}

TEST_F(UplinkOutbox, SendsBothNamesOfAMessageIfBothMayLeave)
{
    MadeEventStore store(database);
    store.addEvent(start, "{}", {}, 1000, "com.quarn.longformaudio.Playback.Start");
    EXPECT_EQ(next()->rows, 1);
    configuration.allowed.events.push_back({.names = "com.quarn.longformaudio.*"});
    EXPECT_EQ(next()->rows, 2);
    EXPECT_EQ(next()->last.id, 2);
}

// Such a batch is not sent: it only says how far there is nothing.
TEST_F(UplinkOutbox, SaysWhenNothingOfARangeMayLeave)
{
    MadeEventStore store(database);
    for (int count = 0; count < 5; ++count)
        store.addEvent(other);
    const auto batch = next();
    ASSERT_TRUE(batch);
    EXPECT_EQ(batch->rows, 0);
    EXPECT_EQ(batch->lines, "");
    EXPECT_EQ(batch->bytes, "");
    EXPECT_EQ(batch->last, (Cursor{epoch, 5}));
    EXPECT_EQ(batch->progress().notAllowed, 5);
    EXPECT_FALSE(next(5));
}

TEST_F(UplinkOutbox, NamesWhatCannotLeave)
{
    MadeEventStore store(database);
    store.addEvent(start, "no json");
    store.addEvent(start, "[1]");
    store.addEvent(start, R"({"key":1})");
    const auto batch = next();
    EXPECT_EQ(batch->rows, 1);
    EXPECT_THAT(batch->leftOut.unreadable, ElementsAre(Pair(start, 2)));
    EXPECT_EQ(batch->progress().notAllowed, 2);
}

TEST_F(UplinkOutbox, DoesNotCountTheNumbersThatTheStoreSkippedAfterALossOfPower)
{
    MadeEventStore store(database);
    for (int count = 0; count < 10; ++count)
        store.addEvent(start);
    store.execute("UPDATE store SET next_event = next_event + 1000000000");
    store.addEvent(start);
    EXPECT_EQ(next(4)->leftOut.lostToAge, 0);
    EXPECT_EQ(next(4)->rows, 7);
    EXPECT_EQ(next(14)->leftOut.lostToAge, 0) << "four that were read are lost";
    EXPECT_EQ(next(14)->last.id, 1'000'000'011);
    store.execute("DELETE FROM messages WHERE id < 4");
    store.execute("UPDATE store SET next_event = next_event + 1000000000");
    store.addEvent(start);
    EXPECT_EQ(next(1)->leftOut.lostToAge, 2) << "the second and the third";
}

TEST_F(UplinkOutbox, FindsThePlaceBeforeTheNewestEvents)
{
    EXPECT_EQ(outbox().beforeNewest(2), Cursor()) << "there is no store";
    MadeEventStore store(database);
    for (int count = 0; count < 5; ++count)
        store.addEvent(start);
    store.execute("UPDATE store SET next_event = next_event + 1000000000");
    store.addEvent(start);
    EXPECT_EQ(outbox().beforeNewest(2), (Cursor{epoch, 4}));
    EXPECT_EQ(outbox().beforeNewest(6), (Cursor{epoch, 0}));
}

TEST_F(UplinkOutbox, CountsWhatAgedOutBeforeItWasRead)
{
    MadeEventStore store(database);
    for (int count = 0; count < 10; ++count)
        store.addEvent(start);
    store.execute("DELETE FROM messages WHERE id IN (3, 7)");
    store.removeBelow(3);
    // From the second on: 2, 3 and 7 are missing.
    EXPECT_EQ(next(1)->leftOut.lostToAge, 3);
    EXPECT_EQ(next(1)->rows, 6);
    // What was removed before the uplink began is not lost by it.
    EXPECT_EQ(next(0)->first, (Cursor{epoch, 4}));
    EXPECT_EQ(next(0)->leftOut.lostToAge, 1);
    store.execute("DELETE FROM messages");
    store.addEvent(start);
    EXPECT_EQ(next(4)->leftOut.lostToAge, 6);
}

TEST_F(UplinkOutbox, BeginsAnewWithAnotherDatabase)
{
    MadeEventStore store(database);
    for (int count = 0; count < 5; ++count)
        store.addEvent(start);
    Outbox reader = outbox();
    const auto batch = reader.next({"another epoch", 4}, {77}, 5000);
    ASSERT_TRUE(batch);
    EXPECT_EQ(batch->first, (Cursor{epoch, 1}));
    EXPECT_EQ(batch->rows, 5);
    EXPECT_THAT(batch->openSessions, IsEmpty());
    store.setEpoch("new");
    EXPECT_EQ(reader.next(batch->last, {}, 5000)->first, (Cursor{"new", 1}));
}

// What left before the damage must not leave once more under the new epoch.
TEST_F(UplinkOutbox, GoesOnInTheDatabaseThatHasTheSavedRowsOfADamagedOne)
{
    MadeEventStore store(database);
    for (int count = 0; count < 9; ++count)
        store.addEvent(start);
    store.execute("INSERT INTO earlier_epochs VALUES (7, 'damaged'), (8, 'while it was repaired')");
    EXPECT_EQ(outbox().next({"damaged", 4}, {}, 5000)->first, (Cursor{epoch, 5}));
    EXPECT_EQ(outbox().next({"damaged", 8}, {}, 5000)->first, (Cursor{epoch, 7})); // 7 and 8 are other rows here
    EXPECT_EQ(outbox().next({"damaged", 0}, {}, 5000)->first, (Cursor{epoch, 1}));
    EXPECT_EQ(outbox().next({"another", 4}, {}, 5000)->first, (Cursor{epoch, 1}));
}

TEST_F(UplinkOutbox, FollowsADatabaseThatIsReplaced)
{
    Outbox reader = outbox();
    {
        MadeEventStore store(database);
        store.addEvent(start);
    }
    EXPECT_EQ(reader.next({}, {}, 5000)->last, (Cursor{epoch, 1}));
    std::filesystem::remove(database);
    MadeEventStore store(database);
    store.setEpoch("second");
    store.addEvent(start);
    store.addEvent(start);
    EXPECT_EQ(reader.next({epoch, 1}, {}, 5000)->last, (Cursor{"second", 2}));
}

// Saved rows come in any order, and beside new ones.
TEST_F(UplinkOutbox, WaitsWhileTheServiceSavesTheRowsOfADamagedStore)
{
    MadeEventStore store(database);
    store.addEvent(start);
    store.execute("INSERT INTO kinds(id, name) VALUES (1000000, '')");
    EXPECT_FALSE(next());
    EXPECT_THROW(static_cast<void>(outbox().newest()), EventStoreError);
    store.execute("DELETE FROM kinds WHERE name = ''; CREATE TABLE saved_store(row)");
    EXPECT_FALSE(next());
    store.execute("DROP TABLE saved_store");
    EXPECT_TRUE(next());
}

TEST_F(UplinkOutbox, CutsBatchesByRowsAndBytes)
{
    MadeEventStore store(database);
    for (int count = 0; count < 10; ++count)
        store.addEvent(start, R"({"key":")" + std::string(1000, 'x') + R"("})");
    EXPECT_EQ(next(0, {}, {.rows = 3})->last.id, 3);
    EXPECT_EQ(next(0, {}, {.rowBytes = 2500})->last.id, 2);
    EXPECT_EQ(next(0, {}, {.rowBytes = 10})->last.id, 1);
    EXPECT_EQ(next(0, {}, {.rowsLookedAt = 4, .slice = {.rows = 2}})->last.id, 4);
    EXPECT_EQ(next(0, {}, {.slice = {.rows = 2}})->last.id, 10);
    EXPECT_EQ(next(0, {}, {.slice = {.payloadBytes = 10}})->last.id, 10);
}

std::string noise(std::size_t size)
{
    std::mt19937 random(1);
    std::string text;
    while (text.size() < size)
        text += static_cast<char>('a' + random() % 26);
    return text;
}

TEST_F(UplinkOutbox, NeverMakesABatchThatIsTooLarge)
{
    MadeEventStore store(database);
    for (int count = 0; count < 8; ++count)
        store.addEvent(start, R"({"key":")" + noise(count == 4 ? 20'000 : 2000) + R"("})");
    Outbox reader = outbox({.compressedBytes = 3000});
    const auto batches = allBatches(reader);
    std::int64_t tooLarge = 0;
    for (const Batch& batch : batches) {
        EXPECT_LE(batch.bytes.size(), 3000U);
        for (const auto& [name, count] : batch.leftOut.tooLarge)
            tooLarge += count;
    }
    EXPECT_EQ(tooLarge, 1);
    EXPECT_THAT(keysIn(batches),
                ElementsAre("event 1", "event 2", "event 3", "event 4", "event 6", "event 7", "event 8"));
    EXPECT_EQ(batches.back().last.id, 8);
    Outbox whole = outbox({.wholeBytes = 3000});
    EXPECT_THAT(keysIn(allBatches(whole)), SizeIs(7));
}

TEST_F(UplinkOutbox, PassesOverNeighboursThatAreTooLarge)
{
    MadeEventStore store(database);
    for (int count = 0; count < 4; ++count)
        store.addEvent(start, R"({"key":")" + noise(5000) + R"("})");
    Outbox reader = outbox({.compressedBytes = 1000});
    const auto batches = allBatches(reader);
    EXPECT_THAT(keysIn(batches), IsEmpty());
    EXPECT_EQ(batches.back().last.id, 4);
}

TEST_F(UplinkOutbox, SendsASessionWithItsRowsAndOnceMoreWhenItHasEnded)
{
    MadeEventStore store(database);
    store.addSession(5, "org.example.player");
    store.addSession(6, "org.example.silent");
    store.addEvent(start, "{}", 5);
    store.addEvent(other, "{}", 6); // may not leave, so its session stays
    const auto first = next();
    EXPECT_THAT(keysIn({*first}), ElementsAre("session 5", "event 1"));
    EXPECT_EQ(textIn(rowsIn(first->lines)[1], "ended"), "");
    EXPECT_THAT(first->openSessions, ElementsAre(5));

    store.addEvent(start, "{}", 5);
    const auto second = next(2, first->openSessions);
    EXPECT_THAT(keysIn({*second}), ElementsAre("session 5", "event 3"));

    store.endSession(5);
    store.endSession(6);
    store.addEvent(other);
    const auto third = next(3, second->openSessions);
    EXPECT_THAT(keysIn({*third}), ElementsAre("session 5"));
    EXPECT_EQ(third->rows, 1);
    EXPECT_EQ(textIn(rowsIn(third->lines)[1], "ended"), "1500");
    EXPECT_THAT(third->openSessions, IsEmpty());
}

TEST_F(UplinkOutbox, SendsASessionThatEndsWithItsLastRowOnce)
{
    MadeEventStore store(database);
    store.addSession(5, "org.example.player");
    store.addEvent(start, "{}", 5);
    store.endSession(5);
    const auto batch = next();
    EXPECT_EQ(textIn(rowsIn(batch->lines)[1], "ended"), "1500");
    EXPECT_THAT(batch->openSessions, IsEmpty());
}

TEST_F(UplinkOutbox, ForgetsSessionsThatTheStoreHasForgotten)
{
    MadeEventStore store(database);
    store.addEvent(start);
    EXPECT_THAT(next(0, {5})->openSessions, IsEmpty());
}

TEST_F(UplinkOutbox, SpreadsTheEndsOfManySessions)
{
    MadeEventStore store(database);
    std::set<std::int64_t> open;
    for (std::int64_t id = 1; id <= 5; ++id) {
        store.addSession(id, "org.example.player");
        store.endSession(id);
        open.insert(id);
    }
    store.addEvent(start);
    const auto batch = next(0, open, {.endedSessions = 2});
    EXPECT_THAT(keysIn({*batch}), ElementsAre("session 1", "session 2", "event 1"));
    EXPECT_THAT(batch->openSessions, ElementsAre(3, 4, 5));
}

// Else the ends of many sessions would make a batch too large, and its rows would be blamed for it.
TEST_F(UplinkOutbox, SpreadsTheEndsOfLargeSessions)
{
    MadeEventStore store(database);
    std::set<std::int64_t> open;
    for (std::int64_t id = 1; id <= 8; ++id) {
        store.addSession(id, noise(1000));
        store.endSession(id);
        open.insert(id);
    }
    store.addEvent(start);
    store.addEvent(start);
    for (const OutboxLimits& limits : {OutboxLimits{.compressedBytes = 3000}, OutboxLimits{.wholeBytes = 6000}}) {
        Outbox reader = outbox(limits);
        const auto batches = allBatches(reader, {epoch, 0}, open);
        ASSERT_FALSE(batches.empty());
        for (const Batch& batch : batches) {
            EXPECT_THAT(batch.leftOut.tooLarge, IsEmpty());
            EXPECT_LE(batch.bytes.size(), limits.compressedBytes);
            EXPECT_LE(batch.lines.size(), limits.wholeBytes);
        }
        const auto keys = keysIn(batches);
        EXPECT_THAT(keys, testing::Contains("event 1"));
        EXPECT_THAT(keys, testing::Contains("event 2"));
        EXPECT_THAT(keys, testing::Contains("session 1"));
        EXPECT_EQ(keys.size() - 2 + batches.back().openSessions.size(), 8U);
    }
}

// A range without rows may also end more sessions than fit.
TEST_F(UplinkOutbox, SpreadsTheEndsOfLargeSessionsWithoutRows)
{
    MadeEventStore store(database);
    std::set<std::int64_t> open;
    for (std::int64_t id = 1; id <= 8; ++id) {
        store.addSession(id, noise(1000));
        store.endSession(id);
        open.insert(id);
    }
    store.addEvent(other);
    const auto batch = next(0, open, {.wholeBytes = 4000});
    EXPECT_THAT(keysIn({*batch}), ElementsAre("session 1", "session 2"));
    EXPECT_THAT(batch->openSessions, ElementsAre(3, 4, 5, 6, 7, 8));
    EXPECT_EQ(batch->last.id, 1);
}

TEST_F(UplinkOutbox, SendsNoSessionsIfNoneMayLeave)
{
    configuration.allowed.sessions.reset();
    MadeEventStore store(database);
    store.addSession(5, "org.example.player");
    store.addEvent(start, "{}", 5);
    const auto batch = next();
    EXPECT_THAT(keysIn({*batch}), ElementsAre("event 1"));
    EXPECT_EQ(batch->lines.find("org.example.player"), std::string::npos);
    EXPECT_THAT(batch->openSessions, IsEmpty());
}

TEST_F(UplinkOutbox, FindsThePlaceOfATime)
{
    MadeEventStore store(database);
    for (const double time : {100.0, 200.0, 300.0})
        store.addEvent(start, "{}", {}, time);
    EXPECT_EQ(outbox().before(0), (Cursor{epoch, 0}));
    EXPECT_EQ(outbox().before(200), (Cursor{epoch, 1}));
    EXPECT_EQ(outbox().before(201), (Cursor{epoch, 2}));
    EXPECT_EQ(outbox().before(1000), (Cursor{epoch, 3}));
}

// A reader that keeps a transaction open would hold up the service.
TEST_F(UplinkOutbox, HoldsUpNoWriter)
{
    MadeEventStore store(database);
    store.addEvent(start);
    Outbox reader = outbox();
    EXPECT_TRUE(reader.next({}, {}, 5000));
    EXPECT_TRUE(store.isLogFree());
}

// A store of the first edition has no epoch.
TEST_F(UplinkOutbox, WaitsForTheServiceToReadAStoreOfTheFirstEdition)
{
    const auto connection = platform::SqliteConnection::open(database);
    ASSERT_TRUE(connection
                && (*connection)
                       ->execute("CREATE TABLE events(id INTEGER PRIMARY KEY AUTOINCREMENT, time REAL, name TEXT,"
                                 " payload TEXT); INSERT INTO events(time, name, payload) VALUES (1, 'n', '{}')"));
    EXPECT_FALSE(next());
}

} // namespace
} // namespace kesto_uplink_test
