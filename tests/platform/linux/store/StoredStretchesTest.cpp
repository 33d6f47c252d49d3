// SPDX-License-Identifier: Apache-2.0
// Stretches in the database: kept with the events that end them, neither lost nor doubled when a transaction or the
// service ends early, and removed with the events around them.
#include "platform/linux/damage/DatabaseDamage.h"
#include "platform/linux/store/ManualClock.h"
#include "platform/linux/store/SqliteKeeper.h"
#include "platform/linux/store/StoreReader.h"
#include "support/TemporaryDirectory.h"
#include "support/fakes/FakeLog.h"

#include <fmt/format.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <memory>

namespace platform {
namespace {

using foundation::Dictionary;
using ledger::Counter;
using support::StoreReader;
using testing::ElementsAre;
using testing::IsEmpty;

namespace fs = std::filesystem;

constexpr std::uint64_t pageSize = 8192;
constexpr double day = 86400;

class StoredStretchesTest : public testing::Test {
protected:
    // No check is due, which would read beside the tests.
    StoredStretchesTest() { support::writeFile(file.string() + "-checked", "1800000000"); }

    SqliteKeeper& keeper()
    {
        if (!keeper_) {
            keeper_ = std::make_unique<SqliteKeeper>(directory.path(), clock, ProviderLog(log));
            keeper_->setConfiguration(configuration);
        }
        return *keeper_;
    }
    // As a kill leaves the database: nothing ends in order.
    void killService() { keeper_.reset(); }
    void beginSession(std::uint64_t session, std::uint32_t user = 1000)
    {
        batch.announce(SourceBegin{
            .number = session, .userIdentifier = user, .processIdentifier = 77, .processName = "player", .time = 1});
        batch.announce(SessionBegin{.number = session,
                                    .source = session,
                                    .reporterID = 42,
                                    .serviceType = "longformaudio",
                                    .application = "org.example.a",
                                    .time = 1});
    }
    void add(std::string_view kind, const Dictionary& payload = {}, std::uint64_t session = 1)
    {
        const Origin origin{.source = session, .session = session};
        batch.add(clock.secondsSince1970(), origin, fmt::format("com.quarn.kesto.{}", kind), payload);
        batch.add(clock.secondsSince1970(), origin, fmt::format("com.quarn.longformaudio.{}", kind), payload);
    }
    void keepBatch()
    {
        keeper().keep(batch, tally);
        batch.clear();
    }
    void keep(std::string_view kind, const Dictionary& payload = {}, std::uint64_t session = 1)
    {
        add(kind, payload, session);
        keepBatch();
    }
    void maintain()
    {
        while (keeper().tidy(true, tally)) { }
    }
    // A session that began, plays for so long, and stops.
    void play(double seconds, std::uint64_t session = 1)
    {
        keep("Playback.Start", {{"active_devices", "speaker"}, {"PomoSessionVolume", 0.5}}, session);
        clock.advance(seconds);
        keep("Playback.Stop", {{"n", seconds}}, session);
    }
    std::vector<std::string> texts(const std::string& sql) const { return StoreReader(file).texts(sql); }
    std::int64_t number(const std::string& sql) const { return StoreReader(file).number(sql); }
    std::vector<std::string> stretches() const
    {
        return texts("SELECT printf('%g s on %s at %s: %s', seconds, coalesce(device, '?'), coalesce(volume, '?'),"
                     " ending) FROM stretches ORDER BY id");
    }

