// SPDX-License-Identifier: Apache-2.0
// What becomes of batches, on a stream and a database in memory.
#include "kesto-ingest/Ingest.h"

#include "tools/kesto-ingest/Batches.h"
#include "tools/kesto-ingest/database/FakeDatabase.h"
#include "tools/kesto-ingest/stream/FakeStream.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>

#include <future>

namespace kesto_ingest {
namespace {

using std::chrono::milliseconds;
using testing::Contains;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::SizeIs;

class IngestTest : public testing::Test {
protected:
    [[nodiscard]] std::unique_ptr<Ingest> makeIngest(IngestLimits limits = {.joining = milliseconds{0}})
    {
        const auto rest = [this](milliseconds time) {
            now += time;
            rested.push_back(time.count());
        };
        return std::make_unique<Ingest>(
            stream, database, metrics, limits,
            Surroundings{.now = [this] { return now; },
                         .rest = rest,
                         .log = [this](std::string_view line) { lines.emplace_back(line); },
                         .start = [this](std::function<Outcome()> work) { return start(std::move(work)); }});
    }
    // The other thread: it works when it is asked for the outcome, or `isSlow`, in `endWork`.
    [[nodiscard]] std::future<Outcome> start(std::function<Outcome()> work)
    {
        if (!isSlow)
            return std::async(std::launch::deferred, std::move(work));
        slowWork = std::packaged_task<Outcome()>(std::move(work));
        return slowWork.get_future();
    }
    void endWork() { slowWork(); }
    // The database stores the load with the event 3, and the ingest has taken that with the event 6.
    void takeTwoLoads()
    {
        isSlow = true;
        send(deviceLine(1, 3) + eventLine(3));
        turns(2);
        send(deviceLine(4, 6) + eventLine(6));
        turns(1);
    }
    void turns(int count)
    {
        for (int turn = 0; turn < count; ++turn)
            ingest->turn();
    }
    void send(const std::string& text, const std::string& credential = "one")
    {
        stream.send("kesto.events." + credential, compressed(text));
    }
    [[nodiscard]] std::string told(std::string_view device = deviceA, const std::string& credential = "one")
    {
        return stream.entries[fmt::format("kesto.stored.{}.{}", credential, device)].payload;
    }

