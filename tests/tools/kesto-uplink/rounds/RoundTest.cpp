// SPDX-License-Identifier: Apache-2.0
// One round on a made-up store and a fake stream, with the real state: what is sent, what is noted, and when it ends.
#include "tools/kesto-uplink/transport/FakeTransport.h"

#include "kesto-uplink/rounds/Round.h"
#include "support/TemporaryDirectory.h"

#include <fmt/format.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>

namespace uplink_test {
namespace {

using namespace kesto_uplink;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

constexpr double start = 1'800'000'000;
constexpr double hour = 3600;

// A store whose rows are numbers, ten in a batch; each batch has ten bytes.
struct MadeUpStore {
    std::string epoch = "aa";
    std::int64_t newest = 0;
    std::int64_t silentUpTo = 0; // up to there nothing may leave
    bool isSaved = false; // from the one before: its places count here, too
    std::function<void()> whileItIsRead = {};
};

class MadeUpSource : public Source {
public:
    MadeUpSource(const MadeUpStore& store, Identity identity) : store_(store), identity_(std::move(identity)) { }

    std::optional<Batch> next(const Cursor& after, const std::set<std::int64_t>& /*openSessions*/) override
    {
        const std::int64_t first = (after.epoch == store_.epoch || store_.isSaved ? after.id : 0) + 1;
        if (first > store_.newest)
            return std::nullopt;
        const std::int64_t last = std::min(first + 9, store_.newest);
        if (store_.whileItIsRead)
            store_.whileItIsRead();
        Batch batch;
        batch.messageID = fmt::format("{}:{}:{}:{}", identity_.pseudonym, store_.epoch, first, last);
        batch.bytes = "ten bytes.";
        batch.first = {store_.epoch, first};
        batch.last = {store_.epoch, last};
        batch.rows = last > store_.silentUpTo ? last - first + 1 : 0;
        return batch;
    }

private:
    const MadeUpStore& store_;
    Identity identity_;
};

class RoundTest : public testing::Test {
protected:
    RoundResult run()
    {
        FakeTransport transport(stream);
        transport.lacksPermission = lacksPermission;
        if (isInterrupted)
            transport.interrupt();
        Round round(
            terms, state, patience, transport,
            [this](const Identity& identity) { return std::make_unique<MadeUpSource>(store, identity); },
            [this] { return Today{now, static_cast<std::int64_t>(now / (24 * hour))}; }, [this] { return isMetered; });
        return round.run();
    }

    // The ranges that the stream has, without the pseudonym.
    std::vector<std::string> ranges()
    {
        std::vector<std::string> ranges;
        for (const auto& [id, bytes] : stream.messages)
            ranges.push_back(id.substr(id.find(':') + 1));
        return ranges;
    }
    std::string pseudonym() { return state.identity().pseudonym; }
    std::int64_t bytesToday() { return state.bytesSentOn(static_cast<std::int64_t>(now / (24 * hour))); }
    void forget(const Cursor& newest) { State::openPresent(directory.path())->forget(newest, now); }
    void confirmAllAtOnce()
    {
        stream.afterStoring = [this] { stream.confirmations[pseudonym()] = {store.epoch, store.newest}; };
    }

