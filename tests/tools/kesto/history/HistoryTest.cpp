// SPDX-License-Identifier: Apache-2.0
// What is read of a store: stretches, sessions and faults, those that run, and stores that have none.
#include "kesto/history/History.h"

#include "kesto/history/HistoryQueries.h"
#include "kesto/store/EventDatabase.h"
#include "platform/linux/files/FileDescriptor.h"
#include "support/TemporaryDirectory.h"
#include "tools/kesto/history/MadeStore.h"

#include <chrono>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/file.h>

namespace kesto_tool {
namespace {

using testing::AllOf;
using testing::DoubleNear;
using testing::ElementsAre;
using testing::Field;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Optional;

// "session began+seconds device format volume", with "?" where there is no volume.
std::vector<std::string> linesOf(const History& history)
{
    std::vector<std::string> lines;
    for (const auto& [session, began, seconds, device, format, volume, isRunning, hasVanished, hasServiceEnded] :
         history.stretches)
        lines.push_back(fmt::format("{} {}+{} {} {} {}{}{}", session, began, seconds, device, format,
                                    volume ? fmt::format("{}", *volume) : "?", isRunning ? " running" : "",
                                    hasVanished           ? " vanished"
                                        : hasServiceEnded ? " cut off"
                                                          : ""));
    return lines;
}

// "session time kind device cycles"
std::vector<std::string> faultsOf(const History& history)
{
    std::vector<std::string> lines;
    for (const auto& [session, happened, kind, device, lateCycles] : history.faults)
        lines.push_back(fmt::format("{} {} {} {} {}", session, happened, kind, device, lateCycles));
    return lines;
}

class HistoryOfStore : public testing::Test {
protected:
    [[nodiscard]] History read(const HistoryQuestion& question = {}) const { return readHistory(path, question); }
    [[nodiscard]] std::string errorOf(const std::filesystem::path& database) const
    {
        try {
            (void)readHistory(database, {});
        } catch (const EventStoreError& error) {
            return error.what();
        }
        return "none";
    }

