// SPDX-License-Identifier: Apache-2.0
// Which answer belongs to which call: calls that are answered once, twice, late or never, and answers that no honest
// service would send.
#include "calls/CallTable.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <string>
#include <vector>

namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;
using libkesto::CallHead;
using testing::ElementsAre;
using testing::IsEmpty;

// A table that records its answers as words.
class CallTableTest : public testing::Test {
protected:
    struct Entry {
        CallTableTest& test;
        std::string name;
    };

    void add(std::uint64_t number, kesto_operation operation, kesto_reporter reporter, const std::string& name)
    {
        CallHead head{.operation = operation};
        head.reporter = reporter;
        head.callback = {&CallTableTest::answered, new Entry{*this, name}, &CallTableTest::released};
        table_.add(number, head);
    }

    bool answer(std::uint64_t number, std::vector<Value> values, Value error = {})
    {
        std::vector<Value> items{Value(number), std::move(error)};
        items.insert(items.end(), values.begin(), values.end());
        std::string frame;
        foundation::appendCbor(Value(Array(std::move(items))), frame);
        const auto read = libkesto::readAnswer(frame, decoder_);
        return read && table_.answer(*read);
    }

    static void answered(void* user, const kesto_answer* answer)
    {
        const auto& [test, name] = *static_cast<Entry*>(user);
        test.events_.push_back(answer->error_domain == nullptr
                                   ? name
                                   : name + " " + answer->error_domain + " " + std::to_string(answer->error_code));
    }
    static void released(void* user)
    {
        const std::unique_ptr<Entry> entry(static_cast<Entry*>(user));
        entry->test.events_.push_back("~" + entry->name);
    }

    std::vector<std::string> events_;
    libkesto::Counters counters_;
    libkesto::CallTable table_{counters_};
    foundation::CborDecoder decoder_;
};

const std::string sessionEnded = std::string(KESTO_ERROR_DOMAIN) + " " + std::to_string(KESTO_SESSION_ENDED);
const std::string connectionLost = std::string(KESTO_ERROR_DOMAIN) + " " + std::to_string(KESTO_CONNECTION_LOST);

TEST_F(CallTableTest, AnswersACallOnceAndReleasesIt)
{
    add(1, KESTO_OPERATION_CREATE_SESSION, 42, "create");
    EXPECT_EQ(table_.unanswered(), 1U);
    EXPECT_TRUE(answer(1, {true}));
    EXPECT_THAT(events_, ElementsAre("create", "~create"));
    EXPECT_EQ(table_.unanswered(), 0U);

    EXPECT_TRUE(answer(1, {true}));
    EXPECT_THAT(events_, ElementsAre("create", "~create")) << "a second answer belongs to no call";
    EXPECT_EQ(counters_.unexpectedAnswers.get(), 1U);
}

TEST_F(CallTableTest, MatchesAnswersByNumberWhateverTheirOrder)
{
    add(1, KESTO_OPERATION_SEND, 0, "first");
    add(2, KESTO_OPERATION_SEND, 0, "second");
    EXPECT_TRUE(answer(2, {}));
    EXPECT_FALSE(table_.isAnsweredUpTo(1));
    EXPECT_TRUE(answer(1, {}));
    EXPECT_THAT(events_, ElementsAre("second", "~second", "first", "~first"));
    EXPECT_TRUE(table_.isAnsweredUpTo(2));
}

TEST_F(CallTableTest, CallsBackTwiceForTheServiceTypeOfReporterZero)
{
    add(1, KESTO_OPERATION_GET_SERVICE_TYPE, 0, "type");
    EXPECT_TRUE(answer(1, {65535}));
    EXPECT_THAT(events_, ElementsAre("type"));
    EXPECT_TRUE(answer(1, {65535}));
    EXPECT_THAT(events_, ElementsAre("type", "type", "~type"));
}

TEST_F(CallTableTest, AnswersAStartWhenItsStopIsAnsweredAndThenReleasesIt)
{
    add(1, KESTO_OPERATION_START_SESSION, 42, "start");
    EXPECT_TRUE(table_.isAnsweredUpTo(1)) << "flushes do not wait for starts";
    add(2, KESTO_OPERATION_STOP_SESSION, 42, "stop");
    EXPECT_TRUE(answer(1, {true}));
    EXPECT_THAT(events_, ElementsAre("start"));
    EXPECT_TRUE(answer(2, {true}));
    EXPECT_THAT(events_, ElementsAre("start", "~start", "stop", "~stop"));
}

TEST_F(CallTableTest, CallsBackTwiceForAStartThatIsAnsweredTwice)
{
    add(1, KESTO_OPERATION_START_SESSION, 42, "start");
    EXPECT_TRUE(answer(1, {true}));
    EXPECT_TRUE(answer(1, {true}));
    EXPECT_THAT(events_, ElementsAre("start", "start"));
}

