// SPDX-License-Identifier: Apache-2.0
// Moments as people write them.
#include "kesto/results/MomentText.h"

#include <chrono>
#include <cstdlib>
#include <ctime>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace {

using testing::DoubleNear;
using testing::Optional;

class Moments : public testing::Test {
protected:
    void SetUp() override { setZone("Europe/Berlin"); }
    void TearDown() override
    {
        ::unsetenv("TZ");
        ::tzset();
    }
    static void setZone(const char* zone)
    {
        ::setenv("TZ", zone, 1);
        ::tzset();
    }
};

double now()
{
    return std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count();
}

TEST_F(Moments, AreSoLongAgo)
{
    constexpr double tolerance = 5; // for a machine that pauses
    EXPECT_THAT(parseMoment("90s"), Optional(DoubleNear(now() - 90, tolerance)));
    EXPECT_THAT(parseMoment("10m"), Optional(DoubleNear(now() - 600, tolerance)));
    EXPECT_THAT(parseMoment("1.5h"), Optional(DoubleNear(now() - 5400, tolerance)));
    EXPECT_THAT(parseMoment("7d"), Optional(DoubleNear(now() - 7 * 86400, tolerance)));
    EXPECT_THAT(parseMoment("0s"), Optional(DoubleNear(now(), tolerance)));
}

TEST_F(Moments, AreLocalTimesInWinterAndInSummer)
{
    EXPECT_EQ(parseMoment("2026-01-31T18:00:00"), 1'769'878'800);
    EXPECT_EQ(parseMoment("2026-01-31 18:00:00"), 1'769'878'800);
    EXPECT_EQ(parseMoment("2026-01-31T18:00"), 1'769'878'800);
    EXPECT_EQ(parseMoment("2026-01-31 18:00"), 1'769'878'800);
    EXPECT_EQ(parseMoment("2026-01-31"), 1'769'878'800 - 18 * 3600);
    EXPECT_EQ(parseMoment("2026-07-31T18:00"), 1'785'513'600);
}

TEST_F(Moments, AreTimesOfAnyZone)
{
    EXPECT_EQ(parseMoment("2026-01-31T17:00:00Z"), 1'769'878'800);
    EXPECT_EQ(parseMoment("2026-01-31T22:30+05:30"), 1'769'878'800);
    EXPECT_EQ(parseMoment("2026-01-31 12:00:00-0500"), 1'769'878'800);
    setZone("Asia/Kolkata");
    EXPECT_EQ(parseMoment("2026-01-31T17:00:00Z"), 1'769'878'800);
}

TEST_F(Moments, AreNothingElse)
{
    for (const char* text :
         {"", "s", "10", "-10m", "10 m", "10mm", "10y", "nans", "infs", "1e400d", "soon", "2026", "2026-13-01",
          "2026-02-30", "2026-01-31T25:00", "2026-01-31T18:00:00X", "2026-01-31T18:00:00Z later", "18:00"})
        EXPECT_EQ(parseMoment(text), std::nullopt) << text;
}

} // namespace