    const support::TemporaryDirectory directory;
    const std::filesystem::path path = directory / "analytics.sqlite3";
    MadeStore store{path};
};

TEST_F(HistoryOfStore, IsEmptyWhereNothingWasPlayed)
{
    const History history = read();
    EXPECT_THAT(history.stretches, IsEmpty());
    EXPECT_THAT(history.sessions, IsEmpty());
    EXPECT_THAT(history.faults, IsEmpty());
}

TEST_F(HistoryOfStore, HasStretchesBySessionAndTime)
{
    store.addSession(1, "org.one", 90);
    store.addSession(2, "org.two", 80, 200);
    store.add({.session = 2, .began = 130, .seconds = 10, .device = {}, .format = {}, .volume = {}});
    store.add({.session = 1, .began = 120, .seconds = 5, .volume = 0, .ending = "vanished"});
    store.add({.session = 1, .began = 100, .seconds = 20, .device = "a,b", .volume = 1, .ending = "change"});
    const History history = read();
    EXPECT_THAT(
        linesOf(history),
        ElementsAre("1 100+20 a,b S16LE/48000/2 1", "1 120+5 speaker S16LE/48000/2 0 vanished", "2 130+10   ?"));
    ASSERT_EQ(history.sessions.size(), 2U);
    EXPECT_EQ(history.sessions[0].application, "org.one");
    EXPECT_EQ(history.sessions[0].service, "longformaudio");
    EXPECT_EQ(history.sessions[0].process, "process 1");
    EXPECT_EQ(history.sessions[0].user, 1000);
    EXPECT_EQ(history.sessions[0].processID, 4001);
    EXPECT_EQ(history.sessions[0].began, 90);
    EXPECT_EQ(history.sessions[0].ended, std::nullopt);
    EXPECT_EQ(history.sessions[1].ended, 200);
}

TEST_F(HistoryOfStore, HasOneSessionAlone)
{
    for (const int session : {1, 2, 3}) {
        store.addSession(session, "org.player", 90);
        store.add({.session = session, .began = 100, .seconds = 10});
        store.addFault(session, 105, "{}");
        store.addOpen({.session = session, .began = 120}, 120);
    }
    store.setLastWord(130);
    const History history = read({.session = 2});
    EXPECT_THAT(linesOf(history),
                ElementsAre("2 100+10 speaker S16LE/48000/2 0.5", "2 120+10 speaker S16LE/48000/2 0.5 cut off"));
    EXPECT_THAT(history.sessions, ElementsAre(Field(&HistorySession::id, 2)));
    EXPECT_THAT(faultsOf(history), ElementsAre("2 105 IssueDetector speaker 0"));
}

TEST_F(HistoryOfStore, HasWhatTouchesTheSpan)
{
    store.add({.began = 100, .seconds = 10});
    store.add({.began = 110, .seconds = 10});
    store.add({.began = 120, .seconds = 10});
    store.add({.began = 130, .seconds = 10});
    store.addFault(1, 109, "{}");
    store.addFault(1, 110, "{}");
    store.addFault(1, 130, "{}");
    const History history = read({.span = {.from = 110, .until = 130}});
    EXPECT_THAT(linesOf(history),
                ElementsAre("1 110+10 speaker S16LE/48000/2 0.5", "1 120+10 speaker S16LE/48000/2 0.5"));
    EXPECT_THAT(faultsOf(history), ElementsAre("1 110 IssueDetector speaker 0"));
}

TEST_F(HistoryOfStore, TellsPlayingFromRecording)
{
    store.add({.session = 1, .began = 100, .seconds = 10});
    store.add({.session = 2, .began = 200, .seconds = 10, .device = "microphone", .isRecording = true});
    store.addFault(1, 105, "{}");
    store.addFault(2, 205, "{}");
    store.addFault(3, 305, R"({"active_devices":"unknown"})");
    EXPECT_THAT(linesOf(read()), ElementsAre("1 100+10 speaker S16LE/48000/2 0.5"));
    EXPECT_THAT(faultsOf(read()), ElementsAre("1 105 IssueDetector speaker 0", "3 305 IssueDetector unknown 0"));
    EXPECT_THAT(linesOf(read({.isRecording = true})), ElementsAre("2 200+10 microphone S16LE/48000/2 0.5"));
    EXPECT_THAT(faultsOf(read({.isRecording = true})), ElementsAre("2 205 IssueDetector microphone 0"));
}

TEST_F(HistoryOfStore, TellsItAlsoByWhatASessionDidOutsideOfTheSpan)
{
    store.add({.session = 2, .began = 100, .seconds = 10, .device = "microphone", .isRecording = true});
    store.addFault(2, 205, R"({"active_devices":"microphone"})");
    EXPECT_THAT(faultsOf(read({.span = {.from = 200}})), IsEmpty());
    EXPECT_THAT(faultsOf(read({.span = {.from = 200}, .isRecording = true})),
                ElementsAre("2 205 IssueDetector microphone 0"));
    EXPECT_THAT(linesOf(read({.span = {.from = 200}, .isRecording = true})), IsEmpty());
}

TEST_F(HistoryOfStore, CutsTheDeviceOfAFaultAsThatOfAStretch)
{
    store.addFault(1, 5, R"({"active_devices":")" + std::string(300, 'x') + "\"}");
    EXPECT_THAT(faultsOf(read()), ElementsAre("1 5 IssueDetector " + std::string(256, 'x') + " 0"));
}

TEST_F(HistoryOfStore, HasAVolumeFromNoneToAll)
{
    store.add({.began = 1, .seconds = 1, .volume = -3});
    store.add({.began = 2, .seconds = 1, .volume = 1.5});
    store.add({.began = 3, .seconds = 1, .volume = 0.25});
    EXPECT_THAT(linesOf(read()),
                ElementsAre("1 1+1 speaker S16LE/48000/2 0", "1 2+1 speaker S16LE/48000/2 1",
                            "1 3+1 speaker S16LE/48000/2 0.25"));
}

TEST_F(HistoryOfStore, KnowsNoApplicationOfASessionThatIsGone)
{
    store.addSession(2, "org.two");
    store.add({.session = {}, .began = 1, .seconds = 1});
    store.add({.session = 1, .began = 2, .seconds = 1});
    store.add({.session = 2, .began = 3, .seconds = 1});
    const History history = read();
    EXPECT_THAT(linesOf(history),
                ElementsAre("0 1+1 speaker S16LE/48000/2 0.5", "1 2+1 speaker S16LE/48000/2 0.5",
                            "2 3+1 speaker S16LE/48000/2 0.5"));
    EXPECT_EQ(history.sessions.size(), 1U);
    EXPECT_EQ(sessionOf(history, 0), nullptr);
    EXPECT_EQ(sessionOf(history, 1), nullptr);
    ASSERT_NE(sessionOf(history, 2), nullptr);
    EXPECT_EQ(sessionOf(history, 2)->application, "org.two");
    EXPECT_EQ(sessionOf(history, 3), nullptr);
}

TEST_F(HistoryOfStore, HasOnlyMatchingApplicationsAndDevices)
{
    store.addSession(1, "org.one");
    store.addSession(2, "org.two");
    store.addSession(3, "net.three");
    store.add({.session = 1, .began = 1, .seconds = 1, .device = "headset"});
    store.add({.session = 2, .began = 2, .seconds = 1, .device = "speaker"});
    store.add({.session = 3, .began = 3, .seconds = 1, .device = "headset"});
    store.add({.session = 4, .began = 4, .seconds = 1, .device = {}});
    for (const int session : {1, 2, 3, 4})
        store.addFault(session, session, "{}");
    const History ofOrg = read({.applications = "org.*"});
    EXPECT_THAT(linesOf(ofOrg), ElementsAre("1 1+1 headset S16LE/48000/2 0.5", "2 2+1 speaker S16LE/48000/2 0.5"));
    EXPECT_THAT(faultsOf(ofOrg), ElementsAre("1 1 IssueDetector headset 0", "2 2 IssueDetector speaker 0"));
    EXPECT_EQ(ofOrg.sessions.size(), 2U);
    const History ofHeadset = read({.applications = "[^x]*", .devices = "head*"});
    EXPECT_THAT(linesOf(ofHeadset), ElementsAre("1 1+1 headset S16LE/48000/2 0.5", "3 3+1 headset S16LE/48000/2 0.5"));
    EXPECT_THAT(faultsOf(ofHeadset), ElementsAre("1 1 IssueDetector headset 0", "3 3 IssueDetector headset 0"));
    EXPECT_THAT(linesOf(read({.applications = ""})), ElementsAre("4 4+1  S16LE/48000/2 0.5"));
    EXPECT_THAT(linesOf(read({.devices = "HEADSET"})), IsEmpty()) << "as GLOB, which tells capitals";
}

TEST_F(HistoryOfStore, CountsEachFaultOnceAlthoughItStandsUnderTwoNames)
{
    store.add({.session = 1, .began = 100, .seconds = 10, .device = "speaker"});
    store.add({.session = 1, .began = 110, .seconds = 10, .device = "headset"});
    store.addFault(1, 115, R"({"issue":"late_cycles","late_cycles":7})");
    store.addFault(1, 105, R"({"active_devices":"dock","late_cycles":3})", "Generic");
    store.addFault(1, {}, R"({"late_cycles":1e300})", "IssueDetector", 112.5);
    store.addFault(1, 116, R"({"late_cycles":-4})");
    store.addFault({}, 117, "not JSON");
    EXPECT_THAT(faultsOf(read()),
                ElementsAre("1 105 Generic dock 3", "1 112.5 IssueDetector headset 1000000000",
                            "1 115 IssueDetector headset 7", "1 116 IssueDetector headset 0",
                            "0 117 IssueDetector  0"));
}

TEST_F(HistoryOfStore, FindsTheStretchOfAFault)
{
    store.add({.session = 1, .began = 100, .seconds = 5});
    store.add({.session = 1, .began = 110, .seconds = 5});
    const History history = read();
    const auto beganOf = [&history](std::int64_t session, double happened) {
        const auto* const stretch =
            stretchOf(history, {.session = session, .happened = happened, .kind = {}, .device = {}});
        return stretch == nullptr ? -1 : stretch->began;
    };
    EXPECT_EQ(beganOf(1, 99), 100);
    EXPECT_EQ(beganOf(1, 100), 100);
    EXPECT_EQ(beganOf(1, 107), 100);
    EXPECT_EQ(beganOf(1, 110), 110);
    EXPECT_EQ(beganOf(1, 999), 110);
    EXPECT_EQ(beganOf(2, 100), -1);
    EXPECT_EQ(beganOf(0, 100), -1);
}

TEST_F(HistoryOfStore, FindsFaultsByTheirNamesInTheIndex)
{
    store.addFault(1, 105, "{}");
    const auto connection = platform::SqliteConnection::open(path);
    const auto plan = (*connection)->prepare(fmt::format("EXPLAIN QUERY PLAN {}", history_queries::faults));
    std::string steps;
    while (*plan->step())
        steps += std::string(plan->text(3)) + "\n";
    EXPECT_THAT(steps, AllOf(HasSubstr("kinds_by_name (name>? AND name<?)"), HasSubstr("messages_by_kind (kind=?)")));
    EXPECT_THAT(steps, testing::Not(HasSubstr("SCAN")));
}

// --- What runs

class HistoryOfRunningSessions : public HistoryOfStore {
protected:
    HistoryOfRunningSessions()
    {
        store.addOpen({.session = 1, .began = 999, .volume = 0.25}, 1000);
        store.addOpen({.session = 2, .began = 1100, .isRecording = true}, 1100);
        store.addOpen({.session = 3, .began = 1200}, 1200);
        store.setLastWord(1200);
    }
    // As the service does.
    void hold() { held = platform::FileDescriptor(::open(directory.path().c_str(), O_RDONLY | O_DIRECTORY)); }
    static double present()
    {
        return std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count();
    }

