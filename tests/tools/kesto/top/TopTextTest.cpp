// SPDX-License-Identifier: Apache-2.0
// The screen of `kesto top` and its lines for programs, of looks that are made up.
#include "kesto/top/TopText.h"
#include "ledger/Report.h"
#include "support/EnvironmentVariable.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace {

using ledger::Counter;
using ledger::Ledger;
using testing::ElementsAre;

constexpr double now = 1'700'000'130; // 2023-11-14 22:15:30

PlayingStream stream(std::int64_t session, const char* application, double since, std::optional<double> volume,
                     std::uint64_t faults)
{
    return {.session = session,
            .application = application,
            .since = since,
            .device = "speaker",
            .format = "S16LE/44100/2",
            .volume = volume,
            .faults = faults};
}

class TopText : public testing::Test {
protected:
    TopText()
    {
        image.begin({.began = 1600000000, .counts = {}, .store = {}, .culprits = {}});
        ledger.emplace(image);
        count(Counter::Deliveries, 90);
        ledger::Tally tally;
        tally.add(Counter::Events, 180);
        ledger->post(tally, ledger::StoreState{.events = 1204, .bytes = 35'200'000, .oldest = 1650000000});
        ledger->count(Counter::ConnectionsAccepted, 3);
        ledger->count(Counter::SessionsCreated);
    }
    void count(Counter counter, std::uint64_t number)
    {
        ledger::Tally tally;
        tally.add(counter, number);
        ledger->post(tally);
    }
    [[nodiscard]] TopLook look(std::vector<PlayingStream> streams = {}, double time = now, double started = 1700000000)
    {
        const ledger::ServiceProcess service{
            .version = "1.2.3",
            .started = started,
            .memory = [] { return ledger::MemoryState{.used = 1'200'000, .limit = 268'400'000}; },
            .backlog = [] { return ledger::Backlog{.calls = 1, .events = 1'204}; }};
        TopLook look{.time = time,
                     .steadyTime = time,
                     .status = ledger::report(*ledger, service, false),
                     .streams = std::move(streams)};
        look.rates = ratesOf(look, nullptr);
        return look;
    }

    const support::EnvironmentVariable zone{"TZ", "UTC"};
    ledger::LedgerImage image = {};
    std::optional<Ledger> ledger;
};

TEST_F(TopText, HasTheServiceAndWhatPlays)
{
    TopLook both =
        look({stream(1, "org.example.player", 1'700'000'002, 0.5, 0), stream(2, "radio", 1'699'900'000, 1, 1'204)});
    both.streams->push_back({.session = 3, .isRecording = true, .since = 1'700'000'100});
    EXPECT_THAT(topLines(both, "every 2 s", {}),
                ElementsAre("2023-11-14 22:15:30, every 2 s", "kestod 1.2.3, running since 2023-11-14 22:13:20",
                            "clients   3 connections, with 1 session", "traffic   1.5 messages and 3.0 events a second",
                            "backlog   1 call and 1,204 events", "memory    1.2 MB of at most 268.4 MB",
                            "store     1,204 events in 35.2 MB, the oldest of 2022-04-15 05:20:00", "lost      nothing",
                            "", "PLAYS                  SINCE      VOLUME  FAULTS  FORMAT         DEVICE",
                            "org.example.player     22:13:22     50 %       0  S16LE/44100/2  speaker",
                            "radio                  2023-11-13  100 %   1,204  S16LE/44100/2  speaker", "",
                            "RECORDS                SINCE      VOLUME  FAULTS  FORMAT         DEVICE",
                            "-                      22:15:00        -       0  -              -"));
}

TEST_F(TopText, SaysThatNothingPlays)
{
    EXPECT_EQ(topLines(look(), {}, {}).back(), "nothing plays or records");
}

TEST_F(TopText, SaysWhyItDoesNotKnowWhatPlays)
{
    TopLook blind = look();
    blind.streams.reset();
    blind.storeProblem = "cannot read the event store /x\n: permission denied";
    const auto lines = topLines(blind, {}, {});
    EXPECT_EQ(lines.at(2), "clients   3 connections, with 1 session");
    EXPECT_EQ(lines.back(), "cannot read the event store /x?: permission denied");
}

TEST_F(TopText, DoesNotSayThatNothingPlaysIfNobodyKnows)
{
    TopLook blind = look();
    blind.streams.reset();
    EXPECT_EQ(topLines(blind, {}, {}).back(), "lost      nothing");
}

TEST_F(TopText, SaysThatTheServiceDoesNotRunOrAnswer)
{
    const TopLook ended{.time = now, .status = ledger::report(*accountIn(image), false)};
    EXPECT_THAT(topLines(ended, {}, {}), ElementsAre("2023-11-14 22:15:30", "kestod does not run"));
    const TopLook silent{.time = now, .statusProblem = "the service does not answer"};
    EXPECT_THAT(topLines(silent, {}, {}), ElementsAre("2023-11-14 22:15:30", "the service does not answer"));
}

TEST_F(TopText, SaysHowMuchWasLost)
{
    count(Counter::LostToDiskFull, 1'204);
    EXPECT_EQ(topLines(look(), {}, {}).at(7), "lost      1,204 since the start; kesto status says why");
}

TEST_F(TopText, HasNoBacklogOfAnEarlierVersionWhichTellsNone)
{
    TopLook earlier = look();
    foundation::Dictionary::Entries entries;
    for (const auto& [key, value] : *earlier.status)
        entries.push_back(
            {key, key.view() == "now" ? foundation::Dictionary{{"connections", 3}, {"sessions", 1}} : value});
    earlier.status = foundation::Dictionary(entries);
    EXPECT_THAT(topLines(earlier, {}, {}), testing::Not(testing::Contains(testing::HasSubstr("backlog"))));
    EXPECT_THAT(topJson(earlier), testing::HasSubstr(R"("sessions":1,"waitingCalls":null,"waitingEvents":null,)"));
}

TEST_F(TopText, MakesTextOfStrangersPrintable)
{
    PlayingStream strange = stream(1, "a\x1B[2Jb", now, 0.5, 0);
    strange.device = "c\nd";
    strange.format = "\te";
    EXPECT_EQ(topLines(look({strange}), {}, {}).back(),
              "a?[2Jb                 22:15:30     50 %       0  ?e             c?d");
}

TEST_F(TopText, IsCutToTheTerminal)
{
    const auto lines =
        topLines(look({stream(1, "a", now, 0.5, 0), stream(2, "b", now, 0.5, 0)}), {}, {.width = 20, .height = 4});
    EXPECT_THAT(lines,
                ElementsAre("2023-11-14 22:15:30", "kestod 1.2.3, runni…", "clients   3 connect…", "and 9 lines more"));
    EXPECT_THAT(topLines(look(), {}, {.height = 1}), ElementsAre("and 10 lines more"));
}

TEST_F(TopText, IsAsciiInOtherLocales)
{
    const auto lines = topLines(look({stream(1, "Küchenradio", now, 0.5, 0)}), {}, {.width = 20, .isUTF8 = false});
    EXPECT_EQ(lines.at(1), "kestod 1.2.3, runni~");
    EXPECT_EQ(lines.back(), "K?chenradio        ~");
}

TEST_F(TopText, HasColoursOnRequest)
{
    const auto lines =
        topLines(look({stream(1, "a", now, 0.5, 2), stream(2, "b", now, 0.5, 0)}), {}, {.width = 5, .hasColor = true});
    EXPECT_EQ(lines.at(1), "kest…");
    EXPECT_THAT(std::vector(lines.end() - 3, lines.end()),
                ElementsAre("\x1B[1mPLAY…\x1B[0m", "\x1B[31ma   …\x1B[0m", "b   …"));
}

TEST_F(TopText, HelpNamesTheKeys)
{
    EXPECT_THAT(topHelpLines({}),
                ElementsAre("q      ends", "h      shows this, and hides it", "Space  pauses, and goes on",
                            "+ -    a longer and a shorter delay", "", "Sorting",
                            "s      since when: the longest first", "a      application", "d      device",
                            "v      volume: the loudest first", "f      faults: the most first"));
}

// --- Rates, order, JSON

using TopLookTest = TopText;

TEST_F(TopLookTest, RatesAreThoseBetweenTwoLooks)
{
    const TopLook before = look();
    count(Counter::Deliveries, 10);
    count(Counter::Events, 1);
    const TopLook after = look({}, now + 4);
    EXPECT_DOUBLE_EQ(ratesOf(after, &before)->messages, 2.5);
    EXPECT_DOUBLE_EQ(ratesOf(after, &before)->events, 0.25);
}

TEST_F(TopLookTest, RatesDoNotFollowAClockThatIsSet)
{
    const TopLook before = look();
    count(Counter::Deliveries, 10);
    TopLook after = look({}, now + 4);
    after.time = now - 3'600;
    EXPECT_DOUBLE_EQ(ratesOf(after, &before)->messages, 2.5);
}

TEST_F(TopLookTest, RatesOfAnotherRunAreThoseOfTheLastMinute)
{
    const TopLook before = look({}, now, 1'600'000'000);
    count(Counter::Deliveries, 30);
    const TopLook after = look({}, now + 4);
    EXPECT_DOUBLE_EQ(ratesOf(after, &before)->messages, 2);
    EXPECT_DOUBLE_EQ(ratesOf(after, nullptr)->messages, 2);
    const TopLook ended{.time = now, .status = ledger::report(*accountIn(image), false)};
    EXPECT_DOUBLE_EQ(ratesOf(after, &ended)->messages, 2);
    EXPECT_FALSE(ratesOf(ended, &after));
}

TEST_F(TopLookTest, SortsStreams)
{
    const std::vector<PlayingStream> unsorted{stream(4, "c", 3, 0.5, 0), stream(3, "a", 2, std::nullopt, 1),
                                              stream(2, "b", 1, 1, 2), stream(1, "a", 4, 0.5, 1)};
    const auto sorted = [&unsorted](TopOrder order) {
        std::optional streams = unsorted;
        streams->at(0).device = "headset";
        sortStreams(streams, order);
        std::vector<std::int64_t> sessions;
        for (const PlayingStream& each : *streams)
            sessions.push_back(each.session);
        return sessions;
    };
    EXPECT_THAT(sorted(TopOrder::Since), ElementsAre(2, 3, 4, 1));
    EXPECT_THAT(sorted(TopOrder::Application), ElementsAre(1, 3, 2, 4));
    EXPECT_THAT(sorted(TopOrder::Device), ElementsAre(4, 1, 3, 2));
    EXPECT_THAT(sorted(TopOrder::Volume), ElementsAre(2, 1, 4, 3));
    EXPECT_THAT(sorted(TopOrder::Faults), ElementsAre(2, 1, 3, 4));
}

TEST_F(TopLookTest, IsOneJsonObject)
{
    EXPECT_EQ(
        topJson(look({stream(1, "a\"\n", 1'700'000'002.5, 0.5, 2)})),
        R"({"time":1700000130,"running":true,"statusProblem":null,"version":"1.2.3","started":1700000000,)"
        R"("connections":3,"sessions":1,"waitingCalls":1,"waitingEvents":1204,)"
        R"("messagesPerSecond":1.5,"eventsPerSecond":3,)"
        R"("memory":{"used":1200000,"limit":268400000,"limitOfAUser":0,"limitOfAClient":0},"storing":true,"storingStretches":true,)"
        R"("store":{"events":1204,"bytes":35200000,"oldest":1650000000},"losses":0,)"
        R"("streams":[{"session":1,"application":"a\"\n","recording":false,"since":1700000002.5,)"
        R"("device":"speaker","format":"S16LE/44100/2","volume":0.5,"faults":2}],"storeProblem":null})");
    const TopLook silent{.time = 1.5, .statusProblem = "no"};
    EXPECT_EQ(topJson(silent),
              R"({"time":1.5,"running":false,"statusProblem":"no","version":null,"started":null,)"
              R"("connections":null,"sessions":null,"waitingCalls":null,"waitingEvents":null,)"
              R"("messagesPerSecond":null,"eventsPerSecond":null,)"
              R"("memory":null,"storing":null,"storingStretches":null,"store":null,"losses":null,"streams":null,)"
              R"("storeProblem":null})");
    TopLook blind = look();
    blind.streams.reset();
    blind.storeProblem = "not readable";
    EXPECT_TRUE(topJson(blind).ends_with(R"("streams":null,"storeProblem":"not readable"})"));
}

} // namespace
