// SPDX-License-Identifier: Apache-2.0
// The ledger as one dictionary: its shape, and where each count stands in it.
#include "ledger/Report.h"

#include "support/EnvironmentVariable.h"
#include "support/PrintValues.h"

#include <algorithm>
#include <gmock/gmock.h>
#include <set>

namespace ledger {
namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;

const ServiceProcess process{
    .version = "1.2.3",
    .isInternalBuild = true,
    .started = 1700000000.75,
    .memory = [] { return MemoryState{.used = 5, .limit = 100, .limitOfAUser = 75, .limitOfAClient = 50}; },
    .backlog = [] { return Backlog{.calls = 7, .events = 8}; }};

// The value under keys within keys.
Value at(const Dictionary& report, std::string_view path)
{
    const std::size_t dot = path.find('.');
    const Value* value = report.find(path.substr(0, dot));
    if (value == nullptr)
        return "missing";
    return dot == std::string_view::npos ? *value
                                         : at(value->dictionary().value_or(Dictionary()), path.substr(dot + 1));
}

LedgerImage imageThatBegan(double began)
{
    LedgerImage image;
    image.begin({.began = began, .counts = {}, .store = {}, .culprits = {}});
    return image;
}

std::vector<std::string> keys(const Dictionary& dictionary)
{
    std::vector<std::string> keys;
    for (const foundation::String& key : dictionary.keys())
        keys.emplace_back(key.view());
    return keys;
}

bool isOnlyOfTheWhole(const std::string& key)
{
    static const std::set<std::string> keys{"running", "version", "internalBuild",    "started", "now",
                                            "rates",   "storing", "storingStretches", "memory",  "began",
                                            "store",   "stored",  "sinceStart"};
    return keys.contains(key);
}

// Groups of further counts may come; none of these may go.
TEST(Report, HasTheKeysThatProgramsReadInTheirOrder)
{
    const Dictionary whole = report(Ledger(), process, true);
    const std::vector<std::string> expected{
        "running", "version",  "internalBuild", "started",  "now",        "rates",    "storing",     "storingStretches",
        "memory",  "began",    "store",         "stored",   "deliveries", "recorded", "repeated",    "inert",
        "refused", "events",   "kept",          "unwanted", "lost",       "removed",  "connections", "frames",
        "calls",   "sessions", "channels",      "captures", "traces",     "log",      "who",         "sinceStart"};
    std::vector<std::string> found = keys(whole);
    std::erase_if(found, [&](const std::string& key) { return std::ranges::find(expected, key) == expected.end(); });
    EXPECT_EQ(found, expected);
    const Dictionary ofRun = *whole.find("sinceStart")->dictionary();
    for (const std::string& key : keys(whole))
        EXPECT_EQ(ofRun.contains(key), !isOnlyOfTheWhole(key)) << key;
    EXPECT_EQ(keys(report(Ledger().account(), true)), keys(whole)) << "also without a process";
}

TEST(Report, HasCountsWithinGroupsAlsoWhenTheyAre0)
{
    const Dictionary whole = report(Ledger(), process, false);
    EXPECT_EQ(at(whole, "frames").text(), R"({"refused":{"tooLong":0,"notCbor":0,"cutOff":0,"notACall":0}})");
    EXPECT_EQ(at(whole, "sinceStart.refused.memory"), Value(0));
    EXPECT_EQ(at(whole, "connections").text(),
              R"({"accepted":0,"refused":{"userLimit":0,"unfinished":0},"ended":0,"interrupted":0,"acceptingPauses":0,)"
              R"("readingPauses":0,"memoryPauses":0,"answerBytesDropped":0})");
}

TEST(Report, SaysWhichProcessCountsAndSinceWhen)
{
    LedgerImage image = imageThatBegan(1600000000.25);
    const Dictionary whole = report(Ledger(image), process, false);
    EXPECT_EQ(at(whole, "running"), Value(true));
    EXPECT_EQ(at(whole, "version"), Value("1.2.3"));
    EXPECT_EQ(at(whole, "internalBuild"), Value(true));
    EXPECT_EQ(at(whole, "started").text(), "1700000000");
    EXPECT_EQ(at(whole, "began").text(), "1600000000");
    EXPECT_EQ(at(whole, "now").text(), R"({"connections":0,"sessions":0,"waitingCalls":7,"waitingEvents":8})");
    EXPECT_EQ(at(whole, "memory").text(), R"({"used":5,"limit":100,"limitOfAUser":75,"limitOfAClient":50})");
    EXPECT_EQ(at(whole, "store").text(), R"({"events":0,"bytes":0,"oldest":null})");
}

TEST(Report, WithoutAProcessHasNullForWhatOnlyAProcessHas)
{
    const LedgerImage image = imageThatBegan(1600000000);
    const Dictionary whole = report(*accountIn(image), false);
    EXPECT_EQ(at(whole, "running"), Value(false));
    EXPECT_EQ(at(whole, "began"), Value(1600000000));
    for (const char* key :
         {"version", "internalBuild", "started", "now", "rates", "storing", "storingStretches", "memory", "sinceStart"})
        EXPECT_EQ(at(whole, key), Value()) << key;
}

TEST(Report, HasEachCountUnderThePathOfItsRow)
{
    Ledger ledger;
    for (const CounterRow& row : counterRows())
        ledger.count(row.counter, static_cast<std::uint64_t>(row.counter) + 100);
    const Dictionary whole = report(ledger, process, false);
    const Dictionary ofRun = *whole.find("sinceStart")->dictionary();
    for (const CounterRow& row : counterRows()) {
        EXPECT_EQ(at(whole, row.path), Value(static_cast<int>(row.counter) + 100)) << row.path;
        EXPECT_EQ(at(ofRun, row.path), Value(static_cast<int>(row.counter) + 100)) << row.path;
    }
}

TEST(Report, TellsTheRunFromAllThatWasBefore)
{
    LedgerImage image = imageThatBegan(1600000000);
    {
        Ledger earlier(image);
        earlier.count(Counter::Kept, 40);
        earlier.count(Counter::ConnectionsAccepted, 9);
        earlier.count(Counter::SessionsCreated, 8);
    }
    Ledger ledger(image);
    ledger.count(Counter::Kept, 2);
    ledger.count(Counter::ConnectionsAccepted, 7);
    ledger.count(Counter::ConnectionsEnded, 2);
    ledger.count(Counter::ConnectionsInterrupted, 1);
    ledger.count(Counter::SessionsCreated, 6);
    ledger.count(Counter::SessionsGone, 1);
    const Dictionary whole = report(ledger, process, false);
    EXPECT_EQ(at(whole, "kept"), Value(42));
    EXPECT_EQ(at(whole, "sinceStart.kept"), Value(2));
    EXPECT_EQ(at(whole, "now.connections"), Value(4));
    EXPECT_EQ(at(whole, "now.sessions"), Value(5));
}

TEST(Report, SaysWhatTheStoreHoldsAndNotWhatTheCountsSay)
{
    Ledger ledger;
    Tally tally;
    tally.add(Counter::Kept, 10);
    ledger.post(tally, StoreState{.events = 7, .bytes = 4096, .oldest = 1650000000.9});
    const Dictionary whole = report(ledger, process, false);
    EXPECT_EQ(at(whole, "stored"), Value(7));
    EXPECT_EQ(at(whole, "store.events"), Value(7));
    EXPECT_EQ(at(whole, "store.bytes"), Value(4096));
    EXPECT_EQ(at(whole, "store.oldest"), Value(1650000000));
}

TEST(Report, HasTheRatesOfTheLastMinute)
{
    Ledger ledger;
    Tally tally;
    tally.add(Counter::Deliveries, 12);
    tally.add(Counter::Events, 24);
    ledger.post(tally);
    const Dictionary whole = report(ledger, process, false);
    EXPECT_EQ(at(whole, "rates.deliveries"), Value(12));
    EXPECT_EQ(at(whole, "rates.events"), Value(24));
}

TEST(Report, NamesCulpritsOnlyOnRequest)
{
    Ledger ledger;
    ledger.count(Counter::RefusedForMemory, {.user = 1000, .process = "player", .application = "org.example"}, 3);
    EXPECT_FALSE(report(ledger, process, false).contains("who"));
    EXPECT_FALSE(report(ledger, process, false).find("sinceStart")->dictionary()->contains("who"));
    EXPECT_FALSE(report(ledger.account(), false).contains("who"));
    const std::string expected =
        R"({"refused":[{"user":1000,"process":"player","application":"org.example","count":3}],"lost":[],"removed":[]})";
    EXPECT_EQ(at(report(ledger, process, true), "who").text(), expected);
    EXPECT_EQ(at(report(ledger, process, true), "sinceStart.who").text(),
              expected.substr(0, expected.size() - 1) + R"(,"time":[]})");
    EXPECT_EQ(at(report(ledger.account(), true), "who").text(), expected);
}

TEST(Report, SaysWhoTookTheTimeOfTheRunOnlyOnRequest)
{
    using namespace std::chrono_literals;
    Ledger ledger;
    const auto workload = ledger.workloads().open(1000);
    ledger.workloads().setProcess(*workload, "player");
    workload->received(3, 700);
    workload->took(2'000'001'999ns);
    EXPECT_EQ(at(report(ledger, process, true), "sinceStart.who.time").text(),
              R"([{"user":1000,"process":"player","calls":3,"microseconds":2000001,"bytes":700}])");
    EXPECT_EQ(at(report(ledger, process, true), "who.time"), Value("missing")) << "only the run is known";
    EXPECT_EQ(at(report(ledger, process, false), "sinceStart.who"), Value("missing"));
}

TEST(Report, SumsUpTheTimeOfThoseBeyondTheTenLargest)
{
    Ledger ledger;
    std::vector<std::shared_ptr<Workload>> workloads;
    for (std::uint32_t user = 1; user <= 12; ++user) {
        workloads.push_back(ledger.workloads().open(user));
        workloads.back()->received(1, 10);
        workloads.back()->took(std::chrono::microseconds(user));
    }
    const auto list = *at(report(ledger, process, true), "sinceStart.who.time").array();
    ASSERT_EQ(list.size(), 11U);
    EXPECT_EQ(list[0].text(), R"({"user":12,"process":"","calls":1,"microseconds":12,"bytes":10})");
    EXPECT_EQ(list[10].text(), R"({"calls":2,"microseconds":3,"bytes":20})");
}

TEST(Report, SumsUpTheCulpritsBeyondTheTenLargest)
{
    Ledger ledger;
    for (std::uint32_t user = 1; user <= 12; ++user)
        ledger.count(Counter::LostToDiskFull, {.user = user, .process = "player", .application = ""}, 100 + user);
    ledger.count(Counter::LostToReadOnly, 5); // without a culprit
    const Array lost = *at(report(ledger, process, true), "who.lost").array();
    ASSERT_EQ(lost.size(), 11U);
    EXPECT_EQ(lost[0].text(), R"({"user":12,"process":"player","application":"","count":112})");
    EXPECT_EQ(lost[9].text(), R"({"user":3,"process":"player","application":"","count":103})");
    EXPECT_EQ(lost[10].text(), R"({"count":208})");
}

// --- The line

TEST(StatusLine, HasWhatIsOpenTheLastMinuteAndNoLoss)
{
    const support::EnvironmentVariable zone("TZ", "UTC");
    Ledger ledger;
    ledger.count(Counter::ConnectionsAccepted, 3);
    ledger.count(Counter::SessionsCreated, 1);
    Tally tally;
    tally.add(Counter::Deliveries, 1204);
    tally.add(Counter::Events, 1'234'567);
    ledger.post(tally);
    EXPECT_EQ(statusLine(report(ledger, process, false), 1700000000.5),
              "3 connections, 1 session; 1,204 messages and 1,234,567 events in the minute to 22:13:20; nothing lost");
}

TEST(StatusLine, HasTheLossesSinceTheStartAndTheReasonOfMost)
{
    const support::EnvironmentVariable zone("TZ", "UTC");
    LedgerImage image = imageThatBegan(1600000000);
    Ledger(image).count(Counter::LostToReadOnly, 1000);
    Ledger ledger(image);
    ledger.count(Counter::RemovedForAge, 50); // by a limit, so not a loss
    EXPECT_THAT(statusLine(report(ledger, process, false), 0), testing::EndsWith("; nothing lost"));
    ledger.count(Counter::LostToDiskFull, 900);
    ledger.count(Counter::RefusedForMemory, 304);
    EXPECT_THAT(statusLine(report(ledger, process, false), 0),
                testing::EndsWith("; 1,204 lost: the disk is full; see kesto status"));
}

TEST(StatusLine, GroupsDigitsByThree)
{
    EXPECT_EQ(groupedText(0), "0");
    EXPECT_EQ(groupedText(999), "999");
    EXPECT_EQ(groupedText(1000), "1,000");
    EXPECT_EQ(groupedText(1234567), "1,234,567");
    EXPECT_EQ(countedText(1, "event"), "1 event");
    EXPECT_EQ(countedText(2000, "event"), "2,000 events");
}

} // namespace
} // namespace ledger
