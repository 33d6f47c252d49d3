// SPDX-License-Identifier: Apache-2.0
// The message store against its definition: a list of identifiers and payloads, searched from the end for the last
// message of a kind. And what hostile messages cost.
#include "session/MessageStore.h"
#include "foundation/cbor/Cbor.h"
#include "session/AllocatedBytes.h"
#include "support/TestPlatform.h"

#include <gmock/gmock.h>
#include <map>
#include <rapidcheck/gtest.h>
#include <string>
#include <utility>
#include <vector>

namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;
using Outcome = session::MessageStore::Outcome;
using testing::ElementsAre;
using testing::Pair;

using Entry = std::pair<std::string, Dictionary>;

std::shared_ptr<session::StorageBudget> plenty()
{
    return std::make_shared<session::StorageBudget>(std::size_t{1} << 30);
}

std::vector<Entry> entries(const session::MessageStore& store)
{
    std::vector<Entry> entries;
    store.forEach([&](const session::MessageStore::Message& message) {
        entries.emplace_back(store.identifier(message), message.payload.dictionary());
    });
    return entries;
}

// The definition, word by word, however slow.
class NaiveStore {
public:
    Outcome record(AudioEventCategory category, AudioEventType type, const Dictionary& payload)
    {
        const std::string kind =
            KestoReportingUtilityCategoryString(category) + '_' + std::string(KestoReportingUtilityTypeString(type));
        const auto count = counts.find(kind);
        if (count == counts.end()) {
            counts[kind] = 1;
            store.emplace_back(kind + "_1", payload);
            return Outcome::Recorded;
        }
        const std::string previous = kind + '_' + std::to_string(count->second);
        std::optional<Dictionary> previousPayload;
        for (auto entry = store.rbegin(); entry != store.rend() && !previousPayload; ++entry)
            if (entry->first == previous)
                previousPayload = entry->second;
        const bool isEqual = previousPayload && withoutTimes(*previousPayload) == withoutTimes(payload);
        if (isEqual && category != 11 && type != 6)
            return Outcome::Redundant;
        store.emplace_back(kind + '_' + std::to_string(++count->second), payload);
        return Outcome::Recorded;
    }

    std::vector<Entry> store;
    std::map<std::string, int> counts;

private:
    static Dictionary withoutTimes(const Dictionary& payload)
    {
        return payload.without("processuptime_ms").without("systemuptime_sec").without("kestoreporting_timestamp");
    }
};

// Values that often repeat, of every kind that a client can send.
rc::Gen<Value> someValue()
{
    return rc::gen::element<Value>(Value(0), Value(1), Value(1.0), Value(true), Value(-1), Value(0.5F), Value(0.5),
                                   Value(), Value(""), Value("a"), Value(Array{1, "a"}), Value(Array{}),
                                   Value(Dictionary{{"systemuptime_sec", 1}}), Value(Dictionary{{"a", 1}, {"b", 2}}),
                                   Value(Dictionary{{"b", 2}, {"a", 1}}), Value(std::uint64_t{1} << 63),
                                   Value(std::string(1500, 'x')), // too large to be kept decoded
                                   Value(foundation::Data{"a"}), Value(foundation::Date{1}));
}

rc::Gen<Dictionary> somePayload()
{
    const auto key = rc::gen::element<std::string>("a", "b", "c", "processuptime_ms", "systemuptime_sec",
                                                   "kestoreporting_timestamp", "kestoreporting_timestam");
    return rc::gen::map(rc::gen::container<std::vector<std::pair<std::string, Value>>>(rc::gen::pair(key, someValue())),
                        [](const auto& pairs) {
                            Dictionary::Entries entries;
                            for (const auto& [entryKey, value] : pairs)
                                entries.push_back({foundation::String(entryKey), value});
                            return Dictionary(entries);
                        });
}

