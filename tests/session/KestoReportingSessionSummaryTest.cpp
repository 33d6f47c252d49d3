// SPDX-License-Identifier: Apache-2.0
// The summary event: every value of every key, in one dictionary, and its way to the analytics service.
#include "session/GeneratedMessages.h"
#include "session/KestoReportingSession.h"
#include "session/NaiveAggregation.h"
#include "support/MessageKinds.h"
#include "support/TestPlatform.h"

#include <algorithm>
#include <gmock/gmock.h>
#include <rapidcheck/gtest.h>
#include <thread>

namespace {

using foundation::Dictionary;
using foundation::Value;
using support::playback;
using testing::SizeIs;

class Summary : public testing::Test {
protected:
    Summary()
    {
        platform.deviceProperties.setInternalBuild(true);
        session->setServiceType(8);
        session->start();
    }

    // Records it as an error, because an error is recorded even if it repeats. The session adds "audiotag".
    void record(const Dictionary& message)
    {
        session->sendMessage(platform.turn.tally, message, playback, AudioEventTypeError, nullptr);
    }

    // The summary's entries as text, except those that every summary has.
    std::string summary()
    {
        const auto event = session->createSummaryEventForSession();
        return event ? Value(event->without("audiotag").without("KESTO_Session_Summary_Event")).text() : "none";
    }

    support::TestPlatform platform;
    std::shared_ptr<KestoReportingSession> session =
        std::make_shared<KestoReportingSession>(42, std::vector<std::int32_t>{7});
};

TEST_F(Summary, JoinsTheValuesOfEachKeyAfterTheServiceType)
{
    record({{"a", 1}, {"b", "x"}});
    record({{"a", 0}});
    EXPECT_EQ(Value(*session->createSummaryEventForSession()).text(),
              R"({"KESTO_Session_Summary_Event":"8","a":"1,0","b":"x","audiotag":"PlaybackError,PlaybackError"})");
}

TEST_F(Summary, IsNothingWithoutMessages)
{
    EXPECT_EQ(session->createSummaryEventForSession(), std::nullopt);
}

TEST_F(Summary, IsNothingWhileNotStarted)
{
    record({{"a", 1}});
    session->stop(platform.turn);
    EXPECT_EQ(session->createSummaryEventForSession(), std::nullopt);
}

TEST_F(Summary, IsMadeOfAMessageWithoutEntriesToo)
{
    record({});
    EXPECT_EQ(summary(), "{}");
}

TEST_F(Summary, KeepsRepeatedValues)
{
    for (const int value : {1, 1, 0})
        record({{"a", value}});
    EXPECT_EQ(summary(), R"({"a":"1,1,0"})");
}

TEST_F(Summary, WritesValuesAsTheirText)
{
    record({{"boolean", true},
            {"integer", -3},
            {"large", std::uint64_t{18446744073709551615U}},
            {"float", 0.6F},
            {"double", 0.6},
            {"whole", 2.0},
            {"text", "a,b"},
            {"empty", ""}});
    record({{"boolean", false},
            {"integer", std::int64_t{1} << 60},
            {"large", 24},
            {"float", 70.25F},
            {"double", 1e100},
            {"whole", 100000.0},
            {"text", "\"c\" d"},
            {"empty", ""}});
    EXPECT_EQ(summary(),
              R"({"boolean":"1,0","integer":"-3,1152921504606846976","large":"18446744073709551615,24",)"
              R"("float":"0.6,70.25","double":"0.6,1e+100","whole":"2,100000",)"
              R"("text":"a,b,\"c\" d","empty":","})");
}

TEST_F(Summary, WritesWhatIsNeitherNumberNorTextByItsDescription)
{
    record({{"array", foundation::Array{1, "a", foundation::Array{}}},
            {"dictionary", Dictionary{{"k", true}}},
            {"null", Value()},
            {"data", foundation::Data{"abc"}},
            {"date", foundation::Date{0}},
            {"nan", std::numeric_limits<double>::quiet_NaN()}});
    EXPECT_EQ(summary(),
              R"--({"array":"[1,\"a\",[]]","dictionary":"{\"k\":true}","null":"(null)","data":"YWJj",)--"
              R"("date":"1970-01-01T00:00:00Z","nan":"nan"})");
}