    support::TemporaryDirectory directory;
    const fs::path file = directory.path() / "analytics.sqlite3";
    support::ManualClock clock;
    support::FakeLog log;
    AnalyticsConfiguration configuration;
    EventBatch batch;
    ledger::Tally tally; // of all runs

private:
    std::unique_ptr<SqliteKeeper> keeper_;
};

TEST_F(StoredStretchesTest, ARowSaysWhoPlayedWhatForHowLong)
{
    beginSession(1);
    add("Playback.Start",
        {{"session_output_running", true},
         {"active_devices", "speaker"},
         {"session_selected_format", "S16LE/44100/2"},
         {"mChannelsPerFrame", 2},
         {"PomoSessionVolume", 0.5},
         {"kestoreporting_timestamp", 1'800'000'000.25}});
    keepBatch();
    EXPECT_THAT(stretches(), IsEmpty());
    keep("Playback.Stop", {{"session_output_running", false}, {"kestoreporting_timestamp", 1'800'000'003}});
    EXPECT_THAT(texts("SELECT printf('%s %s %.2f %.2f %s %s %s %s %s %s', e.application, s.recording, s.began,"
                      " s.seconds, s.device, s.format, s.channels, s.volume, s.ending, x.user)"
                      " FROM stretches s JOIN sessions e ON e.id = s.session JOIN sources x ON x.id = e.source"),
                ElementsAre("org.example.a 0 1800000000.25 2.75 speaker S16LE/44100/2 2 0.5 stopped 1000"));
    EXPECT_EQ(number("SELECT id FROM stretches"), 5) << "behind the two messages of two events";
    EXPECT_EQ(number("SELECT next_event FROM store"), 6);
    EXPECT_EQ(number("SELECT count(*) FROM open_stretches"), 0);
    EXPECT_EQ(tally[Counter::StretchesKept], 1U);
}

TEST_F(StoredStretchesTest, WhatRunsStandsInATableOfItsOwnUntilItEnds)
{
    beginSession(1);
    keep("Record.Start", {{"active_devices", "microphone"}});
    EXPECT_THAT(texts("SELECT recording || ' ' || device || ' ' || session FROM open_stretches"),
                ElementsAre("1 microphone 1"));
    keep("RouteChange.State", {{"active_devices", "headset"}});
    EXPECT_THAT(texts("SELECT device FROM open_stretches"), ElementsAre("headset"));
    clock.advance(2);
    keep("Record.Stop");
    EXPECT_EQ(number("SELECT count(*) FROM open_stretches"), 0);
    EXPECT_THAT(stretches(), ElementsAre("2 s on headset at ?: stopped"));
    EXPECT_EQ(tally[Counter::StretchesLeftOut], 1U) << "on the microphone it took no time";
}

TEST_F(StoredStretchesTest, AnEndWithoutAMessageIsKeptToo)
{
    beginSession(1);
    keep("Playback.Start");
    clock.advance(4);
    batch.announcePlayingEnd(1, clock.secondsSince1970(), PlayingEnding::Vanished);
    keepBatch();
    EXPECT_THAT(stretches(), ElementsAre("4 s on ? at ?: vanished"));
    beginSession(2);
    keep("Playback.Start", {}, 2);
    clock.advance(5);
    batch.announceSessionEnd({.number = 2, .time = clock.secondsSince1970()});
    keepBatch();
    EXPECT_THAT(stretches(), ElementsAre("4 s on ? at ?: vanished", "5 s on ? at ?: stopped"));
    beginSession(3);
    keep("Playback.Start", {}, 3);
    clock.advance(6);
    keeper().beginEnd();
    batch.announcePlayingEnd(3, clock.secondsSince1970(), PlayingEnding::Vanished);
    keepBatch();
    EXPECT_THAT(stretches(),
                ElementsAre("4 s on ? at ?: vanished", "5 s on ? at ?: stopped", "6 s on ? at ?: service-ended"));
}

// --- Transactions that fail

TEST_F(StoredStretchesTest, ALostTransactionNeitherLosesNorDoublesAStretch)
{
    beginSession(1);
    keep("Playback.Start", {{"PomoSessionVolume", 1}});
    clock.advance(2);
    {
        support::Writer other(file);
        other.execute("BEGIN IMMEDIATE");
        add("Volume.State", {{"PomoSessionVolume", 0.5}});
        clock.advance(3);
        keep("Playback.Stop");
        EXPECT_EQ(tally[Counter::LostToLock], 4U);
        other.execute("ROLLBACK");
    }
    EXPECT_THAT(stretches(), IsEmpty());
    EXPECT_EQ(number("SELECT count(*) FROM open_stretches"), 1);
    EXPECT_EQ(tally[Counter::StretchesKept], 0U);
    clock.advance(10);
    keep("Generic.State");
    EXPECT_THAT(stretches(), ElementsAre("2 s on ? at 1.0: change", "3 s on ? at 0.5: stopped"));
    EXPECT_EQ(number("SELECT count(*) FROM open_stretches"), 0);
    keep("Generic.State");
    EXPECT_EQ(stretches().size(), 2U);
    EXPECT_EQ(tally[Counter::StretchesKept], 2U);
}

TEST_F(StoredStretchesTest, ADatabaseThatWasRemovedGetsTheStretchThatEndsThenAndThoseThatRun)
{
    beginSession(1);
    beginSession(2);
    keep("Playback.Start", {{"PomoSessionVolume", 1}});
    keep("Playback.Start", {{"PomoSessionVolume", 0.25}}, 2);
    fs::remove(file);
    clock.advance(2);
    keep("Playback.Stop");
    EXPECT_THAT(stretches(), ElementsAre("2 s on ? at 1.0: stopped"));
    EXPECT_THAT(texts("SELECT volume FROM open_stretches"), ElementsAre("0.25"));
    EXPECT_EQ(number("SELECT count(*) FROM open_stretches JOIN sessions s ON s.id = session"), 1);
    EXPECT_EQ(tally[Counter::StretchesKept], 1U);
}

// --- Runs of the service

TEST_F(StoredStretchesTest, AKilledServiceLeavesAStretchThatEndsWithItsLastTransaction)
{
    beginSession(1);
    beginSession(2);
    keep("Playback.Start", {{"active_devices", "speaker"}, {"PomoSessionVolume", 0.5}});
    clock.advance(30);
    keep("Generic.State", {}, 2);
    clock.advance(100); // nothing says that it played on
    killService();
    clock.advance(1000);
    keeper().open();
    EXPECT_THAT(stretches(), ElementsAre("30 s on speaker at 0.5: service-ended"));
    EXPECT_EQ(number("SELECT count(*) FROM open_stretches"), 0);
    EXPECT_EQ(number("SELECT count(*) FROM stretches x JOIN sessions s ON s.id = x.session"), 1);
    maintain();
    EXPECT_EQ(tally[Counter::StretchesKept], 1U);
    killService();
    keeper().open();
    EXPECT_EQ(stretches().size(), 1U);
}

TEST_F(StoredStretchesTest, AKilledStretchEndsAlsoIfTheFirstOpeningFails)
{
    beginSession(1);
    keep("Playback.Start", {{"active_devices", "speaker"}, {"PomoSessionVolume", 0.5}});
    clock.advance(30);
    keep("Generic.State");
    killService();
    {
        support::Writer other(file);
        other.execute("BEGIN IMMEDIATE");
        keeper().open();
        other.execute("ROLLBACK");
    }
    EXPECT_THAT(stretches(), IsEmpty());
    clock.advance(1000);
    keep("Generic.State");
    EXPECT_THAT(stretches(), ElementsAre("30 s on speaker at 0.5: service-ended"));
    EXPECT_EQ(number("SELECT count(*) FROM open_stretches"), 0);
}

TEST_F(StoredStretchesTest, WithoutATransactionAfterItsBeginAKilledStretchHasNoLength)
{
    beginSession(1);
    keep("Playback.Start");
    clock.advance(100);
    killService();
    keeper().open();
    EXPECT_THAT(stretches(), IsEmpty());
    EXPECT_EQ(number("SELECT count(*) FROM open_stretches"), 0);
    maintain();
    EXPECT_EQ(tally[Counter::StretchesLeftOut], 1U);
}

// A client that comes back reports since when it has been playing.
TEST_F(StoredStretchesTest, WhatPlaysOnAcrossAKillCountsOnce)
{
    const double start = clock.secondsSince1970();
    beginSession(1);
    keep("Playback.Start", {{"kestoreporting_timestamp", start}});
    clock.advance(30);
    keep("Generic.State");
    clock.advance(100);
    killService();
    clock.advance(20);
    beginSession(2);
    keep("Playback.Start", {{"kestoreporting_timestamp", start}}, 2);
    clock.advance(10);
    keep("Playback.Stop", {{"kestoreporting_timestamp", start + 160}}, 2);
    EXPECT_THAT(stretches(), ElementsAre("30 s on ? at ?: service-ended", "130 s on ? at ?: stopped"));
}

TEST_F(StoredStretchesTest, AFirstRunCountsFromTheBeginningThatAMessageNames)
{
    const double start = clock.secondsSince1970() - 50;
    beginSession(1);
    keep("Playback.Start", {{"kestoreporting_timestamp", start}});
    clock.advance(10);
    keep("Playback.Stop", {{"kestoreporting_timestamp", start + 60}});
    EXPECT_THAT(stretches(), ElementsAre("60 s on ? at ?: stopped"));
}

// --- Switched off

TEST_F(StoredStretchesTest, TurnedOffTheStoreEndsWhatRunsAndKeepsNoMore)
{
    beginSession(1);
    keep("Playback.Start", {{"PomoSessionVolume", 0.5}});
    clock.advance(3);
    configuration.stretches = false;
    keeper().setConfiguration(configuration);
    clock.advance(4);
    keep("Playback.Stop");
    play(5);
    EXPECT_THAT(stretches(), ElementsAre("3 s on ? at 0.5: service-ended"));
    EXPECT_EQ(number("SELECT count(*) FROM open_stretches"), 0);
    configuration.stretches = true;
    keeper().setConfiguration(configuration);
    play(6);
    EXPECT_THAT(stretches(), ElementsAre("3 s on ? at 0.5: service-ended", "6 s on speaker at 0.5: stopped"));
}

// --- Room

TEST_F(StoredStretchesTest, TheyGoWithTheEventsOfTheirAge)
{
    beginSession(1);
    play(10);
    clock.advance(91 * day);
    play(20);
    maintain();
    EXPECT_THAT(stretches(), ElementsAre("20 s on speaker at 0.5: stopped"));
    EXPECT_EQ(number("SELECT count(*) FROM messages"), 2);
    EXPECT_EQ(tally[Counter::StretchesRemoved], 1U);
    EXPECT_EQ(number("SELECT bytes FROM holders"),
              number("SELECT (SELECT sum(length(payload) + 64) FROM messages)"
                     " + (SELECT sum(length(device) + 64) FROM stretches)"));
}

TEST_F(StoredStretchesTest, OneThatNoMessageEndedGoesWithItsAgeToo)
{
    beginSession(1);
    keep("Playback.Start");
    clock.advance(2 * 3600);
    batch.announcePlayingEnd(1, clock.secondsSince1970(), PlayingEnding::Stopped);
    keepBatch();
    clock.advance(91 * day);
    maintain();
    clock.advance(61);
    maintain();
    EXPECT_THAT(stretches(), IsEmpty());
    EXPECT_EQ(number("SELECT count(*) FROM messages"), 0);
    EXPECT_EQ(number("SELECT count(*) FROM holders"), 0);
}

TEST_F(StoredStretchesTest, ThoseOfTheLargestHolderGoWithItsEventsAndOthersStay)
{
    configuration.maximumSizeMegabytes = 1;
    beginSession(1, 1000);
    beginSession(2, 1001);
    play(1, 1);
    for (int run = 0; run < 40; ++run) {
        play(2, 2);
        keep("Generic.State", {{"text", std::string(60'000, 'x')}, {"n", run}}, 2);
        maintain();
    }
    EXPECT_EQ(number("SELECT count(*) FROM stretches WHERE seconds = 1"), 1);
    const auto left = number("SELECT count(*) FROM stretches WHERE seconds = 2");
    EXPECT_GT(left, 0);
    EXPECT_LT(left, 40);
    EXPECT_EQ(tally[Counter::StretchesRemoved], 40U - static_cast<std::uint64_t>(left));
    EXPECT_GE(number("SELECT min(id) FROM stretches WHERE seconds = 2"),
              number("SELECT min(id) FROM messages WHERE holder = 2"));
}

TEST_F(StoredStretchesTest, TheirSessionsStayAsLongAsTheyDo)
{
    beginSession(1);
    keep("Playback.Start");
    clock.advance(100 * day);
    batch.announcePlayingEnd(1, clock.secondsSince1970(), PlayingEnding::Stopped);
    batch.announceSessionEnd({.number = 1, .time = clock.secondsSince1970()});
    keepBatch();
    beginSession(2);
    keep("Generic.State", {{"n", 1}}, 2);
    clock.advance(61);
    maintain();
    EXPECT_EQ(number("SELECT count(*) FROM messages"), 1);
    EXPECT_EQ(number("SELECT count(*) FROM stretches x JOIN sessions s ON s.id = x.session"
                     " JOIN sources c ON c.id = s.source WHERE x.seconds = 8640000"),
              1);
}

// --- Other databases

TEST_F(StoredStretchesTest, ADatabaseOfThisEditionWithoutTheTablesGetsThem)
{
    beginSession(1);
    play(10);
    killService();
    {
        support::Writer other(file);
        other.execute("DROP TABLE stretches; DROP TABLE open_stretches");
    }
    beginSession(2);
    play(20, 2);
    EXPECT_THAT(stretches(), ElementsAre("20 s on speaker at 0.5: stopped"));
    EXPECT_EQ(number("PRAGMA user_version"), 2);
    EXPECT_EQ(number("SELECT count(*) FROM messages"), 4) << "and keeps what it had";
}

TEST_F(StoredStretchesTest, ADamagedDatabaseGivesItsStretchesAndWhatRunsIsCountedOnce)
{
    beginSession(1);
    beginSession(2);
    play(10);
    keep("Playback.Start", {{"active_devices", "headset"}}, 2);
    clock.advance(5);
    keep("Generic.State", {}, 2);
    keeper().prepareForEnd();
    support::overwrite(file, 0, std::string(pageSize, 'x'));
    clock.advance(2);
    killService();
    beginSession(3);
    play(20, 3);
    maintain();
    EXPECT_THAT(stretches(), ElementsAre("10 s on speaker at 0.5: stopped", "20 s on speaker at 0.5: stopped"));
    EXPECT_EQ(number("SELECT count(DISTINCT id) FROM stretches"), 2);
    EXPECT_EQ(number("SELECT count(*) FROM open_stretches"), 0);
    EXPECT_EQ(number("SELECT count(*) FROM stretches x JOIN sessions s ON s.id = x.session"), 2);
    EXPECT_EQ(number("SELECT max(id) FROM stretches"), number("SELECT next_event - 1 FROM store"));
}

TEST_F(StoredStretchesTest, WhatRunsWhenARepairEndsGoesOn)
{
    beginSession(1);
    for (int number = 0; number < 2000; ++number)
        add("Generic.State", {{"text", std::string(300, 'x')}});
    keepBatch();
    keeper().prepareForEnd();
    killService();
    support::overwrite(file, 0, std::string(pageSize, 'x'));
    beginSession(2);
    keep("Playback.Start", {{"active_devices", "speaker"}}, 2);
    ASSERT_EQ(number("SELECT count(*) FROM earlier_epochs"), 1) << "the repair has begun";
    clock.advance(10);
    maintain();
    ASSERT_EQ(number("SELECT count(*) FROM earlier_epochs"), 2) << "and is done";
    clock.advance(10);
    keep("Playback.Stop", {}, 2);
    EXPECT_THAT(stretches(), ElementsAre("20 s on speaker at ?: stopped"));
    EXPECT_THAT(texts("SELECT past IS NULL FROM sessions ORDER BY id"), ElementsAre("0", "0", "1"));
    EXPECT_THAT(texts("SELECT past IS NULL FROM sources ORDER BY id"), ElementsAre("0", "0", "1"));
    EXPECT_EQ(number("SELECT session FROM stretches"), 3) << "no row belongs to a session of another epoch";
}

TEST_F(StoredStretchesTest, DamageThatIsFoundWhileTheServiceRunsDoublesNothing)
{
    beginSession(1);
    beginSession(2);
    play(10);
    const double start = clock.secondsSince1970();
    keep("Playback.Start", {{"active_devices", "headset"}, {"kestoreporting_timestamp", start}}, 2);
    clock.advance(5);
    keep("Generic.State", {}, 2);
    {
        support::Writer other(file);
        other.execute("INSERT INTO messages SELECT next_event, 1, 1, NULL, NULL, NULL, 1, '{}' FROM store");
    }
    clock.advance(2);
    keep("Generic.State", {}, 2); // its place is taken
    maintain();
    ASSERT_THAT(log.lines(),
                testing::Contains(
                    testing::Field(&support::LogLine::message, testing::HasSubstr("is damaged or not a database"))));
    clock.advance(3);
    keep("Playback.Stop", {{"kestoreporting_timestamp", start + 10}}, 2);
    EXPECT_THAT(stretches(), ElementsAre("10 s on speaker at 0.5: stopped", "10 s on headset at ?: stopped"));
    EXPECT_EQ(number("SELECT count(*) FROM open_stretches"), 0);
}

} // namespace
} // namespace platform
