// The ledger as one dictionary: its shape, and where each count stands in it.
#include "ledger/Report.h"

#include "foundation/values/Json.h"
#include "support/PrintValues.h"

#include <gmock/gmock.h>

namespace ledger {
namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;

constexpr ServiceProcess process{.version = "1.2.3", .isInternalBuild = true, .started = 1700000000.75};

std::string json(const Dictionary& dictionary)
{
    std::string text;
    EXPECT_TRUE(foundation::appendJson(dictionary, text));
    return text;
}

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

// What stands in every report, with these counts of deliveries and refusals for memory.
const std::string zeros =
    R"("recorded":0,"repeated":0,"inert":0,"refused":{"memory":0,"size":0},"events":0,"kept":0,"unwanted":0,)"
    R"("lost":{"diskFull":0,"readOnly":0,"locked":0,"inUse":0,"cannotOpen":0,"inputOutput":0,"damage":0,"newer":0,)"
    R"("logHeld":0,"notJson":0,"other":0},"removed":{"age":0,"size":0,"share":0,"damage":0},)"
    R"("connections":{"accepted":0,"refused":{"userLimit":0},"ended":0,"interrupted":0,"acceptingPauses":0,)"
    R"("readingPauses":0,"answerBytesDropped":0},)"
    R"("frames":{"refused":{"tooLong":0,"notCbor":0,"cutOff":0,"notACall":0}},)"
    R"("calls":{"createReportingSession":0,"setServiceType":0,"getServiceNameForReporterID":0,"setConfiguration":0,)"
    R"("startReportingSessionForID":0,"sendMessage":0,"stopReportingSessionForID":0,"destroyReportingSession":0,)"
    R"("reporterID":0,"getAllReporters":0,"killService":0,"trace":0,"status":0},)"
    R"("sessions":{"created":0,"refused":0,"started":0,"stopped":0,"gone":0,)"
    R"("lost":{"configurations":0,"driverStatistics":0,"volumeEvents":0,"summaries":0}},)"
    R"("channels":{"leftOut":0},"captures":{"taken":0,"refused":0,"evicted":0},"traces":{"lostEvents":0},)"
    R"("log":{"lostLines":0})";

TEST(Report, HasEveryCounterAlsoWhenItIs0)
{
    LedgerImage image = imageThatBegan(1600000000);
    const Ledger ledger(image);
    EXPECT_EQ(json(report(ledger, process, false)),
              R"({"running":true,"version":"1.2.3","internalBuild":true,"started":1700000000,)"
              R"("now":{"connections":0,"sessions":0},"rates":{"deliveries":0,"events":0},"began":1600000000,)"
              R"("store":{"events":0,"bytes":0,"oldest":null},"stored":0,"deliveries":0,)"
                  + zeros + R"(,"sinceStart":{"deliveries":0,)" + zeros + "}}");
}

TEST(Report, WithoutAProcessHasTheSameKeysAndNullForWhatOnlyAProcessHas)
{
    const LedgerImage image = imageThatBegan(1600000000);
    EXPECT_EQ(json(report(*accountIn(image), false)),
              R"({"running":false,"version":null,"internalBuild":null,"started":null,"now":null,"rates":null,)"
              R"("began":1600000000,"store":{"events":0,"bytes":0,"oldest":null},"stored":0,"deliveries":0,)"
                  + zeros + R"(,"sinceStart":null})");
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
    EXPECT_EQ(at(report(ledger, process, true), "sinceStart.who").text(), expected);
    EXPECT_EQ(at(report(ledger.account(), true), "who").text(), expected);
}

TEST(Report, SumsUpTheCulpritsBeyondTheTenLargest)
{
    Ledger ledger;
    for (std::uint32_t user = 1; user <= 12; ++user)
        ledger.count(Counter::LostToDiskFull, {.user = user, .process = "player", .application = ""}, 100 + user);
    ledger.count(Counter::LostToReadOnly, 5); // by nobody known
    const Array lost = *at(report(ledger, process, true), "who.lost").array();
    ASSERT_EQ(lost.size(), 11U);
    EXPECT_EQ(lost[0].text(), R"({"user":12,"process":"player","application":"","count":112})");
    EXPECT_EQ(lost[9].text(), R"({"user":3,"process":"player","application":"","count":103})");
    EXPECT_EQ(lost[10].text(), R"({"count":208})");
}

} // namespace
} // namespace ledger
