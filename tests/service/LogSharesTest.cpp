// SPDX-License-Identifier: Apache-2.0
// Shares of the log by process, with moments that the test makes up.
#include "service/LogShares.h"

#include <gtest/gtest.h>

namespace service {
namespace {

using namespace std::chrono_literals;
using platform::LogShare;

constexpr LogShare::Clock::time_point start{1h};

TEST(LogSharesTest, TheConnectionsOfAProcessHaveOneTogether)
{
    LogShares shares;
    const auto first = shares.ofProcess({.user = 1000, .process = 7}, start);
    EXPECT_EQ(shares.ofProcess({.user = 1000, .process = 7}, start), first);
    EXPECT_EQ(first->who(), "process 7");
}

TEST(LogSharesTest, EachProcessOfEachUserHasItsOwn)
{
    LogShares shares;
    const auto first = shares.ofProcess({.user = 1000, .process = 7}, start);
    EXPECT_NE(shares.ofProcess({.user = 1000, .process = 8}, start), first);
    EXPECT_NE(shares.ofProcess({.user = 1001, .process = 7}, start), first);
}

TEST(LogSharesTest, AProcessThatComesBackGainsNoLines)
{
    LogShares shares;
    const auto takeAll = [&] {
        const auto share = shares.ofProcess({.user = 1000, .process = 7}, start);
        int taken = 0;
        while (share->take(LogShare::Part::Others, start))
            ++taken;
        return taken;
    };
    EXPECT_EQ(takeAll(), 2000);
    for (int process = 1000; process < 1100; ++process)
        std::ignore = shares.ofProcess({.user = 1000, .process = process}, start);
    EXPECT_EQ(takeAll(), 0);
}

TEST(LogSharesTest, ForgetsThoseThatAreFullAndBelongToNoConnection)
{
    LogShares shares;
    const auto connected = shares.ofProcess({.user = 1000, .process = 7}, start);
    for (int process = 1000; process < 11'000; ++process)
        std::ignore = shares.ofProcess({.user = 1000, .process = process}, start);
    EXPECT_LT(shares.size(), 10U);
    EXPECT_EQ(shares.ofProcess({.user = 1000, .process = 7}, start), connected);
}

TEST(LogSharesTest, ForgetsAProcessThatFloodedWhenItsShareIsFullAgain)
{
    LogShares shares;
    std::ignore = shares.ofProcess({.user = 1000, .process = 7}, start)->take(LogShare::Part::Others, start);
    for (int process = 1000; process < 1100; ++process)
        std::ignore = shares.ofProcess({.user = 1000, .process = process}, start + 1s);
    EXPECT_LT(shares.size(), 10U);
}

} // namespace
} // namespace service