    platform::FileDescriptor held;
};

TEST_F(HistoryOfRunningSessions, EndsWithTheLastWordOfAKilledService)
{
    EXPECT_THAT(linesOf(read()), ElementsAre("1 1000+200 speaker S16LE/48000/2 0.25 cut off"));
    EXPECT_EQ(read().now, 1200);
    EXPECT_THAT(linesOf(read({.span = {.from = 1200}})), IsEmpty());
    EXPECT_THAT(linesOf(read({.span = {.until = 999}})), IsEmpty());
}

TEST_F(HistoryOfRunningSessions, GoesOnUntilNowWhileAServiceHoldsTheStore)
{
    hold();
    ASSERT_EQ(::flock(held.get(), LOCK_EX | LOCK_NB), 0);
    constexpr double tolerance = 30; // for a machine that pauses
    const History history = read();
    EXPECT_THAT(history.now, DoubleNear(present(), tolerance));
    ASSERT_EQ(history.stretches.size(), 2U);
    EXPECT_TRUE(history.stretches[0].isRunning);
    EXPECT_THAT(history.stretches[0].seconds, DoubleNear(present() - 1000, tolerance));
    EXPECT_TRUE(history.stretches[1].isRunning);
    EXPECT_EQ(::flock(held.get(), LOCK_UN), 0);
    EXPECT_EQ(read().now, 1200);
}

TEST_F(HistoryOfRunningSessions, LooksAtTheServicesLockOnly)
{
    const platform::FileDescriptor file(::open(path.c_str(), O_RDONLY));
    ASSERT_EQ(::flock(file.get(), LOCK_EX | LOCK_NB), 0);
    hold();
    ASSERT_EQ(::flock(held.get(), LOCK_SH | LOCK_NB), 0);
    EXPECT_EQ(read().now, 1200);
}

TEST_F(HistoryOfRunningSessions, HasOneThatHasJustBegun)
{
    hold();
    ASSERT_EQ(::flock(held.get(), LOCK_EX | LOCK_NB), 0);
    store.execute("DELETE FROM open_stretches");
    store.addOpen({.session = 1, .began = present() + 60}, present() + 60);
    const History history = read();
    ASSERT_EQ(history.stretches.size(), 1U);
    EXPECT_EQ(history.stretches[0].seconds, 0) << "a clock that was set back";
    EXPECT_TRUE(history.stretches[0].isRunning);
}

TEST_F(HistoryOfRunningSessions, CountsOneWhoseClientsClockIsAheadFromItsArrival)
{
    hold();
    ASSERT_EQ(::flock(held.get(), LOCK_EX | LOCK_NB), 0);
    store.execute("DELETE FROM open_stretches");
    store.addOpen({.session = 1, .began = present() + 3600}, present() - 30);
    const History history = read();
    ASSERT_EQ(history.stretches.size(), 1U);
    EXPECT_GE(history.stretches[0].seconds, 30);
    EXPECT_DOUBLE_EQ(history.stretches[0].began + history.stretches[0].seconds, history.now);
}

// --- Other stores

TEST_F(HistoryOfStore, SaysThatAStoreOfTheFirstEditionHasNoPlayingTimes)
{
    const auto other = directory / "first.sqlite3";
    {
        const auto connection = platform::SqliteConnection::open(other);
        ASSERT_TRUE((*connection)
                        ->execute("CREATE TABLE events(id INTEGER PRIMARY KEY AUTOINCREMENT, time REAL NOT NULL,"
                                  " name TEXT NOT NULL, payload TEXT NOT NULL) STRICT; PRAGMA user_version = 1"));
    }
    EXPECT_EQ(errorOf(other),
              "the event store " + other.native()
                  + " has no playing times: an earlier version of kestod made it, or none has finished making it. They "
                    "come as soon as this version of kestod runs");
}

TEST_F(HistoryOfStore, SaysThatAnEarlierVersionsStoreHasNoPlayingTimes)
{
    store.execute("DROP TABLE stretches");
    EXPECT_THAT(errorOf(path), HasSubstr("has no playing times"));
}

TEST_F(HistoryOfStore, SaysWhatIsWrongWithTheFile)
{
    EXPECT_THAT(errorOf(directory / "none"), HasSubstr("does not exist: has kestod run?"));
    support::writeFile(directory / "text",
                       "This is not a database, but a text that is longer than a head of one. "
                           + std::string(1000, '.'));
    EXPECT_THAT(errorOf(directory / "text"), HasSubstr("file is not a database"));
}

TEST_F(HistoryOfStore, IsReadBesideAWriter)
{
    store.execute("PRAGMA journal_mode = WAL; BEGIN IMMEDIATE");
    store.add({.began = 1, .seconds = 1});
    EXPECT_THAT(linesOf(read()), IsEmpty());
    store.execute("COMMIT");
    EXPECT_THAT(linesOf(read()), ElementsAre("1 1+1 speaker S16LE/48000/2 0.5"));
    EXPECT_TRUE(store.isLogFree()) << "no reader is left";
}

} // namespace
} // namespace kesto_tool
