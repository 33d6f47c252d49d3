// SPDX-License-Identifier: Apache-2.0
// What the uplink remembers, through kills, second processes and damage.
#include "kesto-uplink/state/State.h"

#include "support/TemporaryDirectory.h"
#include "support/Victim.h"

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

namespace kesto_uplink {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::MatchesRegex;

constexpr double day = 86'400;

class UplinkState : public testing::Test {
protected:
    [[nodiscard]] State open(double now = 1000) const { return State::open(directory.path(), now); }

    static Progress sent(std::string epoch, std::int64_t last, std::int64_t rows = 10)
    {
        return {.last = {std::move(epoch), last}, .rows = rows, .bytes = rows * 100};
    }

    const support::TemporaryDirectory directory;
    const std::filesystem::path file = directory / State::fileName;
};

TEST_F(UplinkState, IsNotThereUntilItIsMade)
{
    EXPECT_FALSE(State::openPresent(directory.path()));
    EXPECT_FALSE(std::filesystem::exists(file));
    support::writeFile(file, ""); // as a kill in the moment of making leaves it
    EXPECT_FALSE(State::openPresent(directory.path()));
    EXPECT_THAT(open().identity().pseudonym, MatchesRegex("[0-9a-f]{32}"));
    EXPECT_TRUE(State::openPresent(directory.path()));
}

TEST_F(UplinkState, BeginsBeforeEverything)
{
    State state = open(1000);
    EXPECT_EQ(state.queued(), Cursor());
    EXPECT_EQ(state.stored(), Cursor());
    EXPECT_THAT(state.openSessions(), IsEmpty());
    EXPECT_EQ(state.totals(), Totals());
    EXPECT_FALSE(state.lastAnswer());
    EXPECT_FALSE(state.onSince());
    EXPECT_EQ(state.identity().pseudonymBorn, 1000);
    EXPECT_THAT(state.identity().hashKey, MatchesRegex("[0-9a-f]{64}"));
}

TEST_F(UplinkState, IsForItsOwnerAlone)
{
    static_cast<void>(open());
    struct stat status{};
    ASSERT_EQ(::stat(file.c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 0777U, 0600U);
}

TEST_F(UplinkState, KeepsItsIdentity)
{
    const Identity first = open(1000).identity();
    const Identity second = open(2000).identity();
    EXPECT_EQ(first.pseudonym, second.pseudonym);
    EXPECT_EQ(first.hashKey, second.hashKey);
    EXPECT_EQ(second.pseudonymBorn, 1000);
    const support::TemporaryDirectory other;
    EXPECT_NE(State::open(other.path(), 1000).identity().pseudonym, first.pseudonym);
}

TEST_F(UplinkState, NotesWhatWasSentAndWhatIsStored)
{
    State state = open();
    const Identity as = state.identity();
    Progress progress = sent("e", 50);
    progress.notAllowed = 4;
    progress.lostToAge = 2;
    progress.openSessions = {7, 9};
    EXPECT_TRUE(state.noteQueued(as, progress, 20));
    EXPECT_EQ(state.queued(), (Cursor{"e", 50}));
    EXPECT_EQ(state.stored(), (Cursor{"e", 0}));
    EXPECT_THAT(state.openSessions(), ElementsAre(7, 9));
    EXPECT_EQ(state.totals(),
              (Totals{.rows = 10, .batches = 1, .bytes = 1000, .retries = 0, .notAllowed = 4, .lostToAge = 2}));
    EXPECT_EQ(state.bytesSentOn(20), 1000);
    EXPECT_EQ(state.bytesSentOn(21), 0);
    EXPECT_TRUE(state.noteQueued(as, sent("e", 60), 21));
    EXPECT_EQ(state.bytesSentOn(21), 1000);
    EXPECT_THAT(state.openSessions(), IsEmpty());
    EXPECT_TRUE(state.noteStored(as, {"e", 50}));
    EXPECT_EQ(open().stored(), (Cursor{"e", 50}));
    EXPECT_TRUE(state.noteStored(as, {"e", 60}));
    EXPECT_EQ(open().stored(), (Cursor{"e", 60}));
}

// Rows that may not leave need no answer.
TEST_F(UplinkState, TakesARangeWithoutRowsForStoredWithWhatIsBeforeIt)
{
    State state = open();
    const Identity as = state.identity();
    EXPECT_TRUE(state.noteQueued(as, sent("e", 10, 0), 20));
    EXPECT_EQ(state.stored(), (Cursor{"e", 10}));
    EXPECT_EQ(state.totals().batches, 0);
    EXPECT_TRUE(state.noteQueued(as, sent("e", 20), 20));
    EXPECT_TRUE(state.noteQueued(as, sent("e", 30, 0), 20));
    EXPECT_EQ(state.stored(), (Cursor{"e", 10}));
    EXPECT_TRUE(state.noteStored(as, {"e", 19}));
    EXPECT_EQ(state.stored(), (Cursor{"e", 19}));
    EXPECT_TRUE(state.noteStored(as, {"e", 20}));
    EXPECT_EQ(state.stored(), (Cursor{"e", 30}));
}

TEST_F(UplinkState, BelievesNoAnswerAboutWhatItHasNotSent)
{
    State state = open();
    const Identity as = state.identity();
    EXPECT_TRUE(state.noteQueued(as, sent("e", 20), 20));
    EXPECT_TRUE(state.noteStored(as, {"other", 20}));
    EXPECT_EQ(state.stored(), (Cursor{"e", 0}));
    EXPECT_TRUE(state.noteStored(as, {"e", 1000}));
    EXPECT_EQ(state.stored(), (Cursor{"e", 20}));
    EXPECT_TRUE(state.noteStored(as, {"e", 5}));
    EXPECT_EQ(state.stored(), (Cursor{"e", 20}));
}

TEST_F(UplinkState, BeginsAnewWithAnotherDatabase)
{
    State state = open();
    const Identity as = state.identity();
    EXPECT_TRUE(state.noteQueued(as, sent("e", 500), 20));
    EXPECT_TRUE(state.noteQueued(as, sent("f", 5), 20));
    EXPECT_EQ(state.queued(), (Cursor{"f", 5}));
    EXPECT_EQ(state.stored(), (Cursor{"f", 0}));
    EXPECT_TRUE(state.noteStored(as, {"e", 500}));
    EXPECT_EQ(state.stored(), (Cursor{"f", 0}));
    EXPECT_TRUE(state.noteStored(as, {"f", 5}));
    EXPECT_EQ(state.stored(), (Cursor{"f", 5}));
    EXPECT_TRUE(state.noteQueued(as, {.last = {"g", 90}, .first = 70, .rows = 1}, 20));
    EXPECT_EQ(state.stored(), (Cursor{"g", 69}));
}

TEST_F(UplinkState, GoesBackToWhatIsStored)
{
    State state = open();
    const Identity as = state.identity();
    EXPECT_TRUE(state.noteQueued(as, sent("e", 20), 20));
    EXPECT_TRUE(state.noteStored(as, {"e", 20}));
    EXPECT_TRUE(state.noteQueued(as, sent("e", 30), 20));
    EXPECT_TRUE(state.sendAgain(as));
    EXPECT_EQ(state.queued(), (Cursor{"e", 20}));
    EXPECT_TRUE(state.noteQueued(as, sent("e", 30), 20));
    EXPECT_TRUE(state.noteAllStored(as));
    EXPECT_EQ(state.stored(), (Cursor{"e", 30}));
}

TEST_F(UplinkState, CountsAttemptsAndAnswers)
{
    State state = open();
    state.noteRetry(300, 20);
    state.noteRetry(300, 20);
    EXPECT_EQ(state.totals().retries, 2);
    EXPECT_EQ(state.totals().bytes, 0);
    EXPECT_EQ(state.bytesSentOn(20), 600);
    state.noteAnswer({"no such stream", 5000});
    const auto answer = state.lastAnswer();
    ASSERT_TRUE(answer);
    EXPECT_EQ(answer->text, "no such stream");
    EXPECT_EQ(answer->time, 5000);
}

TEST_F(UplinkState, KnowsSinceWhenItIsOn)
{
    State state = open();
    state.noteOn(100);
    state.noteOn(200);
    EXPECT_EQ(state.onSince(), 100);
    state.noteOff();
    EXPECT_EQ(state.onSince(), std::nullopt);
    state.noteOn(300);
    EXPECT_EQ(state.onSince(), 300);
}

// The one that sends holds another connection than the one that forgets.
TEST_F(UplinkState, ForgetsBesideTheOneThatSends)
{
    State sender = open();
    const Identity before = sender.identity();
    Progress progress = sent("e", 20);
    progress.openSessions = {7};
    EXPECT_TRUE(sender.noteQueued(before, progress, 20));

    open().forget({"e", 900}, 2000);

    EXPECT_FALSE(sender.noteQueued(before, sent("e", 40), 20));
    EXPECT_FALSE(sender.noteStored(before, {"e", 20}));
    EXPECT_FALSE(sender.noteAllStored(before));
    EXPECT_FALSE(sender.sendAgain(before));
    EXPECT_EQ(sender.queued(), (Cursor{"e", 900}));
    EXPECT_EQ(sender.stored(), (Cursor{"e", 900}));
    EXPECT_THAT(sender.openSessions(), IsEmpty());
    const Identity after = sender.identity();
    EXPECT_NE(after.pseudonym, before.pseudonym);
    EXPECT_NE(after.hashKey, before.hashKey);
    EXPECT_EQ(after.pseudonymBorn, 2000);
    EXPECT_EQ(sender.totals().batches, 1);
    EXPECT_TRUE(sender.noteQueued(after, sent("e", 950), 20));
}

TEST_F(UplinkState, LeavesNothingOfAnEarlierIdentityInItsFile)
{
    const Identity before = open().identity();
    open().forget({}, 2000);
    std::ifstream stream(file, std::ios::binary);
    const std::string bytes{std::istreambuf_iterator<char>(stream), {}};
    EXPECT_THAT(bytes, HasSubstr(open().identity().pseudonym));
    EXPECT_EQ(bytes.find(before.pseudonym), std::string::npos);
    EXPECT_EQ(bytes.find(before.hashKey), std::string::npos);
}

TEST_F(UplinkState, RenewsWhatIsTooOld)
{
    State state = open(0);
    const Identity first = state.identity();
    EXPECT_EQ(state.renew(10, 5, 4 * day), Renewal::NotDue);
    EXPECT_EQ(state.renew(10, 5, 6 * day), Renewal::Renewed);
    const Identity second = state.identity();
    EXPECT_EQ(second.pseudonym, first.pseudonym);
    EXPECT_NE(second.hashKey, first.hashKey);
    EXPECT_EQ(second.hashKeyBorn, 6 * day);
    EXPECT_EQ(state.renew(10, 100, 11 * day), Renewal::Renewed);
    const Identity third = state.identity();
    EXPECT_NE(third.pseudonym, first.pseudonym);
    EXPECT_EQ(third.pseudonymBorn, 11 * day);
    // The hashes under two pseudonyms would connect them.
    EXPECT_NE(third.hashKey, second.hashKey);
    EXPECT_EQ(third.hashKeyBorn, 11 * day);
    EXPECT_EQ(state.renew(10, 100, 1 * day), Renewal::NotDue); // the clock was set back
}

// Rows that were sent under one pseudonym must not be sent again under the next.
TEST_F(UplinkState, RenewsThePseudonymWhenAllIsStored)
{
    State state = open(0);
    const Identity as = state.identity();
    Progress progress = sent("e", 20);
    progress.openSessions = {7};
    EXPECT_TRUE(state.noteQueued(as, progress, 20));
    EXPECT_EQ(state.renew(10, 100, 11 * day), Renewal::Waiting);
    EXPECT_EQ(state.identity().pseudonym, as.pseudonym);
    EXPECT_THAT(state.openSessions(), ElementsAre(7));
    EXPECT_TRUE(state.noteStored(as, {"e", 20}));
    EXPECT_EQ(state.renew(10, 100, 11 * day), Renewal::Renewed);
    EXPECT_NE(state.identity().pseudonym, as.pseudonym);
    EXPECT_EQ(state.queued(), (Cursor{"e", 20}));
    // The session's beginning left under the old pseudonym, so its end leaves under none.
    EXPECT_THAT(state.openSessions(), IsEmpty());
}

// 0 while the file is being written.
std::int64_t lastTold(const std::filesystem::path& file)
{
    std::int64_t last = 0;
    std::ifstream(file) >> last;
    return last;
}

// The killed process notes 1, 2, 3... and says so each time: at most the note that it has not told is there.
TEST_F(UplinkState, LosesNothingWhenItIsKilled)
{
    for (int attempt = 0; attempt < 10; ++attempt) {
        const std::int64_t before = open().queued().id;
        const std::filesystem::path told = directory / "told";
        support::writeFile(told, "0");
        std::int64_t last = 0;
        {
            const support::Victim victim(support::Victim::Unawaited(), [&] {
                State state = open();
                const Identity as = state.identity();
                for (std::int64_t id = before + 1; state.noteQueued(as, sent("e", id), 20); ++id)
                    std::ofstream(told) << id << '\n' << std::flush;
                return false;
            });
            for (int wait = 0; last <= before && wait < 10'000; ++wait, ::usleep(1000))
                last = lastTold(told);
            ASSERT_GT(last, before);
            ::usleep(attempt * 3000); // so that each kill meets another moment
        }
        last = std::max(last, lastTold(told));
        State state = open();
        EXPECT_GE(state.queued().id, last);
        EXPECT_EQ(state.totals().batches, state.queued().id);
    }
}

std::string errorOf(const std::filesystem::path& directory)
{
    try {
        static_cast<void>(State::open(directory, 0));
    } catch (const StateError& error) {
        return error.what();
    }
    return "";
}

TEST_F(UplinkState, RefusesDamage)
{
    static_cast<void>(open());
    {
        std::fstream stream(file, std::ios::in | std::ios::out | std::ios::binary);
        stream.seekp(4096);
        stream << std::string(2000, 'x');
    }
    EXPECT_THAT(errorOf(directory.path()), HasSubstr("it is damaged: move it away"));
    EXPECT_THROW(static_cast<void>(State::openPresent(directory.path())), StateError);
    support::writeFile(file, "no database at all, but a text of a person");
    EXPECT_THAT(errorOf(directory.path()), HasSubstr(file.native()));
    EXPECT_THAT(errorOf(directory.path()), HasSubstr("it is damaged: move it away"));
}

TEST_F(UplinkState, RefusesTheFileOfAnotherProgram)
{
    const auto other = platform::SqliteConnection::open(file);
    ASSERT_TRUE(other && (*other)->execute("CREATE TABLE uplink(row)"));
    EXPECT_EQ(errorOf(directory.path()), file.native() + " is not a state of kesto-uplink: move it away");
}

TEST_F(UplinkState, RefusesTheFileOfALaterVersion)
{
    static_cast<void>(open());
    const auto later = platform::SqliteConnection::open(file);
    ASSERT_TRUE(later && (*later)->execute("PRAGMA user_version = 2"));
    EXPECT_THAT(errorOf(directory.path()), HasSubstr("a later version of kesto-uplink made the state"));
}

TEST_F(UplinkState, SaysWhereItCannotBe)
{
    EXPECT_THAT(errorOf(directory / "missing"), HasSubstr("cannot be made: No such file or directory"));
}

} // namespace
} // namespace kesto_uplink
