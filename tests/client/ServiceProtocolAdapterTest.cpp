// SPDX-License-Identifier: Apache-2.0
// The wire, call by call: which operation a frame means, which frames are refused and with which words, and the form of
// answers.
#include "client/ServiceProtocolAdapter.h"

#include "client/ServiceOperations.h"
#include "support/fakes/FakeConnection.h"

#include <gmock/gmock.h>
#include <limits>

namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;
using platform::Connection;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Optional;
using testing::StrictMock;
using ReporterIDs = KestoReportingServiceProtocol::ReporterIDs;

class MockProtocol : public KestoReportingServiceProtocol {
public:
    MOCK_METHOD(void, createReportingSession, (std::int64_t, SuccessReply), (override));
    MOCK_METHOD(void, setServiceType, (AudioServiceType, std::int64_t, SuccessReply), (override));
    MOCK_METHOD(void, getServiceNameForReporterID, (std::int64_t, ServiceTypeReply), (override));
    MOCK_METHOD(void, setConfiguration, (Dictionary, std::int64_t, SuccessReply), (override));
    MOCK_METHOD(void, startReportingSessionForID, (std::int64_t, SuccessReply), (override));
    MOCK_METHOD(void, sendMessage,
                (Dictionary, AudioEventCategory, std::uint16_t, std::optional<ReporterIDs>, utility::Reply),
                (override));
    MOCK_METHOD(void, stopReportingSessionForID, (std::int64_t, SuccessReply), (override));
    MOCK_METHOD(void, destroyReportingSession, (std::int64_t, SuccessReply), (override));
    MOCK_METHOD(void, reporterID, (std::int64_t, DictionaryReply), (override));
    MOCK_METHOD(void, getAllReporters, (ReportersReply), (override));
    MOCK_METHOD(void, killService, (SuccessReply), (override));
};

const Value null{};
constexpr std::int64_t leastID = std::numeric_limits<std::int64_t>::min();
constexpr std::int64_t largestID = std::numeric_limits<std::int64_t>::max();
constexpr std::uint64_t largestCall = std::numeric_limits<std::uint64_t>::max();

class AdapterTest : public testing::Test {
protected:
    // The reason why the call is refused, or nothing.
    std::optional<std::string> refusal(const Array& frame)
    {
        const auto result = adapter.handleCall({frame, connection});
        return result ? std::nullopt : std::optional(result.error().reason);
    }
    void accept(const Array& frame) { EXPECT_EQ(refusal(frame), std::nullopt); }
    // Ends the turn, and returns all its answers.
    const std::vector<Array>& answers()
    {
        if (auto send = turn.letters.take())
            send();
        return connection->received();
    }

    platform::Turn turn;
    // A strict mock: every unexpected call is a failure.
    std::shared_ptr<StrictMock<MockProtocol>> protocol = std::make_shared<StrictMock<MockProtocol>>();
    std::shared_ptr<support::FakeConnection> connection = std::make_shared<support::FakeConnection>(7);
    ledger::Ledger ledger;
    client::ServiceProtocolAdapter adapter{protocol, ledger};
};

// --- the meaning of a call

TEST_F(AdapterTest, CallsEachOperationByItsNumberWithItsArgumentsInOrder)
{
    using testing::_;
    const testing::InSequence inOrder;
    EXPECT_CALL(*protocol, createReportingSession(42, _));
    EXPECT_CALL(*protocol, setServiceType(4, 42, _));
    EXPECT_CALL(*protocol, getServiceNameForReporterID(42, _));
    EXPECT_CALL(*protocol, setConfiguration(Dictionary{{"a", 1}}, 42, _));
    EXPECT_CALL(*protocol, startReportingSessionForID(42, _));
    EXPECT_CALL(*protocol, sendMessage(Dictionary{{"b", "c"}}, 4, 1, Optional(ElementsAre(42, 0, -1)), _));
    EXPECT_CALL(*protocol, stopReportingSessionForID(42, _));
    EXPECT_CALL(*protocol, destroyReportingSession(42, _));
    EXPECT_CALL(*protocol, reporterID(42, _));
    EXPECT_CALL(*protocol, getAllReporters(_));
    EXPECT_CALL(*protocol, killService(_));

    accept({1, 1, 42});
    accept({2, 2, 4, 42});
    accept({3, 3, 42});
    accept({4, 4, Dictionary{{"a", 1}}, 42});
    accept({5, 5, 42});
    accept({6, 6, Dictionary{{"b", "c"}}, 4, 1, Array{42, 0, -1}});
    accept({7, 7, 42});
    accept({8, 8, 42});
    accept({9, 9, 42});
    accept({10, 10});
    accept({11, 11});
    for (const client::ServiceOperation& operation : client::serviceOperations) {
        const auto counter = ledger::counterOf("calls." + std::string(operation.name()));
        ASSERT_TRUE(counter) << operation.name();
        EXPECT_EQ(ledger.account()[*counter], 1U) << operation.name();
    }
}