    support::TemporaryDirectory directory;
    double now = start;
    State state = State::open(directory.path(), start);
    Patience patience{directory / "waiting-since"};
    MadeUpStore store;
    FakeStream stream;
    Terms terms{.forgetWhen = ForgetWhen::Stored,
                .maximumBytesADay = 1000,
                .pseudonymDays = 90,
                .hashKeyDays = 90,
                .waitForConfirmation = std::chrono::seconds(10)};
    bool isMetered = false;
    bool lacksPermission = false;
    bool isInterrupted = false;
};

TEST_F(RoundTest, withoutNewsItDoesNotConnect)
{
    EXPECT_EQ(run().outcome, Outcome::Nothing);
    EXPECT_EQ(stream.connections, 0);
}

TEST_F(RoundTest, itSendsAllThatWaitsInOrderAndOnce)
{
    store.newest = 25;
    const RoundResult result = run();
    EXPECT_EQ(result.outcome, Outcome::Sent);
    EXPECT_EQ(result.batches, 3);
    EXPECT_THAT(ranges(), ElementsAre("aa:1:10", "aa:11:20", "aa:21:25"));
    EXPECT_EQ(state.queued(), (Cursor{"aa", 25}));
    EXPECT_EQ(run().outcome, Outcome::Nothing);
    store.newest = 26;
    EXPECT_EQ(run().outcome, Outcome::Sent);
    EXPECT_THAT(ranges(), ElementsAre("aa:1:10", "aa:11:20", "aa:21:25", "aa:26:26"));
}

TEST_F(RoundTest, onlyTheFleetsConfirmationForgets)
{
    store.newest = 25;
    EXPECT_EQ(run().outcome, Outcome::Sent);
    EXPECT_EQ(state.stored(), (Cursor{"aa", 0}));
    stream.confirmations[pseudonym()] = {"aa", 10};
    store.newest = 26;
    EXPECT_EQ(run().outcome, Outcome::Sent);
    EXPECT_EQ(state.stored(), (Cursor{"aa", 10}));
    confirmAllAtOnce();
    store.newest = 27;
    EXPECT_EQ(run().outcome, Outcome::Sent);
    EXPECT_EQ(state.stored(), (Cursor{"aa", 27}));
}

TEST_F(RoundTest, theAnswerOfTheStreamForgetsIfItIsEnough)
{
    terms.forgetWhen = ForgetWhen::Queued;
    store.newest = 25;
    EXPECT_EQ(run().outcome, Outcome::Sent);
    EXPECT_EQ(state.stored(), (Cursor{"aa", 25}));
}

TEST_F(RoundTest, aConfirmationOfAnotherDatabaseSaysNothing)
{
    store.newest = 5;
    stream.confirmations[pseudonym()] = {"bb", 1000};
    EXPECT_EQ(run().outcome, Outcome::Sent);
    EXPECT_EQ(state.stored(), (Cursor{"aa", 0}));
}

TEST_F(RoundTest, aDatabaseThatIsBegunAnewIsSentFromItsBeginning)
{
    store.newest = 25;
    EXPECT_EQ(run().outcome, Outcome::Sent);
    store = {.epoch = "bb", .newest = 3};
    EXPECT_EQ(run().outcome, Outcome::Sent);
    EXPECT_THAT(ranges(), ElementsAre("aa:1:10", "aa:11:20", "aa:21:25", "bb:1:3"));
    EXPECT_EQ(state.queued(), (Cursor{"bb", 3}));
}

TEST_F(RoundTest, serversThatAreAwayCostNothing)
{
    store.newest = 5;
    stream.isReachable = false;
    const RoundResult result = run();
    EXPECT_EQ(result.outcome, Outcome::Away);
    EXPECT_EQ(result.sentence, "no server is there");
    EXPECT_EQ(state.queued(), Cursor());
    stream.isReachable = true;
    EXPECT_EQ(run().outcome, Outcome::Sent);
    EXPECT_THAT(ranges(), ElementsAre("aa:1:5"));
}

TEST_F(RoundTest, aConnectionThatIsLostInTheMiddleIsMadeAnewAtOnce)
{
    store.newest = 40;
    stream.losesConnectionsAfter = 2;
    EXPECT_EQ(run().outcome, Outcome::Sent);
    EXPECT_THAT(ranges(), ElementsAre("aa:1:10", "aa:11:20", "aa:21:30", "aa:31:40"));
    EXPECT_EQ(stream.connections, 2);
    EXPECT_EQ(state.totals().retries, 1);
}

TEST_F(RoundTest, aFullStreamKeepsTheRestOnTheDevice)
{
    store.newest = 30;
    stream.afterStoring = [this] { stream.isFull = stream.messages.size() == 2; };
    const RoundResult result = run();
    EXPECT_EQ(result.outcome, Outcome::Full);
    EXPECT_EQ(result.batches, 2);
    EXPECT_EQ(state.queued(), (Cursor{"aa", 20}));
    stream.isFull = false;
    EXPECT_EQ(run().outcome, Outcome::Sent);
    EXPECT_THAT(ranges(), ElementsAre("aa:1:10", "aa:11:20", "aa:21:30"));
}

TEST_F(RoundTest, aRefusalIsToldAndKeepsEverything)
{
    store.newest = 5;
    lacksPermission = true;
    const RoundResult result = run();
    EXPECT_EQ(result.outcome, Outcome::Refused);
    EXPECT_THAT(result.sentence, HasSubstr("permissions"));
    EXPECT_EQ(state.queued(), Cursor());
}

TEST_F(RoundTest, anInterruptionNotesNothing)
{
    store.newest = 5;
    isInterrupted = true;
    EXPECT_EQ(run().outcome, Outcome::Interrupted);
    EXPECT_EQ(state.queued(), Cursor());
}

TEST_F(RoundTest, theRestGoesTomorrowWhenTheBytesOfADayAreUsedUp)
{
    terms.maximumBytesADay = 25;
    store.newest = 40;
    EXPECT_EQ(run().outcome, Outcome::DayUsedUp);
    EXPECT_THAT(ranges(), ElementsAre("aa:1:10", "aa:11:20"));
    const int connections = stream.connections;
    EXPECT_EQ(run().outcome, Outcome::DayUsedUp);
    EXPECT_EQ(stream.connections, connections);
    now += 24 * hour;
    EXPECT_EQ(run().outcome, Outcome::Sent);
    EXPECT_THAT(ranges(), ElementsAre("aa:1:10", "aa:11:20", "aa:21:30", "aa:31:40"));
}

TEST_F(RoundTest, theBytesOfEachAttemptCountForTheDay)
{
    store.newest = 10;
    stream.isFull = true;
    EXPECT_EQ(run().outcome, Outcome::Full);
    EXPECT_EQ(bytesToday(), 10);
    stream.isFull = false;
    lacksPermission = true;
    EXPECT_EQ(run().outcome, Outcome::Refused);
    EXPECT_EQ(bytesToday(), 20);
    lacksPermission = false;
    EXPECT_EQ(run().outcome, Outcome::Sent);
    EXPECT_EQ(bytesToday(), 30);
}

TEST_F(RoundTest, aLostBatchIsNotSentAgainBeyondTheBytesOfADay)
{
    terms.maximumBytesADay = 35;
    store.newest = 40;
    stream.losesConnectionsAfter = 2;
    EXPECT_EQ(run().outcome, Outcome::DayUsedUp);
    EXPECT_THAT(ranges(), ElementsAre("aa:1:10", "aa:11:20"));
    EXPECT_EQ(bytesToday(), 30);
}

TEST_F(RoundTest, aConnectionThatIsLostTwiceEndsTheRound)
{
    store.newest = 10;
    stream.afterConnecting = [this] { stream.isReachable = stream.connections < 1; };
    EXPECT_EQ(run().outcome, Outcome::Away);
    EXPECT_EQ(bytesToday(), 10);
}

TEST_F(RoundTest, whatMayNotLeaveIsPassedWithoutAConnection)
{
    store.newest = store.silentUpTo = 20;
    EXPECT_EQ(run().outcome, Outcome::Nothing);
    EXPECT_EQ(stream.connections, 0);
    EXPECT_EQ(state.queued(), (Cursor{"aa", 20}));
    EXPECT_EQ(state.stored(), (Cursor{"aa", 20})); // the fleet confirms only what was sent
    store.newest = 25;
    EXPECT_EQ(run().outcome, Outcome::Sent);
    EXPECT_THAT(ranges(), ElementsAre("aa:21:25"));
}

TEST_F(RoundTest, nothingGoesThroughAMeteredNetwork)
{
    store.newest = 5;
    isMetered = true;
    EXPECT_EQ(run().outcome, Outcome::Metered);
    EXPECT_EQ(stream.connections, 0);
    isMetered = false;
    EXPECT_EQ(run().outcome, Outcome::Sent);
}

// As by a kill between the stream's answer and the note of it.
TEST_F(RoundTest, aBatchWhoseAnswerWasNotNotedIsStoredOnce)
{
    store.newest = 25;
    stream.afterStoring = [this] {
        if (stream.messages.size() == 2)
            throw StateError("killed");
    };
    EXPECT_THROW(static_cast<void>(run()), StateError);
    EXPECT_EQ(state.queued(), (Cursor{"aa", 10}));
    stream.afterStoring = nullptr;
    EXPECT_EQ(run().outcome, Outcome::Sent);
    EXPECT_THAT(ranges(), ElementsAre("aa:1:10", "aa:11:20", "aa:21:25"));
}

// What the stream has is not sent again for a day; then it has lost it.
TEST_F(RoundTest, whatIsNotConfirmedForADayIsSentAgain)
{
    store.newest = 20;
    EXPECT_EQ(run().outcome, Outcome::Sent);
    stream.messages.clear(); // its disks are lost
    now += 23 * hour;
    store.newest = 21;
    EXPECT_EQ(run().outcome, Outcome::Sent);
    EXPECT_THAT(ranges(), ElementsAre("aa:21:21"));
    now += 2 * hour;
    store.newest = 22;
    EXPECT_EQ(run().outcome, Outcome::Sent);
    EXPECT_THAT(ranges(), ElementsAre("aa:21:21", "aa:1:10", "aa:11:20", "aa:21:22"));
    store.newest = 23; // the wait has begun anew
    now += 23 * hour;
    EXPECT_EQ(run().outcome, Outcome::Sent);
    EXPECT_THAT(ranges(), ElementsAre("aa:21:21", "aa:1:10", "aa:11:20", "aa:21:22", "aa:23:23"));
}

// The new store has the rows of the old one under other keys.
TEST_F(RoundTest, whatAnotherStoreSentIsNotSentAgain)
{
    store.newest = 20;
    EXPECT_EQ(run().outcome, Outcome::Sent);
    store = {.epoch = "bb", .newest = 22, .isSaved = true};
    now += 25 * hour;
    EXPECT_EQ(run().outcome, Outcome::Sent);
    EXPECT_THAT(ranges(), ElementsAre("aa:1:10", "aa:11:20", "bb:21:22"));
}

TEST_F(RoundTest, eachConfirmationGivesAnotherDay)
{
    store.newest = 10;
    EXPECT_EQ(run().outcome, Outcome::Sent);
    for (std::int64_t more = 1; more <= 4; ++more) {
        now += 20 * hour;
        stream.confirmations[pseudonym()] = {"aa", more};
        store.newest = 10 + more;
        EXPECT_EQ(run().outcome, Outcome::Sent);
    }
    EXPECT_THAT(ranges(), ElementsAre("aa:1:10", "aa:11:11", "aa:12:12", "aa:13:13", "aa:14:14"));
}

TEST_F(RoundTest, serversThatTellNoConfirmationsGetNothingTwice)
{
    stream.hasConfirmations = false;
    for (int day = 0; day < 4; ++day) {
        ++store.newest;
        const RoundResult result = run();
        EXPECT_EQ(result.outcome, Outcome::Sent);
        EXPECT_THAT(result.sentence, HasSubstr("no confirmation"));
        now += 25 * hour;
    }
    EXPECT_THAT(ranges(), ElementsAre("aa:1:1", "aa:2:2", "aa:3:3", "aa:4:4"));
}

TEST_F(RoundTest, aPseudonymThatIsMadeAnewMeanwhileEndsTheRound)
{
    store.newest = 30;
    stream.afterStoring = [this] { forget({"aa", 25}); };
    EXPECT_EQ(run().outcome, Outcome::Waiting);
    EXPECT_THAT(ranges(), ElementsAre("aa:1:10"));
    stream.afterStoring = nullptr;
    EXPECT_EQ(run().outcome, Outcome::Sent);
    EXPECT_THAT(ranges(), ElementsAre("aa:1:10", "aa:26:30"));
}

TEST_F(RoundTest, underAPseudonymThatIsForgottenWhileItConnectsNothingLeaves)
{
    store.newest = 10;
    stream.afterConnecting = [this] { forget({"aa", 5}); };
    EXPECT_EQ(run().outcome, Outcome::Waiting);
    EXPECT_THAT(stream.messages, IsEmpty());
    EXPECT_EQ(state.queued(), (Cursor{"aa", 5}));
    stream.afterConnecting = nullptr;
    EXPECT_EQ(run().outcome, Outcome::Sent);
    EXPECT_THAT(ranges(), ElementsAre("aa:6:10"));
}

TEST_F(RoundTest, underAPseudonymThatIsForgottenWhileTheNextBatchIsMadeNothingMoreLeaves)
{
    store.newest = 30;
    store.whileItIsRead = [this] {
        if (stream.messages.size() == 1)
            forget({"aa", 15});
    };
    EXPECT_EQ(run().outcome, Outcome::Waiting);
    EXPECT_THAT(ranges(), ElementsAre("aa:1:10"));
}

TEST_F(RoundTest, aPseudonymIsRenewedWhenAllThatWasSentUnderItIsConfirmed)
{
    const std::string old = pseudonym();
    store.newest = 10;
    EXPECT_EQ(run().outcome, Outcome::Sent);
    now += 91 * 24 * hour;
    patience.rest(); // as if it had been sent today
    store.newest = 20;
    EXPECT_EQ(run().outcome, Outcome::Waiting);
    EXPECT_THAT(ranges(), ElementsAre("aa:1:10"));
    stream.confirmations[old] = {"aa", 10};
    EXPECT_EQ(run().outcome, Outcome::Waiting); // told, and renewed by the next
    EXPECT_EQ(run().outcome, Outcome::Sent);
    EXPECT_NE(pseudonym(), old);
    ASSERT_EQ(stream.messages.size(), 2U);
    EXPECT_EQ(stream.messages[1].first, pseudonym() + ":aa:11:20");
}

// The pseudonym must not wait for ever for what the stream has lost, and no row may be counted under two.
TEST_F(RoundTest, whatTheStreamLostIsSentAgainUnderThePseudonymThatIsDue)
{
    const std::string old = pseudonym();
    store.newest = 10;
    EXPECT_EQ(run().outcome, Outcome::Sent);
    stream.messages.clear();
    now += 91 * 24 * hour;
    store.newest = 11;
    EXPECT_EQ(run().outcome, Outcome::Sent);
    ASSERT_FALSE(stream.messages.empty());
    for (const auto& [id, bytes] : stream.messages)
        EXPECT_THAT(id, testing::StartsWith(old));
}

TEST_F(RoundTest, aPseudonymThatIsDueWaitsADayForServersThatTellNoConfirmations)
{
    const std::string old = pseudonym();
    stream.hasConfirmations = false;
    store.newest = 10;
    EXPECT_EQ(run().outcome, Outcome::Sent);
    now += 91 * 24 * hour;
    store.newest = 20;
    const RoundResult result = run();
    EXPECT_EQ(result.outcome, Outcome::Waiting);
    EXPECT_THAT(result.sentence, HasSubstr("; no confirmation: no confirmations"));
    now += 23 * hour;
    EXPECT_EQ(run().outcome, Outcome::Waiting);
    EXPECT_EQ(run().outcome, Outcome::Waiting);
    now += 2 * hour;
    EXPECT_EQ(run().outcome, Outcome::Waiting); // gives it up
    EXPECT_EQ(pseudonym(), old);
    EXPECT_EQ(run().outcome, Outcome::Sent);
    ASSERT_EQ(stream.messages.size(), 2U);
    EXPECT_EQ(stream.messages[1].first, pseudonym() + ":aa:11:20");
    EXPECT_NE(pseudonym(), old);
}

TEST_F(RoundTest, aPseudonymThatIsDueWaitsForNobodyIfTheStreamIsEnough)
{
    const std::string old = pseudonym();
    store.newest = 10;
    EXPECT_EQ(run().outcome, Outcome::Sent);
    terms.forgetWhen = ForgetWhen::Queued; // by a change of the configuration
    now += 91 * 24 * hour;
    store.newest = 20;
    EXPECT_EQ(run().outcome, Outcome::Sent);
    ASSERT_EQ(stream.messages.size(), 2U);
    EXPECT_EQ(stream.messages[1].first, pseudonym() + ":aa:11:20");
    EXPECT_NE(pseudonym(), old);
}

TEST(Patience, itIsOverAfterADayWithTheSamePlace)
{
    const support::TemporaryDirectory directory;
    Patience patience(directory / "since");
    const Cursor place{"aa", 5};
    EXPECT_FALSE(patience.isOver(place, start));
    patience.wait(place, start);
    patience.wait(place, start + 23 * hour); // no new beginning
    EXPECT_FALSE(patience.isOver(place, start + 23 * hour));
    EXPECT_TRUE(patience.isOver(place, start + 25 * hour));
    EXPECT_TRUE(Patience(directory / "since").isOver(place, start + 25 * hour)); // as after a new start
    EXPECT_FALSE(patience.isOver({"aa", 6}, start + 25 * hour));
    EXPECT_FALSE(patience.isOver({"bb", 5}, start + 25 * hour));
    patience.rest();
    EXPECT_FALSE(patience.isOver(place, start + 25 * hour));
}

TEST(Patience, aClockThatWasSetBackBeginsTheWaitAnew)
{
    const support::TemporaryDirectory directory;
    Patience patience(directory / "since");
    const Cursor place{"aa", 5};
    patience.wait(place, start + 1000 * hour);
    patience.wait(place, start);
    EXPECT_TRUE(patience.isOver(place, start + 25 * hour));
}

TEST(Patience, aBrokenFileIsNoWait)
{
    const support::TemporaryDirectory directory;
    support::writeFile(directory / "since", "aa 5 17");
    EXPECT_FALSE(Patience(directory / "since").isOver({"aa", 5}, start));
}

} // namespace
} // namespace uplink_test