TEST_F(Summary, GathersKeysInTheOrderInWhichTheyFirstCame)
{
    record({{"b", 1}, {"a", 2}});
    record({{"a", 3}, {"c", 4}, {"b", 5}});
    record({{"c", 6}, {"d", 7}});
    EXPECT_EQ(summary(), R"({"b":"1,5","a":"2,3","c":"4,6","d":"7"})");
}

TEST_F(Summary, AppendsToTheServiceTypeWhatAPayloadHasUnderItsKey)
{
    record({{"KESTO_Session_Summary_Event", "mine"}, {"a", 1}});
    record({{"KESTO_Session_Summary_Event", 2}});
    EXPECT_EQ(*session->createSummaryEventForSession()->find("KESTO_Session_Summary_Event"), Value("8,mine,2"));
}

TEST_F(Summary, GivesTheServiceTypeAsItsNumberWhateverItIs)
{
    record({});
    session->setServiceType(65535);
    EXPECT_EQ(*session->createSummaryEventForSession()->find("KESTO_Session_Summary_Event"), Value("65535"));
}

TEST_F(Summary, TellsKeysApartThatBeginAlike)
{
    record({{"a", 1}, {"ab", 2}, {"", 3}});
    record({{"ab", 4}, {"", 5}, {"a", 6}});
    EXPECT_EQ(summary(), R"({"a":"1,6","ab":"2,4","":"3,5"})");
}

TEST_F(Summary, HoldsWhatOnlyInternalBuildsMayKeep)
{
    record({{"kestoreporting_timestamp", 12.5}});
    EXPECT_EQ(summary(), R"({"kestoreporting_timestamp":"12.5"})");
}

TEST(SummaryOnCustomerBuilds, IsMadeAndRecordedWithoutTimeStamps)
{
    support::TestPlatform platform;
    const auto session = std::make_shared<KestoReportingSession>(42, std::vector<std::int32_t>{});
    session->start();
    session->sendMessage(platform.turn.tally, Dictionary{{"a", 1}, {"kestoreporting_timestamp", 12.5}}, playback, 1,
                         nullptr);
    std::vector<std::string> recorded;
    platform.traceEmitter.setObserver(
        [&](std::uint32_t) { recorded = textsOf(*session->nestedAggregatedPayloadData()); });
    session->stop(platform.turn);
    EXPECT_THAT(recorded,
                testing::ElementsAre(R"({"Playback_Start_1":{"a":1,"audiotag":"PlaybackStart"}})",
                                     R"({"Undefined_Unknown_1":{"KESTO_Session_Summary_Event":"0","a":"1",)"
                                     R"("audiotag":"UndefinedUnknown"}})"));
    EXPECT_TRUE(platform.fileSystem.files.empty());
    platform.traceEmitter.setObserver(nullptr);
}

// --- its cost

