// SPDX-License-Identifier: Apache-2.0
// How much came in the last minute.
#include "ledger/LastMinute.h"

#include <gtest/gtest.h>

namespace ledger {
namespace {

using namespace std::chrono_literals;
constexpr LastMinute::Clock::time_point start(1000s);

TEST(LastMinute, SumsWhatCameWithinIt)
{
    LastMinute counts;
    EXPECT_EQ(counts.sum(start), 0U);
    counts.add(1, start);
    counts.add(10, start + 500ms);
    counts.add(100, start + 30s);
    EXPECT_EQ(counts.sum(start + 30s), 111U);
    EXPECT_EQ(counts.sum(start + 59s), 111U);
    EXPECT_EQ(counts.sum(start + 60s), 100U);
    EXPECT_EQ(counts.sum(start + 90s), 0U);
}

TEST(LastMinute, ForgetsWhatCameAMinuteBeforeInTheSameSecond)
{
    LastMinute counts;
    counts.add(7, start);
    counts.add(1, start + 60s);
    EXPECT_EQ(counts.sum(start + 60s), 1U);
}

} // namespace
} // namespace ledger