TEST_F(AdapterTest, TellsNoListFromAnEmptyOne)
{
    using testing::_;
    EXPECT_CALL(*protocol, sendMessage(_, _, _, testing::Eq(std::nullopt), _));
    EXPECT_CALL(*protocol, sendMessage(_, _, _, Optional(IsEmpty()), _));
    accept({1, 6, Dictionary{}, 4, 1, null});
    accept({2, 6, Dictionary{}, 4, 1, Array{}});
}

TEST_F(AdapterTest, TakesIntegersUpToTheEndsOfTheirRanges)
{
    using testing::_;
    EXPECT_CALL(*protocol, createReportingSession(leastID, _));
    EXPECT_CALL(*protocol, createReportingSession(largestID, _)).Times(2);
    EXPECT_CALL(*protocol, setServiceType(0, 0, _));
    EXPECT_CALL(*protocol, setServiceType(65535, 0, _));
    EXPECT_CALL(*protocol, sendMessage(_, 0, 0, Optional(ElementsAre(leastID, largestID)), _));
    EXPECT_CALL(*protocol, sendMessage(_, 0xFFFFFFFF, 0xFFFF, _, _));
    accept({0, 1, leastID});
    accept({largestCall, 1, largestID});
    accept({1U, 1U, static_cast<std::uint64_t>(largestID)});
    accept({1, 2, 0, 0});
    accept({1, 2, 65535, 0});
    accept({1, 6, Dictionary{}, 0, 0, Array{leastID, largestID}});
    accept({1, 6, Dictionary{}, 0xFFFFFFFFU, 0xFFFF, null});
}

// --- refused calls

TEST_F(AdapterTest, RefusesWhatIsNoCall)
{
    constexpr auto noCall = "a call is an array of a number, a method and its arguments";
    EXPECT_EQ(refusal({}), noCall);
    EXPECT_EQ(refusal({1}), noCall);
    EXPECT_EQ(refusal({"x"}), noCall);
}

TEST_F(AdapterTest, RefusesCallNumbersThatAreNone)
{
    for (const Value& number : {null, Value(-1), Value(1.0), Value(1.5F), Value(true), Value("1"), Value(Array{1}),
                                Value(Dictionary{}), Value(foundation::Data{"1"}), Value(foundation::Date{1})})
        EXPECT_EQ(refusal({number, 10}), "a call's number is an unsigned 64-bit integer") << number.text();
}

TEST_F(AdapterTest, RefusesMethodsThatThereAreNot)
{
    EXPECT_EQ(refusal({1, 0}), "unknown method 0; there are 1 to 11");
    EXPECT_EQ(refusal({1, 12, 42}), "unknown method 12; there are 1 to 11");
    EXPECT_EQ(refusal({1, -1}), "unknown method -1; there are 1 to 11");
    EXPECT_EQ(refusal({1, largestID}), "unknown method 9223372036854775807; there are 1 to 11");
}

TEST_F(AdapterTest, RefusesMethodsThatAreNoNumbersWithoutRepeatingThem)
{
    // Text from a client does not get into the log, where it could fill a disk or forge lines.
    for (const Value& method : {null, Value(1.0), Value(true), Value("1\nkestod: all is well"),
                                Value(std::string(1 << 20, 'x')), Value(Array{1}), Value(largestCall)})
        EXPECT_EQ(refusal({1, method, 42}), "a call's method is an integer from 1 to 11");
}

struct CalledOperation {
    int number;
    std::string name;
    std::vector<std::string> argumentNames;
    std::vector<Value> arguments; // valid ones
};

void PrintTo(const CalledOperation& operation, std::ostream* out)
{
    *out << operation.name;
}

const std::vector<CalledOperation> operations{
    {1, "createReportingSession", {"reporter ID"}, {42}},
    {2, "setServiceType", {"service type", "reporter ID"}, {4, 42}},
    {3, "getServiceNameForReporterID", {"reporter ID"}, {42}},
    {4, "setConfiguration", {"configuration", "reporter ID"}, {Dictionary{}, 42}},
    {5, "startReportingSessionForID", {"reporter ID"}, {42}},
    {6, "sendMessage", {"message", "category", "type", "reporter IDs"}, {Dictionary{}, 4, 1, Array{42}}},
    {7, "stopReportingSessionForID", {"reporter ID"}, {42}},
    {8, "destroyReportingSession", {"reporter ID"}, {42}},
    {9, "reporterID", {"reporter ID"}, {42}},
    {10, "getAllReporters", {}, {}},
    {11, "killService", {}, {}}};