// One byte in the store may be six characters of the summary.
TEST(SummaryOfManyValues, IsLostWhenTheBudgetHasNoRoomForIt)
{
    support::TestPlatform platform;
    const auto budget = std::make_shared<session::StorageBudget>(std::size_t{64} << 10);
    const auto session = std::make_shared<KestoReportingSession>(42, std::vector<std::int32_t>{}, budget);
    session->start();
    const foundation::Array manyTruths(std::vector<Value>(10'000, Value(false)));
    for (int message = 0; message < 2; ++message)
        session->sendMessage(platform.turn.tally, Dictionary{{"a", manyTruths}}, playback, AudioEventTypeError,
                             nullptr);
    EXPECT_THAT(*session->nestedAggregatedPayloadData(), SizeIs(2));
    const std::size_t taken = budget->taken();
    EXPECT_EQ(session->createSummaryEventForSession(), std::nullopt);
    EXPECT_EQ(budget->taken(), taken) << "the memory for the texts is paid back";

    platform.log.clear();
    session->stop(platform.turn);
    using support::IsLine;
    using enum platform::LogLevel;
    EXPECT_THAT(platform.log.lines(),
                testing::Contains(IsLine(Error, "kerr", "no memory left for the summary of session 42; it is lost")));
    EXPECT_THAT(platform.log.lines(),
                testing::Contains(IsLine(Error, "kerr", "session 42 lost 2 messages for lack of memory")));
    EXPECT_EQ(budget->taken(), 0U);
}

TEST(SummaryOfManyKeys, PaysForEachOfThem)
{
    support::TestPlatform platform;
    Dictionary::Entries entries;
    for (int key = 0; key < 20'000; ++key)
        entries.push_back({foundation::String(std::to_string(key)), 1});
    const Dictionary message(std::move(entries)); // 160 KB in the store
    const auto summaryWithin = [&](std::size_t limit) {
        const auto session = std::make_shared<KestoReportingSession>(42, std::vector<std::int32_t>{},
                                                                     std::make_shared<session::StorageBudget>(limit));
        session->start();
        session->sendMessage(platform.turn.tally, message, playback, 1, nullptr);
        EXPECT_THAT(*session->nestedAggregatedPayloadData(), SizeIs(1));
        return session->createSummaryEventForSession();
    };
    EXPECT_EQ(summaryWithin(std::size_t{1} << 20), std::nullopt);
    const auto summary = summaryWithin(std::size_t{16} << 20);
    ASSERT_TRUE(summary);
    EXPECT_EQ(summary->size(), 20'002U) << "with the tag and the service type";
}

TEST(SummaryAndRecorder, KeepOutOfEachOthersWay)
{
    support::TestPlatform platform;
    const auto session = std::make_shared<KestoReportingSession>(42, std::vector<std::int32_t>{});
    session->start();
    std::jthread recorder([&] {
        for (int message = 0; message < 10'000; ++message)
            session->createMessageIdentifier(platform.turn.tally, playback, 1, Dictionary{{"a", message}});
    });
    std::size_t commas = 0;
    for (int round = 0; round < 100; ++round)
        if (const auto summary = session->createSummaryEventForSession()) {
            const std::string text = summary->find("a")->text();
            const auto now = static_cast<std::size_t>(std::ranges::count(text, ','));
            EXPECT_GE(now, commas) << "never less than before";
            commas = now;
        }
    recorder.join();
    EXPECT_EQ(session->messageIdentifierCounts(), (Dictionary{{"Playback_Start", 10'000}}));
}

// --- against the definition

RC_GTEST_PROP(SummaryOfAnyStore, IsWhatItsDefinitionMakesOfIt, ())
{
    support::TestPlatform platform;
    platform.deviceProperties.setInternalBuild(true);
    const auto session = std::make_shared<KestoReportingSession>(42, std::vector<std::int32_t>{});
    for (const Messages& payloads : *generated::manyPayloads(20)) {
        const auto serviceType = *rc::gen::arbitrary<AudioServiceType>();
        session->setServiceType(serviceType);
        session->start();
        for (const Dictionary& payload : payloads)
            session->sendMessage(platform.turn.tally, payload, playback, AudioEventTypeError, nullptr);
        const auto summary = session->createSummaryEventForSession();
        const auto expected = naive::createSummaryEvent(*session->nestedAggregatedPayloadData(), serviceType);
        RC_ASSERT(summary.has_value() == expected.has_value());
        if (summary)
            RC_ASSERT(Value(*summary).text() == Value(*expected).text());
        session->stop(platform.turn);
    }
}

// More kinds of messages, with more entries, than the session remembers.
TEST_F(Summary, IsMadeOfManyKindsOfLongMessages)
{
    constexpr int kinds = 20;
    for (int number = 0; number < 5 * kinds; ++number) {
        Dictionary::Entries entries{{"number", number}};
        for (int key = number % 3; key < 100; ++key)
            entries.push_back({foundation::String("key " + std::to_string(key)), key % 7 == 0 ? number / 50 : key});
        session->sendMessage(platform.turn.tally, Dictionary(std::move(entries)),
                             static_cast<AudioEventCategory>(1 + number % kinds / 2),
                             static_cast<AudioEventType>(1 + number % 2), nullptr);
    }
    const Messages messages = *session->nestedAggregatedPayloadData();
    ASSERT_THAT(messages, SizeIs(5 * kinds));
    EXPECT_EQ(Value(*session->createSummaryEventForSession()).text(),
              Value(*naive::createSummaryEvent(messages, 8)).text());
}

// --- a summary that is too large to be encoded

class LargeSummary : public Summary {
protected:
    LargeSummary()
    {
        for (int message = 0; message < 12; ++message)
            record({{"text", std::string(100'000, static_cast<char>('a' + message))}, {"session_duration", message}});
        session->sendMessage(platform.turn.tally, large(), AudioEventCategoryUndefined, AudioEventTypeUnknown, nullptr);
    }

    Dictionary large() { return *session->createSummaryEventForSession(); }
    // "identifier: size of the text", the last so many.
    std::vector<std::string> lastMessages(std::size_t count)
    {
        std::vector<std::string> last;
        const auto messages = *session->nestedAggregatedPayloadData();
        for (const Dictionary& message : messages) {
            const auto& [identifier, payload] = *message.begin();
            last.push_back(std::string(identifier.view()) + ": "
                           + std::to_string(payload.dictionary()->find("text")->stringView().size()));
        }
        last.erase(last.begin(), last.end() - static_cast<std::ptrdiff_t>(count));
        return last;
    }
};

TEST_F(LargeSummary, IsRecordedAsAnyMessageIs)
{
    EXPECT_THAT(lastMessages(2), testing::ElementsAre("Playback_Error_12: 100000", "Undefined_Unknown_1: 1200011"));
}

TEST_F(LargeSummary, LeavesTheIdentifiersThatFollowInOrder)
{
    record({{"text", "after"}});
    session->sendMessage(platform.turn.tally, large(), AudioEventCategoryUndefined, AudioEventTypeUnknown, nullptr);
    record({{"text", "last"}});
    EXPECT_THAT(lastMessages(4),
                testing::ElementsAre("Undefined_Unknown_1: 1200011", "Playback_Error_13: 5",
                                     "Undefined_Unknown_2: 2400029", "Playback_Error_14: 4"));
    EXPECT_EQ(session->messageIdentifierCounts(), (Dictionary{{"Playback_Error", 14}, {"Undefined_Unknown", 2}}));
}

TEST_F(LargeSummary, IsDroppedWhenItIsRepeated)
{
    const Dictionary same = *session->nestedAggregatedPayloadData()->back().begin()->value.dictionary();
    session->sendMessage(platform.turn.tally, same, AudioEventCategoryUndefined, AudioEventTypeUnknown, nullptr);
    EXPECT_EQ(session->messageIdentifierCounts(), (Dictionary{{"Playback_Error", 12}, {"Undefined_Unknown", 1}}));
}

TEST_F(LargeSummary, IsAMessageOfTheNextSummaryToo)
{
    record({{"text", "after"}});
    const Dictionary next = large();
    EXPECT_EQ(Value(next).text(), Value(*naive::createSummaryEvent(*session->nestedAggregatedPayloadData(), 8)).text());
    EXPECT_EQ(next.find("KESTO_Session_Summary_Event")->text(), "8,8");
}

TEST_F(LargeSummary, IsSeenByTheOtherDerivationsToo)
{
    session::MessageStore store(std::make_shared<session::StorageBudget>(std::size_t{1} << 30));
    const std::string text(std::size_t{2} << 20, 'x');
    ASSERT_EQ(store.record(playback, 1,
                           {{"session_output_running", true},
                            {"PomoSessionVolume", 0.5},
                            {"kestoreporting_timestamp", 1},
                            {"spatializationEnabled", true},
                            {"active_devices", text}}),
              session::MessageStore::Outcome::Recorded);
    ASSERT_EQ(store.record(playback, 2, {{"session_output_running", false}, {"kestoreporting_timestamp", 11}}),
              session::MessageStore::Outcome::Recorded);
    const Messages messages = messagesOf(store);
    session::StorageShare share(session::StorageBudget::service());
    const Messages events = KestoReportingSession::createVolumeMessages(store, Value("player"), 0.5, share);
    ASSERT_THAT(events, SizeIs(1));
    EXPECT_EQ(*events[0].find("active_devices"), Value(text));
    EXPECT_EQ(textsOf(events), textsOf(naive::createVolumeMessages(messages, Value("player"), 0.5).events));
    const std::array<std::string_view, 1> keys{"spatializationEnabled"};
    EXPECT_EQ(textsOf(KestoReportingSession::combineRapidMessages(store, keys, 2)),
              textsOf(naive::combineRapidMessages(messages, {"spatializationEnabled"}, 2)));
}

} // namespace