RC_GTEST_PROP(MessageStore, RecordsWhatItsDefinitionRecords, ())
{
    // Numbers with the same names (0 and 19, 0 and 16) are one kind; 11 and 6 are errors; DSP_Error is not.
    const auto category = rc::gen::element<AudioEventCategory>(0, 4, 11, 14, 16, 0x1000000B, 0x00030004, 0x00050004);
    const auto type = rc::gen::element<AudioEventType>(0, 1, 6, 11, 19, 65535);
    const auto payloads = *rc::gen::resize(4, rc::gen::container<std::vector<Dictionary>>(3, somePayload()));

    session::MessageStore store(plenty());
    NaiveStore naive;
    const auto length = *rc::gen::inRange(0, 60);
    for (int message = 0; message < length; ++message) {
        const auto someCategory = *category;
        const auto someType = *type;
        const auto payload = *rc::gen::elementOf(payloads);
        RC_ASSERT(store.record(someCategory, someType, payload) == naive.record(someCategory, someType, payload));
    }

    RC_ASSERT(entries(store) == naive.store);
    RC_ASSERT(store.size() == naive.store.size());
    RC_ASSERT(store.empty() == naive.store.empty());
    const Dictionary counts = store.counts();
    RC_ASSERT(counts.size() == naive.counts.size());
    for (const auto& [kind, count] : naive.counts)
        RC_ASSERT(counts.find(kind) != nullptr && *counts.find(kind) == Value(count));
}

RC_GTEST_PROP(MessageStore, GivesPayloadsBackAsTheyCame, ())
{
    const auto payload = *somePayload();
    session::MessageStore store(plenty());
    store.record(4, 1, payload);
    const auto kept = entries(store);
    RC_ASSERT(kept.size() == 1U);
    RC_ASSERT(kept[0].second == payload);
    RC_ASSERT(Value(kept[0].second).text() == Value(payload).text()); // kinds of numbers and order of keys too
}

TEST(MessageStore, BeginsEmpty)
{
    const session::MessageStore store(plenty());
    EXPECT_TRUE(store.empty());
    EXPECT_EQ(store.size(), 0U);
    EXPECT_EQ(store.counts(), Dictionary());
}

TEST(MessageStore, LetsACopyOfACursorGoOnByItself)
{
    session::MessageStore store(plenty());
    for (int message = 0; message < 3000; ++message) // more than one chunk
        store.record(4, 1, {{"a", message}});
    const auto value = [](const session::MessageStore::Cursor& cursor) {
        return cursor.payload().dictionary().find("a")->number()->exactly<int>();
    };
    session::MessageStore::Cursor cursor(store);
    for (int message = 0; message < 2000; ++message)
        ASSERT_TRUE(cursor.next());
    auto copy = cursor;
    EXPECT_EQ(value(cursor), 1999);
    for (int message = 2000; message < 3000; ++message) {
        ASSERT_TRUE(copy.next());
        ASSERT_EQ(value(copy), message);
    }
    EXPECT_FALSE(copy.next());
    EXPECT_EQ(value(cursor), 1999);
    EXPECT_TRUE(cursor.next());
    EXPECT_EQ(value(cursor), 2000);
}

TEST(MessageStore, TellsNumbersApartThatDoublesCannot)
{
    session::MessageStore store(plenty());
    const std::int64_t large = (std::int64_t{1} << 53) + 1;
    EXPECT_EQ(store.record(4, 1, {{"a", large}}), Outcome::Recorded);
    EXPECT_EQ(store.record(4, 1, {{"a", static_cast<double>(large - 1)}}), Outcome::Recorded);
    EXPECT_EQ(store.record(4, 1, {{"a", large - 1}}), Outcome::Redundant);
}

TEST(MessageStore, RecordsWhatIsNoNumberEachTimeSinceItEqualsNothing)
{
    session::MessageStore store(plenty());
    const auto notANumber = [] { return Dictionary{{"a", std::numeric_limits<double>::quiet_NaN()}}; };
    EXPECT_EQ(store.record(4, 1, notANumber()), Outcome::Recorded);
    EXPECT_EQ(store.record(4, 1, notANumber()), Outcome::Recorded);
}

// NaN equals nothing, not even itself: at any place, in a message of any size, and even in the same object, as when one
// message goes to one session twice.
TEST(MessageStore, NeverTakesAPayloadThatHoldsWhatIsNoNumberForARepetition)
{
    const Value notANumber = std::numeric_limits<double>::quiet_NaN();
    const std::string large(1500, 'x'); // too large to be kept decoded
    for (const Dictionary& payload :
         {Dictionary{{"a", notANumber}}, Dictionary{{"a", Value(std::numeric_limits<float>::quiet_NaN())}},
          Dictionary{{"a", Dictionary{{"b", notANumber}}}}, Dictionary{{"a", Array{1, notANumber}}},
          Dictionary{{"a", Array{Dictionary{{"b", notANumber}}}}}, Dictionary{{"a", notANumber}, {"b", large}},
          Dictionary{{"a", Dictionary{{"b", notANumber}}}, {"b", large}}}) {
        session::MessageStore store(plenty());
        EXPECT_EQ(store.record(4, 1, payload), Outcome::Recorded);
        EXPECT_EQ(store.record(4, 1, payload), Outcome::Recorded) << Value(payload).text();
        EXPECT_EQ(store.record(4, 1, payload), Outcome::Recorded) << Value(payload).text();
    }
}