// What each argument has to be, and the values that do not fit.
struct Expectation {
    std::string words;
    std::vector<Value> wrong;
};

Expectation integersWithin(std::string words, const std::vector<Value>& outside)
{
    Expectation expectation{std::move(words),
                            {null, Value("42"), Value(42.0), Value(42.0F), Value(true), Value(Array{42}),
                             Value(Dictionary{}), Value(foundation::Data{"42"}), Value(foundation::Date{42}),
                             Value(largestCall)}};
    expectation.wrong.insert(expectation.wrong.end(), outside.begin(), outside.end());
    return expectation;
}

Expectation expectationOf(const std::string& argument)
{
    if (argument == "reporter ID")
        return integersWithin("an integer from -9223372036854775808 to 9223372036854775807",
                              {static_cast<std::uint64_t>(largestID) + 1});
    if (argument == "category")
        return integersWithin("an integer from 0 to 4294967295", {-1, std::int64_t{1} << 32});
    if (argument == "service type" || argument == "type")
        return integersWithin("an integer from 0 to 65535", {-1, 65536});
    if (argument == "reporter IDs")
        return {"an array or null", {Value(42), Value("[42]"), Value(Dictionary{}), Value(true)}};
    return {"a map", {null, Value(42), Value("{}"), Value(Array{}), Value(true), Value(foundation::Data{})}};
}

class OperationTest : public AdapterTest, public testing::WithParamInterface<CalledOperation> {
protected:
    std::optional<std::string> refusalOf(const std::vector<Value>& arguments)
    {
        std::vector<Value> frame{1, GetParam().number};
        frame.insert(frame.end(), arguments.begin(), arguments.end());
        return refusal(frame);
    }
};

TEST_P(OperationTest, RefusesAnotherNumberOfArguments)
{
    const auto& [number, name, argumentNames, arguments] = GetParam();
    for (std::size_t count = 0; count <= arguments.size() + 2; ++count) {
        if (count == arguments.size())
            continue;
        auto given = arguments;
        given.resize(count, 42);
        EXPECT_EQ(refusalOf(given),
                  name + " takes " + std::to_string(arguments.size()) + " arguments, not " + std::to_string(count));
    }
}

TEST_P(OperationTest, RefusesArgumentsThatDoNotFit)
{
    const auto& [number, name, argumentNames, arguments] = GetParam();
    for (std::size_t place = 0; place < arguments.size(); ++place) {
        const auto [words, wrong] = expectationOf(argumentNames[place]);
        for (const Value& value : wrong) {
            auto given = arguments;
            given[place] = value;
            EXPECT_EQ(refusalOf(given), name + ": argument " + argumentNames[place] + " is not " + words)
                << value.text();
        }
    }
}

TEST_P(OperationTest, NamesTheFirstOfSeveralArgumentsThatDoNotFit)
{
    const auto& [number, name, argumentNames, arguments] = GetParam();
    if (arguments.empty())
        return;
    const std::vector<Value> given(arguments.size(), Value("wrong"));
    EXPECT_EQ(refusalOf(given),
              name + ": argument " + argumentNames[0] + " is not " + expectationOf(argumentNames[0]).words);
}

INSTANTIATE_TEST_SUITE_P(Protocol, OperationTest, testing::ValuesIn(operations),
                         [](const auto& tested) { return tested.param.name; });

TEST_F(AdapterTest, RefusesListsOfAnythingButIntegers)
{
    const std::vector<Value> wrong{
        null, Value("42"), Value(42.0), Value(true), Value(Array{42}), Value(largestCall), Value(Dictionary{})};
    for (const Value& element : wrong)
        EXPECT_EQ(refusal({1, 6, Dictionary{}, 4, 1, Array{42, element, 43}}),
                  "sendMessage: argument reporter IDs is not an array of 64-bit integers");
}

