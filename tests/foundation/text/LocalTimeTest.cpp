// SPDX-License-Identifier: Apache-2.0
// Local time: zones with odd offsets, summer and winter, a device that travels, and moments that no calendar can
// express.
#include "foundation/text/LocalTime.h"

#include <cstdlib>
#include <ctime>
#include <gtest/gtest.h>
#include <limits>

namespace {

using foundation::localTimeText;

class LocalTime : public testing::Test {
protected:
    ~LocalTime() override
    {
        ::unsetenv("TZ");
        ::tzset();
    }
    static std::string textIn(const char* zone, double secondsSince1970)
    {
        ::setenv("TZ", zone, 1);
        return localTimeText(secondsSince1970, "{:%Y-%m-%d %H:%M:%S %z}");
    }
};

TEST_F(LocalTime, IsThatOfTheZoneAtThatMoment)
{
    EXPECT_EQ(textIn("UTC", 0), "1970-01-01 00:00:00 +0000");
    EXPECT_EQ(textIn("Europe/Berlin", 1'767'225'600), "2026-01-01 01:00:00 +0100");
    EXPECT_EQ(textIn("Europe/Berlin", 1'782'864'000), "2026-07-01 02:00:00 +0200");
    EXPECT_EQ(textIn("Asia/Kathmandu", 1'767'225'600), "2026-01-01 05:45:00 +0545");
    EXPECT_EQ(textIn("America/St_Johns", 1'767'225'600), "2025-12-31 20:30:00 -0330");
}

TEST_F(LocalTime, FollowsTheDeviceIntoAnotherZone)
{
    EXPECT_EQ(textIn("UTC", 0), "1970-01-01 00:00:00 +0000");
    EXPECT_EQ(textIn("Asia/Tokyo", 0), "1970-01-01 09:00:00 +0900");
}

TEST_F(LocalTime, IsWholeSecondsDownwards)
{
    EXPECT_EQ(textIn("UTC", 59.999), "1970-01-01 00:00:59 +0000");
    EXPECT_EQ(textIn("UTC", -0.001), "1969-12-31 23:59:59 +0000");
}

TEST_F(LocalTime, IsLeftAsANumberBeyondTheYearsThatHaveFourDigits)
{
    EXPECT_EQ(textIn("UTC", 253'402'300'799), "9999-12-31 23:59:59 +0000");
    EXPECT_EQ(textIn("UTC", 253'402'300'800), "253402300800");
    EXPECT_EQ(textIn("UTC", -62'135'596'800), "0001-01-01 00:00:00 +0000");
    EXPECT_EQ(textIn("UTC", -62'135'596'801), "-62135596801");
    EXPECT_EQ(textIn("UTC", 1e300), "1e+300");
    EXPECT_EQ(textIn("UTC", std::numeric_limits<double>::infinity()), "inf");
    EXPECT_EQ(textIn("UTC", std::numeric_limits<double>::quiet_NaN()), "nan");
}

} // namespace
