// SPDX-License-Identifier: Apache-2.0
// The fake channels fail as a test chooses.
#include "support/fakes/FakeReportingChannels.h"

#include <gtest/gtest.h>

namespace {

TEST(FakeReportingChannelsTest, EachStepFailsWhereTheTestWantsIt)
{
    support::FakeReportingChannels channels;
    const auto moment = channels.readChannels({{}});
    auto& failures = channels.failures("Rx", std::nullopt);
    failures.copy = 1;
    EXPECT_EQ(channels.copyChannelsInGroup("Rx", std::nullopt, *moment).channels, nullptr);
    failures.copy.reset();
    failures.copiesNothing = true;
    const auto neither = channels.copyChannelsInGroup("Rx", std::nullopt, *moment);
    EXPECT_EQ(neither.error, std::nullopt);
    EXPECT_EQ(neither.channels, nullptr);
    failures.copiesNothing = false;
    failures.copy = 1;
    failures.copiesAnyway = true;
    const auto found = channels.copyChannelsInGroup("Rx", std::nullopt, *moment);
    EXPECT_EQ(found.error, 1);
    ASSERT_NE(found.channels, nullptr);
    failures.subscription = 2;
    const auto subscribed = channels.createSubscription(*found.channels);
    EXPECT_EQ(subscribed.error, 2);
    EXPECT_EQ(subscribed.channels, nullptr);
    failures.subscription.reset();
    failures.subscribesToNothing = true;
    EXPECT_EQ(channels.createSubscription(*found.channels).error, std::nullopt);
    EXPECT_EQ(channels.createSubscription(*found.channels).channels, nullptr);
    failures.sample = 3;
    EXPECT_EQ(channels.createSamples(*subscribed.subscription, *found.channels, *moment).error(), 3);
    channels.failDifferences(4);
    EXPECT_EQ(channels.createDifference({}, {}).error(), 4);
}

} // namespace