// A message costs as much work for each reporter, and each reporter takes only a few bytes of the frame.
TEST_F(AdapterTest, RefusesListsOfMoreReportersThanAMessageMayHave)
{
    constexpr std::size_t most = client::mostReportersOfAMessage;
    const auto listOf = [](std::size_t count) { return Array(std::vector<Value>(count, Value(42))); };
    using testing::_;
    EXPECT_CALL(*protocol, sendMessage(_, _, _, Optional(testing::SizeIs(most)), _));
    accept({1, 6, Dictionary{}, 4, 1, listOf(most)});
    EXPECT_EQ(refusal({1, 6, Dictionary{}, 4, 1, listOf(most + 1)}),
              "sendMessage: argument reporter IDs is not an array of at most 10000 elements");
    EXPECT_EQ(refusal({1, 6, Dictionary{}, 4, 1, Array(std::vector<Value>(300'000, Value("x")))}),
              "sendMessage: argument reporter IDs is not an array of at most 10000 elements");
}

// --- answers

TEST_F(AdapterTest, AnswersWithTheCallsNumberTheErrorAndTheValues)
{
    const testing::InSequence inOrder;
    EXPECT_CALL(*protocol, createReportingSession).WillOnce([&](auto, auto reply) { reply(turn, std::nullopt, true); });
    EXPECT_CALL(*protocol, stopReportingSessionForID).WillOnce([&](auto, auto reply) {
        reply(turn, std::nullopt, false);
    });
    EXPECT_CALL(*protocol, getServiceNameForReporterID).WillOnce([&](auto, auto reply) {
        reply(turn, std::nullopt, 65535);
    });
    EXPECT_CALL(*protocol, reporterID).WillOnce([&](auto, auto reply) {
        reply(turn, std::nullopt, Dictionary{{"reporterID", 0}, {"serviceType", 65535}});
    });
    EXPECT_CALL(*protocol, getAllReporters).WillOnce([&](auto reply) {
        reply(turn, std::nullopt, ReporterIDs{0, 23, 24, 65'536, largestID, -1, -25, leastID});
    });
    EXPECT_CALL(*protocol, sendMessage).WillOnce([&](auto, auto, auto, auto, auto reply) {
        reply(turn, std::nullopt);
    });
    EXPECT_CALL(*protocol, sendMessage).WillOnce([&](auto, auto, auto, auto, auto reply) {
        reply(turn, utility::reportingDisabled);
    });
    accept({1, 1, 42});
    accept({2, 7, 42});
    accept({3, 3, 42});
    accept({4, 9, 42});
    accept({5, 10});
    accept({largestCall, 6, Dictionary{}, 4, 1, null});
    accept({7, 6, Dictionary{}, 4, 1, null});
    EXPECT_THAT(answers(),
                ElementsAre(Array{1, null, true}, Array{2, null, false}, Array{3, null, 65535},
                            Array{4, null, Dictionary{{"reporterID", 0}, {"serviceType", 65535}}},
                            Array{5, null, Array{0, 23, 24, 65'536, largestID, -1, -25, leastID}},
                            Array{largestCall, null}, Array{7, Array{"com.quarn.audio.reporting", 1}}));
}

TEST_F(AdapterTest, AnswersBooleansAsBooleansAndNumbersAsIntegers)
{
    EXPECT_CALL(*protocol, createReportingSession).WillOnce([&](auto, auto reply) { reply(turn, std::nullopt, true); });
    EXPECT_CALL(*protocol, getServiceNameForReporterID).WillOnce([&](auto, auto reply) {
        reply(turn, std::nullopt, 1);
    });
    accept({1, 1, 42});
    accept({2, 3, 42});
    using Kind = foundation::Number::Kind;
    EXPECT_EQ(answers().at(0)[2].number()->kind(), Kind::Boolean);
    EXPECT_EQ(answers().at(1)[2].number()->exactly<std::uint16_t>(), 1);
}

TEST_F(AdapterTest, AnswersACallAsOftenAndAsLateAsItIsTold)
{
    KestoReportingServiceProtocol::SuccessReply held;
    EXPECT_CALL(*protocol, startReportingSessionForID).WillOnce([&](auto, auto reply) { held = std::move(reply); });
    EXPECT_CALL(*protocol, getServiceNameForReporterID).WillOnce([&](auto, auto reply) {
        reply(turn, std::nullopt, 65535);
        reply(turn, std::nullopt, 4);
    });
    accept({1, 5, 42});
    accept({2, 3, 0});
    held(turn, std::nullopt, true);
    held(turn, std::nullopt, true);
    EXPECT_THAT(answers(),
                ElementsAre(Array{2, null, 65535}, Array{2, null, 4}, Array{1, null, true}, Array{1, null, true}));
}

TEST_F(AdapterTest, HoldsACallersConnectionUntilNobodyCanAnswerItAnyMore)
{
    KestoReportingServiceProtocol::SuccessReply held;
    EXPECT_CALL(*protocol, startReportingSessionForID).WillOnce([&](auto, auto reply) { held = std::move(reply); });
    accept({1, 5, 42});
    EXPECT_EQ(connection.use_count(), 2);
    held(turn, std::nullopt, true);
    (void)answers();
    EXPECT_EQ(connection.use_count(), 2);
    held = nullptr;
    EXPECT_EQ(connection.use_count(), 1);
}

TEST_F(AdapterTest, HoldsNoCallerOfACallThatItRefuses)
{
    EXPECT_TRUE(refusal({1, 5, "x"}));
    EXPECT_EQ(connection.use_count(), 1);
}

} // namespace