TEST_F(CallTableTest, TellsAStartThatItsSessionWasDestroyedOrReplaced)
{
    add(1, KESTO_OPERATION_START_SESSION, 42, "start");
    add(2, KESTO_OPERATION_START_SESSION, 43, "other");
    add(3, KESTO_OPERATION_DESTROY_SESSION, 42, "destroy");
    EXPECT_TRUE(answer(3, {true}));
    EXPECT_THAT(events_, ElementsAre("start " + sessionEnded, "~start", "destroy", "~destroy"));

    add(4, KESTO_OPERATION_CREATE_SESSION, 43, "create");
    EXPECT_TRUE(answer(4, {true}));
    EXPECT_EQ(events_[4], "other " + sessionEnded);
}

TEST_F(CallTableTest, LeavesAStartAloneThatCameAfterTheCallThatIsAnswered)
{
    add(1, KESTO_OPERATION_STOP_SESSION, 42, "stop");
    add(2, KESTO_OPERATION_START_SESSION, 42, "start");
    EXPECT_TRUE(answer(1, {true}));
    EXPECT_THAT(events_, ElementsAre("stop", "~stop"));
}

TEST_F(CallTableTest, ReleasesASecondStartAtItsOnlyAnswer)
{
    add(1, KESTO_OPERATION_START_SESSION, 42, "first");
    add(2, KESTO_OPERATION_START_SESSION, 42, "second");
    EXPECT_TRUE(answer(2, {true}));
    EXPECT_THAT(events_, ElementsAre("second", "~second"));
}

TEST_F(CallTableTest, DoesNotKeepAnsweredStartsWithoutBound)
{
    constexpr std::uint64_t count = libkesto::CallTable::mostAnsweredStarts + 100;
    for (std::uint64_t number = 1; number <= count; ++number) {
        add(number, KESTO_OPERATION_START_SESSION, static_cast<kesto_reporter>(number), "start");
        ASSERT_TRUE(answer(number, {true}));
    }
    EXPECT_EQ(events_.size(), count + 100) << "each was answered, and those beyond the limit are released";
}

TEST_F(CallTableTest, LosesWhatIsUnansweredExactlyOnce)
{
    add(1, KESTO_OPERATION_START_SESSION, 42, "answered");
    EXPECT_TRUE(answer(1, {true}));
    events_.clear();
    add(2, KESTO_OPERATION_START_SESSION, 43, "start");
    add(3, KESTO_OPERATION_SEND, 0, "send");
    table_.endAll(KESTO_CONNECTION_LOST);
    EXPECT_THAT(events_,
                testing::UnorderedElementsAre("send " + connectionLost, "~send", "start " + connectionLost, "~start",
                                              "~answered"));
    EXPECT_EQ(counters_.lost.get(), 1U) << "messages are counted";
    events_.clear();
    table_.endAll(KESTO_CONNECTION_LOST);
    EXPECT_THAT(events_, IsEmpty());
}

TEST_F(CallTableTest, HandsOnTheServicesError)
{
    add(1, KESTO_OPERATION_SEND, 0, "send");
    EXPECT_TRUE(answer(1, {}, Array{"com.quarn.audio.reporting", 1}));
    EXPECT_EQ(events_.front(), "send com.quarn.audio.reporting 1");
    EXPECT_EQ(counters_.refused.get(), 1U);
    EXPECT_EQ(counters_.answered.get(), 1U);
}

TEST_F(CallTableTest, RefusesAnswersThatNoServiceGives)
{
    add(1, KESTO_OPERATION_CREATE_SESSION, 42, "create");
    add(2, KESTO_OPERATION_GET_SERVICE_TYPE, 42, "type");
    add(3, KESTO_OPERATION_SEND, 0, "send");
    add(4, KESTO_OPERATION_VALIDATE, 42, "validate");
    add(5, KESTO_OPERATION_GET_ALL_REPORTERS, 0, "reporters");
    EXPECT_FALSE(answer(1, {}));
    EXPECT_FALSE(answer(1, {true, true}));
    EXPECT_FALSE(answer(1, {1}));
    EXPECT_FALSE(answer(2, {65536}));
    EXPECT_FALSE(answer(2, {-1}));
    EXPECT_FALSE(answer(2, {"7"}));
    EXPECT_FALSE(answer(3, {true}));
    EXPECT_FALSE(answer(4, {true}));
    EXPECT_FALSE(answer(4, {Value(Dictionary{{"reporterID", 42}})}));
    EXPECT_FALSE(answer(4, {Value(Dictionary{{"reporterID", "42"}, {"serviceType", 7}})}));
    EXPECT_FALSE(answer(5, {Value(Array{1, "2"})}));
    EXPECT_FALSE(answer(1, {true}, Array{"domain"}));
    EXPECT_FALSE(answer(1, {true}, Array{1, 1}));
    EXPECT_FALSE(answer(1, {true}, "domain"));
    EXPECT_THAT(events_, IsEmpty());
}

} // namespace