TEST(MessageStore, LeavesATimeStampThatIsNoNumberOutOfTheComparison)
{
    session::MessageStore store(plenty());
    const Dictionary payload{{"a", 1}, {"systemuptime_sec", std::numeric_limits<double>::quiet_NaN()}};
    EXPECT_EQ(store.record(4, 1, payload), Outcome::Recorded);
    EXPECT_EQ(store.record(4, 1, payload), Outcome::Redundant);
}

TEST(MessageStore, RecognisesARepetitionOfAPayloadTooLargeToBeKeptDecoded)
{
    std::string huge(std::size_t{1} << 20, 'x');
    session::MessageStore store(plenty());
    EXPECT_EQ(store.record(4, 1, {{"a", huge}, {"systemuptime_sec", 1}}), Outcome::Recorded);
    EXPECT_EQ(store.record(4, 1, {{"systemuptime_sec", 2}, {"a", huge}}), Outcome::Redundant);
    huge.back() = 'y';
    EXPECT_EQ(store.record(4, 1, {{"a", huge}}), Outcome::Recorded);
    EXPECT_EQ(store.record(4, 1, {{"a", "small"}}), Outcome::Recorded);
    EXPECT_EQ(store.record(4, 1, {{"a", huge}}), Outcome::Recorded);
    EXPECT_EQ(store.size(), 4U);
    EXPECT_EQ(*entries(store)[3].second.find("a"), Value(huge));
}

