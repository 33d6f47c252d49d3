// SPDX-License-Identifier: Apache-2.0
// The service manager's line is renewed after changes, not too often, and never without one.
#include "service/StatusNotifier.h"

#include "support/EnvironmentVariable.h"
#include "support/TestPlatform.h"

#include <gmock/gmock.h>

namespace service {
namespace {

using namespace std::chrono_literals;
using ledger::Counter;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;
using testing::StartsWith;

class StatusNotifierTest : public testing::Test {
protected:
    StatusNotifierTest()
    {
        StatusNotifier::start(ledger, platform.clock, platform.workQueues, {.version = "1.2.3"},
                              [this](const std::string& line) { lines.push_back(line); });
    }

    support::TestPlatform platform;
    ledger::Ledger ledger;
    std::vector<std::string> lines;
};

TEST_F(StatusNotifierTest, DoesNothingUntilSomethingIsCounted)
{
    platform.workQueues.advance(1h);
    EXPECT_THAT(platform.workQueues.delayed(), IsEmpty());
    EXPECT_THAT(lines, IsEmpty());
}

TEST_F(StatusNotifierTest, NotifiesFiveSecondsAfterAChangeOfAllThatCameMeanwhile)
{
    ledger.count(Counter::ConnectionsAccepted);
    platform.workQueues.advance(3s);
    ledger.count(Counter::SessionsCreated, 2);
    platform.workQueues.advance(1999ms);
    EXPECT_THAT(lines, IsEmpty());
    platform.workQueues.advance(1ms);
    EXPECT_THAT(lines, ElementsAre(StartsWith("1 connection, 2 sessions; 0 messages and 0 events in the minute to ")));
}

TEST_F(StatusNotifierTest, NotifiesAtMostEveryFiveSecondsAndNotAgainWithoutAChange)
{
    for (int second = 0; second < 60; ++second) {
        ledger.count(Counter::ConnectionsAccepted);
        platform.workQueues.advance(1s);
    }
    EXPECT_THAT(lines, SizeIs(testing::AllOf(testing::Ge(9U), testing::Le(12U))));
    platform.workQueues.advance(10s);
    EXPECT_THAT(platform.workQueues.delayed(), IsEmpty());
    const std::size_t before = lines.size();
    platform.workQueues.advance(1h);
    EXPECT_EQ(lines.size(), before);
    EXPECT_THAT(lines.back(), StartsWith("60 connections, 0 sessions;"));
}

} // namespace
} // namespace service