    std::chrono::steady_clock::time_point now{std::chrono::hours(1)};
    std::vector<std::int64_t> rested;
    std::vector<std::string> lines; // of the log
    FakeStream stream;
    FakeDatabase database;
    Metrics metrics;
    bool isSlow = false;
    std::packaged_task<Outcome()> slowWork;
    std::unique_ptr<Ingest> ingest = makeIngest();
};

TEST_F(IngestTest, StoresTellsAndAcknowledges)
{
    send(deviceLine(1, 9) + eventLine(3) + stretchLine(4) + sessionLine(7, ""));
    turns(2);
    EXPECT_THAT(database.tables["events"], ElementsAre(HasSubstr(R"("id":3)")));
    EXPECT_THAT(database.tables["stretches"], ElementsAre(HasSubstr(R"("id":4)")));
    EXPECT_THAT(database.tables["sessions"], ElementsAre(HasSubstr(R"("id":7)")));
    EXPECT_THAT(database.tables["batches"], ElementsAre(HasSubstr(R"("last_id":9)")));
    EXPECT_EQ(told(), R"({"epoch":"00000000000000000000000000000001","id":9})");
    EXPECT_EQ(stream.unacknowledged(), 0U);
    EXPECT_EQ(metrics.count(Counter::RowsStoredEvents), 1U);
    EXPECT_EQ(metrics.count(Counter::BatchesStored), 1U);
}

TEST_F(IngestTest, JoinsManyBatchesIntoOneInsert)
{
    ingest = makeIngest({.joining = milliseconds{1000}});
    for (int batch = 0; batch < 5; ++batch) {
        send(deviceLine(batch, batch) + eventLine(batch));
        turns(1);
    }
    EXPECT_THAT(database.blocks, IsEmpty()) << "the second is not over";
    now += milliseconds{1000};
    turns(1);
    EXPECT_THAT(database.tables["events"], SizeIs(5));
    EXPECT_THAT(database.blocks, SizeIs(2)) << "one of events, one of batches";
}

TEST_F(IngestTest, TakesTheNextLoadWhileTheDatabaseStoresOne)
{
    takeTwoLoads();
    turns(2);
    EXPECT_EQ(metrics.count(Counter::BatchesTaken), 2U);
    EXPECT_EQ(metrics.waitingRows.load(), 4U) << "two events and two rows of batches";
    EXPECT_THAT(database.blocks, IsEmpty());
    EXPECT_EQ(told(), "");
    endWork();
    turns(1);
    EXPECT_EQ(told(), R"({"epoch":"00000000000000000000000000000001","id":3})") << "the other is not stored";
    turns(1);
    endWork();
    turns(1);
    EXPECT_EQ(told(), R"({"epoch":"00000000000000000000000000000001","id":6})");
    EXPECT_THAT(database.tables["events"], SizeIs(2));
    EXPECT_EQ(metrics.waitingRows.load(), 0U);
    EXPECT_EQ(stream.unacknowledged(), 0U);
}

TEST_F(IngestTest, TakesNoMoreThanOneLoadWhileTheDatabaseStoresOne)
{
    ingest = makeIngest({.rows = 2, .insertsOfALoad = 3, .joining = milliseconds{0}});
    isSlow = true;
    send(deviceLine(1, 3) + eventLine(3));
    turns(2);
    for (int id = 4; id <= 9; ++id)
        send(deviceLine(id, id) + eventLine(id));
    turns(3);
    EXPECT_EQ(metrics.count(Counter::BatchesTaken), 4U) << "the second load has six rows";
    endWork();
    turns(2);
    endWork();
    turns(1);
    EXPECT_EQ(metrics.count(Counter::BatchesStored), 4U);
    EXPECT_THAT(database.blocks, SizeIs(6)) << "two, and two of each table";
    for (const std::string& block : database.blocks)
        EXPECT_LE(std::ranges::count(block, '\n'), 2);
}

TEST_F(IngestTest, StoresAtOnceWhatFillsAnInsertIfTheDatabaseIsFree)
{
    ingest = makeIngest({.rows = 2, .insertsOfALoad = 3, .joining = milliseconds{1000}});
    send(deviceLine(1, 3) + eventLine(3));
    turns(2);
    EXPECT_THAT(database.tables["events"], SizeIs(1));
}

TEST_F(IngestTest, StoresNoLoadBeforeAnEarlierOneThatFailed)
{
    takeTwoLoads();
    database.isAway = true;
    endWork();
    turns(1);
    EXPECT_THAT(lines, ElementsAre("away; the next attempt is in 500 ms"));
    database.isAway = false;
    isSlow = false;
    turns(2); // a pause, and the first load again
    EXPECT_THAT(database.tables["events"], ElementsAre(HasSubstr(R"("id":3)")));
    EXPECT_EQ(told(), R"({"epoch":"00000000000000000000000000000001","id":3})");
    turns(1);
    EXPECT_EQ(told(), R"({"epoch":"00000000000000000000000000000001","id":6})");
    EXPECT_EQ(stream.unacknowledged(), 0U);
}

TEST_F(IngestTest, GivesBackBothLoadsThatItCannotStoreBeforeItEnds)
{
    takeTwoLoads();
    database.isAway = true;
    endWork();
    ingest->finish();
    database.isAway = isSlow = false;
    ingest = makeIngest();
    turns(4);
    EXPECT_THAT(database.tables["events"], SizeIs(2));
    EXPECT_EQ(stream.unacknowledged(), 0U);
}

TEST_F(IngestTest, JoinsWhatAFullLoadLeftWithWhatComesLater)
{
    ingest = makeIngest({.rows = 3, .joining = milliseconds{1000}});
    stream.send("kesto.events.one", "nonsense"); // no row, so the next fetch brings several
    turns(1);
    send(deviceLine(1, 3) + eventLine(2) + eventLine(3));
    send(deviceLine(4, 6) + eventLine(6));
    turns(1);
    now += milliseconds{1000};
    turns(2); // stores the full load, and takes the rest
    turns(1);
    EXPECT_THAT(database.tables["events"], SizeIs(2)) << "the rest waits for others";
    now += milliseconds{1000};
    turns(1);
    EXPECT_THAT(database.tables["events"], SizeIs(3));
}

TEST_F(IngestTest, WaitsForTheDatabaseBeforeItEnds)
{
    takeTwoLoads();
    isSlow = false;
    endWork();
    ingest->finish();
    EXPECT_EQ(told(), R"({"epoch":"00000000000000000000000000000001","id":6})");
    EXPECT_EQ(stream.unacknowledged(), 0U);
}

TEST_F(IngestTest, TellsADeviceOnceOfSeveralBatches)
{
    ingest = makeIngest({.joining = milliseconds{1000}});
    for (int batch = 1; batch <= 5; ++batch) {
        send(deviceLine(batch, batch) + eventLine(batch));
        turns(1);
    }
    now += milliseconds{1000};
    turns(1);
    EXPECT_EQ(told(), R"({"epoch":"00000000000000000000000000000001","id":5})");
    EXPECT_EQ(stream.puts, 2) << "the owner, and one answer";
    EXPECT_EQ(metrics.count(Counter::BatchesStored), 5U);
    EXPECT_EQ(stream.unacknowledged(), 0U);
}

TEST_F(IngestTest, WaitsForNobodyWithEnoughRows)
{
    ingest = makeIngest({.rows = 4, .joining = milliseconds{1000}});
    send(deviceLine(1, 2) + eventLine(1) + eventLine(2));
    turns(2);
    EXPECT_THAT(database.blocks, IsEmpty());
    send(deviceLine(3, 3) + eventLine(3));
    turns(2);
    EXPECT_THAT(database.tables["events"], SizeIs(3));
}

TEST_F(IngestTest, PutsAsideRowsThatAreWrong)
{
    send(deviceLine(1, 9) + eventLine(3) + "{}\n");
    turns(2);
    EXPECT_THAT(database.tables["events"], SizeIs(1));
    ASSERT_THAT(stream.letters, SizeIs(1));
    EXPECT_EQ(stream.letters[0].payload, "{\"reason\":\"it has no kind\",\"row\":\"{}\"}\n");
    EXPECT_EQ(told(), R"({"epoch":"00000000000000000000000000000001","id":9})");
    EXPECT_EQ(metrics.count(Counter::RowsRefusedSchema), 1U);
}

TEST_F(IngestTest, PutsAsideRowsThatTheDatabaseRefuses)
{
    database.refusedWord = R"("id":4)";
    send(deviceLine(1, 3) + eventLine(3), "one");
    send(deviceLine(4, 5, deviceB) + eventLine(4, deviceB) + eventLine(5, deviceB), "two");
    turns(6);
    EXPECT_THAT(database.tables["events"], SizeIs(2));
    ASSERT_THAT(stream.letters, SizeIs(1));
    EXPECT_EQ(stream.letters[0].subject, "kesto.dead.two");
    EXPECT_THAT(stream.letters[0].payload, HasSubstr(R"("reason":"no such word")"));
    EXPECT_EQ(metrics.count(Counter::RowsRefusedDatabase), 1U);
    EXPECT_EQ(metrics.count(Counter::RowsStoredEvents), 2U);
    EXPECT_EQ(stream.unacknowledged(), 0U);
}

TEST_F(IngestTest, PutsAsideBatchesThatCannotBeRead)
{
    stream.send("kesto.events.one", "nonsense");
    stream.send("kesto.events.one", compressed(deviceLine(1, 9)), "2");
    stream.send("kesto.events.one.two", compressed(deviceLine(1, 9)));
    turns(6);
    ASSERT_THAT(stream.letters, SizeIs(3));
    EXPECT_EQ(stream.letters[0].payload, "nonsense");
    EXPECT_EQ(stream.letters[0].headers["Kesto-Reason"], "it is not compressed with zstd");
    EXPECT_EQ(stream.letters[1].headers["Kesto-Reason"], R"(it is of edition "2", and this program knows edition 1)");
    EXPECT_EQ(stream.letters[2].headers["Kesto-Reason"], "its subject does not end in the name of a credential");
    EXPECT_EQ(metrics.count(Counter::BatchesRefusedUnreadable), 3U);
    EXPECT_EQ(stream.unacknowledged(), 0U);
    EXPECT_THAT(database.blocks, IsEmpty());
}

TEST_F(IngestTest, RefusesAPseudonymThatAnotherCredentialUsedFirst)
{
    send(deviceLine(1, 3) + eventLine(3), "one");
    send(deviceLine(4, 5) + eventLine(4), "two");
    turns(6);
    EXPECT_THAT(database.tables["events"], SizeIs(1));
    EXPECT_EQ(metrics.count(Counter::BatchesRefusedForged), 1U);
    ASSERT_THAT(stream.letters, SizeIs(1));
    EXPECT_EQ(stream.letters[0].subject, "kesto.dead.two");
    EXPECT_EQ(told(deviceA, "two"), "");
    EXPECT_THAT(lines,
                ElementsAre("the batch 2 of kesto.events.two is put aside: its pseudonym "
                            "0123456789abcdef0123456789abcdef belongs to the credential one"));
}

TEST_F(IngestTest, WaitsForTheDatabaseWithLongerAndLongerPauses)
{
    database.isAway = true;
    send(deviceLine(1, 9) + eventLine(3));
    turns(1 + 2 * 3);
    EXPECT_THAT(rested, ElementsAre(500, 1000, 1000)) << "the third pause is two rests long";
    EXPECT_EQ(told(), "");
    EXPECT_FALSE(metrics.isDatabaseUp);
    turns(40);
    EXPECT_GE(stream.toldThatWorkGoesOn, 2);
    send(deviceLine(10, 12) + eventLine(10));
    turns(2);
    EXPECT_EQ(metrics.count(Counter::BatchesTaken), 1U) << "nothing more is taken meanwhile";
    database.isAway = false;
    turns(40);
    EXPECT_THAT(database.tables["events"], SizeIs(2));
    EXPECT_EQ(told(), R"({"epoch":"00000000000000000000000000000001","id":12})");
    EXPECT_EQ(stream.unacknowledged(), 0U);
    EXPECT_TRUE(metrics.isDatabaseUp);
    EXPECT_THAT(lines, Contains("it goes on"));
}

TEST_F(IngestTest, AcknowledgesNothingWhoseDeadLetterCannotBePutAside)
{
    stream.isDeaf = true;
    send(deviceLine(1, 9) + eventLine(3) + "{}\n");
    turns(2);
    EXPECT_EQ(stream.unacknowledged(), 1U);
    EXPECT_EQ(told(), "");
    stream.isDeaf = false;
    turns(2);
    EXPECT_EQ(stream.unacknowledged(), 0U);
    EXPECT_THAT(database.tables["events"], SizeIs(1)) << "what is stored is not stored again";
}

TEST_F(IngestTest, AcknowledgesNothingWhoseDeviceCannotBeTold)
{
    send(deviceLine(1, 9) + eventLine(3));
    turns(1);
    stream.takesNoPut = true;
    turns(1);
    EXPECT_THAT(database.tables["events"], SizeIs(1));
    EXPECT_EQ(metrics.waitingRows.load(), 0U) << "they are stored";
    EXPECT_EQ(stream.unacknowledged(), 1U);
    EXPECT_EQ(metrics.count(Counter::BatchesStored), 0U);
    stream.takesNoPut = false;
    turns(2);
    EXPECT_EQ(stream.unacknowledged(), 0U);
    EXPECT_EQ(metrics.count(Counter::BatchesStored), 1U);
}

TEST_F(IngestTest, GoesOnAfterALetterThatIsTooLarge)
{
    stream.largestLetter = 4;
    stream.send("kesto.events.one", "nonsense");
    turns(2);
    EXPECT_EQ(stream.unacknowledged(), 0U);
    EXPECT_EQ(metrics.count(Counter::LettersLost), 1U);
    EXPECT_THAT(lines,
                Contains("1 dead letters of the batch 1 of kesto.events.one are too large for the stream "
                         "KESTO_DEAD, and lost"));
}

TEST_F(IngestTest, StoresNoBatchOfADeviceBeforeAnEarlierOneThatItGaveBack)
{
    ingest = makeIngest({.joining = milliseconds{1000}});
    send(deviceLine(1, 1, deviceB) + eventLine(1, deviceB), "two");
    turns(1); // the next fetch brings several
    stream.takesNoPut = true;
    send(deviceLine(1, 3) + eventLine(1));
    turns(1); // its owner cannot be asked, so it goes back, behind the next
    stream.takesNoPut = false;
    send(deviceLine(4, 6) + eventLine(4));
    send(deviceLine(7, 9) + eventLine(7));
    stream.rotate();
    turns(1);
    EXPECT_EQ(stream.unacknowledged(), 4U);
    now += milliseconds{1000};
    turns(1);
    EXPECT_EQ(told(), R"({"epoch":"00000000000000000000000000000001","id":3})");
    now += milliseconds{1000};
    turns(4);
    now += milliseconds{1000};
    turns(4);
    EXPECT_EQ(told(), R"({"epoch":"00000000000000000000000000000001","id":9})");
    EXPECT_EQ(stream.unacknowledged(), 0U);
}

TEST_F(IngestTest, AFailureOfTheStreamEndsWithTheNextFetch)
{
    stream.isAway = true;
    turns(1 + 2 * 2);
    EXPECT_THAT(rested, ElementsAre(500, 1000)) << "each failure makes the pause longer";
}

TEST_F(IngestTest, TellsTheStreamThatItWorksOnWhatItHasNotTaken)
{
    ingest = makeIngest({.rows = 1, .joining = milliseconds{1000}});
    database.isAway = true;
    stream.send("kesto.events.one", "nonsense"); // no row
    turns(1);
    for (int batch = 1; batch <= 3; ++batch)
        send(deviceLine(batch, batch) + eventLine(batch));
    turns(2);
    EXPECT_EQ(metrics.count(Counter::BatchesTaken), 2U) << "two rows are enough";
    now += std::chrono::seconds(11);
    ingest->holdOn();
    EXPECT_EQ(stream.toldThatWorkGoesOn, 4) << "two that are taken, and two that are not";
    ingest->finish();
    stream.forgetTaken();
    database.isAway = false;
    ingest = makeIngest();
    turns(10);
    EXPECT_EQ(stream.unacknowledged(), 0U);
    EXPECT_THAT(database.tables["events"], SizeIs(3));
}

TEST_F(IngestTest, WaitsForTheStream)
{
    stream.isAway = true;
    turns(1);
    EXPECT_FALSE(metrics.isStreamUp);
    stream.isAway = false;
    send(deviceLine(1, 9) + eventLine(3));
    turns(4);
    EXPECT_TRUE(metrics.isStreamUp);
    EXPECT_EQ(stream.unacknowledged(), 0U);
}

TEST_F(IngestTest, StoresWhatItHoldsBeforeItEnds)
{
    ingest = makeIngest({.joining = milliseconds{1000}});
    send(deviceLine(1, 9) + eventLine(3));
    turns(1);
    ingest->finish();
    EXPECT_THAT(database.tables["events"], SizeIs(1));
    EXPECT_EQ(stream.unacknowledged(), 0U);
}

TEST_F(IngestTest, GivesBackWhatItCannotStoreBeforeItEnds)
{
    database.isAway = true;
    send(deviceLine(1, 9) + eventLine(3));
    turns(1);
    ingest->finish();
    database.isAway = false;
    ingest = makeIngest();
    turns(2);
    EXPECT_THAT(database.tables["events"], SizeIs(1));
    EXPECT_EQ(metrics.count(Counter::BatchesRepeated), 1U);
}

TEST_F(IngestTest, AnotherCopyDoesTheWorkOfOneThatWasKilled)
{
    send(deviceLine(1, 9) + eventLine(3));
    turns(1);
    ingest = makeIngest();
    stream.forgetTaken();
    turns(2);
    EXPECT_EQ(told(), R"({"epoch":"00000000000000000000000000000001","id":9})");
    EXPECT_EQ(stream.unacknowledged(), 0U);
}

TEST_F(IngestTest, DividesRowsOfManyWeeks)
{
    std::string text = deviceLine(1, 60);
    for (int week = 0; week < 60; ++week) {
        std::string line = eventLine(week + 1);
        line.replace(line.find("1795264505.66"), 13, std::to_string(week * 7 * 86400));
        text += line;
    }
    send(text);
    turns(2);
    EXPECT_THAT(database.tables["events"], SizeIs(60));
    EXPECT_THAT(database.blocks, SizeIs(3)) << "49 weeks, 11 weeks, and the batch";
}

TEST(Metrics, AreTextForPrometheus)
{
    Metrics metrics;
    metrics.add(Counter::BatchesRefusedForged, 3);
    metrics.waitingRows = 7;
    const std::string text = metrics.text();
    EXPECT_THAT(text,
                HasSubstr("# HELP kesto_ingest_batches_refused_total Batches that were put aside as a whole.\n"
                          "# TYPE kesto_ingest_batches_refused_total counter\n"
                          "kesto_ingest_batches_refused_total{reason=\"unreadable\"} 0\n"
                          "kesto_ingest_batches_refused_total{reason=\"forged\"} 3\n"));
    EXPECT_THAT(text, HasSubstr("# TYPE kesto_ingest_waiting_rows gauge\nkesto_ingest_waiting_rows 7\n"));
}

} // namespace
} // namespace kesto_ingest