TEST(MessageStore, RecognisesARepetitionOfOneWithTensOfThousandsOfKeys)
{
    const auto payload = [](std::uint64_t lastValue) {
        Dictionary::Entries many;
        for (int key = 0; key < 50'000; ++key)
            many.push_back({foundation::String(std::to_string(key)), key});
        many.back().value = lastValue;
        return Dictionary(many);
    };
    session::MessageStore store(plenty());
    EXPECT_EQ(store.record(4, 1, payload(1)), Outcome::Recorded);
    EXPECT_EQ(store.record(4, 1, payload(1)), Outcome::Redundant);
    EXPECT_EQ(store.record(4, 1, payload(2)), Outcome::Recorded);
}

TEST(MessageStore, KeepsEveryKindThatAClientCanNameApart)
{
    session::MessageStore store(plenty());
    std::map<std::string, int> expected;
    for (const AudioEventCategory group : {0x0U, 0x04000000U, 0x10000000U, 0x00010000U, 0x70000000U})
        for (AudioEventCategory base = 0; base < 64; ++base)
            for (AudioEventType type = 0; type < 32; ++type) {
                EXPECT_NE(store.record(group | base, type, {{"audiotag", std::to_string(store.size())}}),
                          Outcome::Full);
                ++expected[KestoReportingUtilityCategoryString(group | base) + '_'
                           + std::string(KestoReportingUtilityTypeString(type))];
            }
    const Dictionary counts = store.counts();
    EXPECT_EQ(counts.size(), expected.size());
    for (const auto& [kind, count] : expected)
        EXPECT_EQ(*counts.find(kind), Value(count)) << kind;
}

TEST(MessageStore, KeepsTheIndexOfAKindOverHundredsOfThousandsOfMessages)
{
    session::MessageStore store(plenty());
    for (int message = 0; message < 200'000; ++message)
        ASSERT_EQ(store.record(4, 1, {{"a", message}}), Outcome::Recorded);
    EXPECT_EQ(store.counts(), (Dictionary{{"Playback_Start", 200'000}}));
    std::string last;
    store.forEach([&](const auto& message) { last = store.identifier(message); });
    EXPECT_EQ(last, "Playback_Start_200000");
}

TEST(MessageStore, TakesLittleMoreThanTheEncodedMessages)
{
    const auto budget = plenty();
    session::MessageStore store(budget);
    std::size_t encoded = 0;
    for (int message = 0; message < 20'000; ++message) {
        const Dictionary payload{{"a", message}, {"text", std::string(200, 'x')}};
        encoded += foundation::cborSize(payload);
        store.record(4, 1, payload);
    }
    EXPECT_GE(budget->taken(), encoded);
    EXPECT_LE(static_cast<double>(budget->taken()), 1.5 * static_cast<double>(encoded));
}

TEST(MessageStore, LosesMessagesWhenItsBudgetIsUsedUpAndRecordsAgainWhenThereIsRoom)
{
    const auto budget = std::make_shared<session::StorageBudget>(4096);
    ASSERT_TRUE(budget->take(4096));
    session::MessageStore store(budget);
    EXPECT_EQ(store.record(4, 1, {{"a", 1}}), Outcome::Full);
    EXPECT_TRUE(store.empty());
    EXPECT_EQ(store.counts(), Dictionary()) << "a kind without recorded messages has no count";

    budget->giveBack(4096);
    EXPECT_EQ(store.record(4, 1, {{"a", 1}}), Outcome::Recorded);
    EXPECT_THAT(entries(store), ElementsAre(Pair("Playback_Start_1", Dictionary{{"a", 1}})));
}

TEST(MessageStore, GoesOnComparingWithWhatItRecordedLastWhenItIsFull)
{
    const auto budget = std::make_shared<session::StorageBudget>(1024);
    session::MessageStore store(budget);
    EXPECT_EQ(store.record(4, 1, {{"a", 1}}), Outcome::Recorded);
    EXPECT_EQ(store.record(4, 1, {{"a", std::string(1000, 'x')}}), Outcome::Full);
    EXPECT_EQ(store.record(4, 1, {{"a", 1}}), Outcome::Redundant);
    EXPECT_EQ(store.record(4, 1, {{"a", 2}}), Outcome::Recorded) << "a small one still fits";
    EXPECT_EQ(store.counts(), (Dictionary{{"Playback_Start", 2}}));
}

TEST(MessageStore, EncodesLargePayloadsToo)
{
    session::MessageStore store(plenty());
    const Dictionary huge{{"a", std::string(std::size_t{8} << 20, 'x')}};
    EXPECT_EQ(store.record(4, 1, huge), Outcome::Recorded);
    EXPECT_EQ(store.record(4, 1, huge), Outcome::Redundant);
    EXPECT_THAT(entries(store), ElementsAre(Pair("Playback_Start_1", huge)));
    store.forEach(
        [&](const auto& message) { EXPECT_EQ(message.payload.encoded().size(), foundation::cborSize(huge)); });
}

TEST(MessageStore, KeepsLargePayloadsAsTheyComeOnRequest)
{
    const auto budget = plenty();
    session::MessageStore store(budget);
    store.keepLargePayloadsAsTheyCome();
    const Dictionary huge{{"a", std::string((1 << 20) + 1, 'x')}};
    EXPECT_EQ(store.record(4, 1, {{"a", 1}}), Outcome::Recorded);
    EXPECT_EQ(store.record(4, 1, huge), Outcome::Recorded);
    EXPECT_EQ(store.record(4, 1, huge), Outcome::Redundant);
    EXPECT_EQ(store.record(4, 1, {{"a", 2}}), Outcome::Recorded);
    EXPECT_THAT(entries(store),
                ElementsAre(Pair("Playback_Start_1", Dictionary{{"a", 1}}), Pair("Playback_Start_2", huge),
                            Pair("Playback_Start_3", Dictionary{{"a", 2}})));
    EXPECT_TRUE(entries(store)[1].second.isSameObject(huge)) << "not in memory twice";
    EXPECT_GT(budget->taken(), std::size_t{1} << 20);
}

TEST(MessageStore, PaysNothingForALargePayloadThatItCannotKeep)
{
    constexpr std::size_t size = (1 << 20) + 1;
    const auto budget = std::make_shared<session::StorageBudget>(size + 500);
    {
        session::MessageStore store(budget);
        store.keepLargePayloadsAsTheyCome();
        EXPECT_EQ(store.record(4, 1, {{"a", std::string(size - 1, 'x')}}), Outcome::Full);
        EXPECT_LT(budget->taken(), 500U) << "only its kind is paid for";
    }
    EXPECT_EQ(budget->taken(), 0U);
}

TEST(MessageStore, TakesNoMemoryForAMessageThatItsBudgetHasNoRoomFor)
{
    const auto budget = std::make_shared<session::StorageBudget>(4096);
    session::MessageStore store(budget);
    const Dictionary message{{"a", std::string(1'000'000, 'x')}};
    const auto before = allocatedBytes();
    forgetMostAllocatedBytes();
    EXPECT_EQ(store.record(4, 1, message), Outcome::Full);
    EXPECT_LT(mostAllocatedBytes() - before, 4096) << "not even for a moment";
}

TEST(MessageStore, PaysForAllThatItTakes)
{
    const auto budget = plenty();
    session::MessageStore store(budget);
    const Dictionary message{{"a", std::string(1'000'000, 'x')}};
    const auto before = allocatedBytes();
    EXPECT_EQ(store.record(4, 1, message), Outcome::Recorded);
    EXPECT_LE(allocatedBytes() - before, static_cast<std::ptrdiff_t>(budget->taken()) + 4096);
}

TEST(MessageStore, TakesNoMoreForSmallNumbersThanTheirEncoding)
{
    const auto budget = plenty();
    session::MessageStore store(budget);
    const Dictionary message{{"a", Array(std::vector<Value>(1'000'000, Value(1)))}};
    const auto before = allocatedBytes();
    forgetMostAllocatedBytes();
    EXPECT_EQ(store.record(4, 1, message), Outcome::Recorded);
    EXPECT_LT(mostAllocatedBytes() - before, 1'010'000);
}

// A client can use many categories and types that are different kinds. If kinds cost nothing, it could have all of them
// in each of its sessions without paying.
TEST(MessageStore, PaysForEveryKindOfMessage)
{
    const auto budget = plenty();
    session::MessageStore store(budget);
    std::size_t kinds = 0;
    for (AudioEventCategory base = 0; base < 16; ++base)
        for (AudioEventType type = 0; type < 19; ++type, ++kinds)
            EXPECT_EQ(store.record(base, type, {}), Outcome::Recorded);
    EXPECT_EQ(store.counts().size(), kinds);
    constexpr std::size_t leastBytesOfAKind = 150;
    EXPECT_GT(budget->taken(), kinds * leastBytesOfAKind);
}

TEST(MessageStore, LosesAMessageOfANewKindWhenItsBudgetHasNoRoomForTheKind)
{
    const auto budget = std::make_shared<session::StorageBudget>(1024);
    session::MessageStore store(budget);
    EXPECT_EQ(store.record(4, 1, {{"a", 1}}), Outcome::Recorded);
    EXPECT_EQ(store.record(4, 2, {{"a", 1}}), Outcome::Full) << "even though its bytes would fit";
    EXPECT_EQ(store.record(4, 1, {{"a", 2}}), Outcome::Recorded);
    EXPECT_EQ(store.counts(), (Dictionary{{"Playback_Start", 2}}));
}

TEST(MessageStore, PaysForThePayloadThatItKeepsDecoded)
{
    const auto taken = [](const Dictionary& payload) {
        const auto budget = plenty();
        session::MessageStore store(budget);
        store.record(4, 1, payload);
        return budget->taken();
    };
    const Array small(std::vector<Value>(400, Value(Array{0}))); // takes many times its kilobyte in memory
    EXPECT_GT(taken({{"a", small}}), taken({{"a", std::string(900, 'x')}}) + Value(small).roughBytes() / 2);
}

TEST(MessageStore, ComparesWithAPayloadThatItCouldNotPayToKeepDecoded)
{
    const auto budget = std::make_shared<session::StorageBudget>(2048);
    session::MessageStore store(budget);
    const Array small(std::vector<Value>(400, Value(Array{0})));
    EXPECT_EQ(store.record(4, 1, {{"a", small}, {"systemuptime_sec", 1}}), Outcome::Recorded);
    EXPECT_EQ(store.record(4, 1, {{"a", small}, {"systemuptime_sec", 2}}), Outcome::Redundant);
    EXPECT_LE(budget->taken(), 2048U);
}

TEST(MessageStore, GivesItsBudgetBackWhenItGoes)
{
    const auto budget = plenty();
    {
        session::MessageStore store(budget);
        store.record(4, 1, {{"a", std::string(100'000, 'x')}});
        EXPECT_GT(budget->taken(), 100'000U);
    }
    EXPECT_EQ(budget->taken(), 0U);
}

} // namespace
