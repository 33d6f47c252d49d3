// SPDX-License-Identifier: Apache-2.0
// The times that `send` adds to messages, as they come to the service.
#include "kesto/kesto.hpp"
#include "sdk/FakeService.h"
#include "sdk/ServedClientTest.h"

#include <ctime>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;
using kesto::Category;
using kesto::EventType;
using kesto::Status;

double secondsOf(clockid_t clock)
{
    timespec time{};
    ::clock_gettime(clock, &time);
    return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) / 1e9;
}

class StampedSendTest : public sdk_test::ServedClientTest {
protected:
    void SetUp() override { service_.emplace(path_); }

    // The message as it came.
    Dictionary sent(const kesto::Message& message)
    {
        EXPECT_EQ(client_.send(message, Category::IO, EventType::Start, 42), Status::Ok);
        EXPECT_EQ(client_.flush(sdk_test::patience), Status::Ok);
        return *service_->waitForCalls(1).back()[2].dictionary();
    }
};

TEST_F(StampedSendTest, GivesTheTimeOfTheCall)
{
    ASSERT_EQ(client_.open(options()), Status::Ok);
    kesto::Message message;
    const double before = secondsOf(CLOCK_REALTIME);
    const double uptimeBefore = secondsOf(CLOCK_BOOTTIME);
    const Dictionary came = sent(message.add("a", 1));
    ASSERT_EQ(came.size(), 3U);
    EXPECT_EQ(*came.find("a"), Value(1));
    const auto stamp = came.find("kestoreporting_timestamp")->number();
    EXPECT_EQ(stamp->kind(), foundation::Number::Kind::Float64);
    EXPECT_GE(stamp->doubleValue(), before);
    EXPECT_LE(stamp->doubleValue(), secondsOf(CLOCK_REALTIME));
    const auto uptime = static_cast<double>(came.find("systemuptime_sec")->number()->exactly<std::int64_t>().value());
    EXPECT_GE(uptime, uptimeBefore - 0.5);
    EXPECT_LE(uptime, secondsOf(CLOCK_BOOTTIME) + 0.5);
}

TEST_F(StampedSendTest, LeavesTheTimesThatAMessageHas)
{
    ASSERT_EQ(client_.open(options()), Status::Ok);
    kesto::Message message;
    EXPECT_EQ(sent(message.add("systemuptime_sec", 7).add("kestoreporting_timestamp", 5.5)),
              (Dictionary{{"systemuptime_sec", 7}, {"kestoreporting_timestamp", 5.5}}));
}

TEST_F(StampedSendTest, AddsNothingForAClientThatWantsNoStamps)
{
    kesto::Options unstamped = options();
    unstamped.stamp = false;
    ASSERT_EQ(client_.open(unstamped), Status::Ok);
    kesto::Message message;
    EXPECT_EQ(sent(message.add("a", 1)), (Dictionary{{"a", 1}}));
}

TEST_F(StampedSendTest, GivesTheTimeInTheStateCallbackToo)
{
    kesto::Options sending = options();
    sending.stateChanged = [this](const kesto::StateChange& change) {
        if (change.state != kesto::State::Connected)
            return;
        kesto::Message message;
        client_.send(message.add("a", 1), Category::IO, EventType::Start, 42);
    };
    ASSERT_EQ(client_.open(sending), Status::Ok);
    const std::vector<Array> calls = service_->waitForCalls(1);
    ASSERT_EQ(calls.size(), 1U);
    EXPECT_EQ(calls[0][2].dictionary()->size(), 3U);
    EXPECT_NE(calls[0][2].dictionary()->find("kestoreporting_timestamp"), nullptr);
    client_.close(std::chrono::milliseconds(0)); // its callback uses this test
}

TEST_F(StampedSendTest, AddsNothingToAConfiguration)
{
    ASSERT_EQ(client_.open(options()), Status::Ok);
    kesto::Message configuration;
    EXPECT_EQ(client_.setConfiguration(configuration.add("a", 1), 42), Status::Ok);
    EXPECT_EQ(client_.flush(sdk_test::patience), Status::Ok);
    EXPECT_EQ(*service_->waitForCalls(1)[0][2].dictionary(), (Dictionary{{"a", 1}}));
}

TEST_F(StampedSendTest, DoesNotChangeTheMessage)
{
    ASSERT_EQ(client_.open(options()), Status::Ok);
    kesto::Message message;
    message.add("a", 1);
    const std::size_t size = message.size();
    EXPECT_EQ(sent(message).size(), 3U);
    EXPECT_EQ(message.size(), size);
    EXPECT_EQ(sent(message).size(), 3U);
}

} // namespace
