// SPDX-License-Identifier: Apache-2.0
// The list of levels in all its forms, and the errors of wrong lists.
#include "platform/linux/log/LogThresholds.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace platform {
namespace {

LogThresholds parsed(std::string_view text)
{
    auto thresholds = LogThresholds::parse(text);
    EXPECT_TRUE(thresholds) << thresholds.error();
    return thresholds.value_or(LogThresholds());
}

TEST(LogThresholdsTest, NothingSaidLetsDefaultAndErrorThrough)
{
    EXPECT_EQ(parsed("").threshold("kerr"), LogLevel::Default);
    EXPECT_EQ(parsed("   ").threshold("kerr"), LogLevel::Default);
}

TEST(LogThresholdsTest, ALevelCountsForEveryTag)
{
    EXPECT_EQ(parsed("error").threshold("kerr"), LogLevel::Error);
    EXPECT_EQ(parsed("default").threshold("kerr"), LogLevel::Default);
    EXPECT_EQ(parsed("info").threshold("kers"), LogLevel::Info);
    EXPECT_EQ(parsed("debug").threshold("anything"), LogLevel::Debug);
}

TEST(LogThresholdsTest, ATagMayDifferFromTheRest)
{
    const LogThresholds thresholds = parsed("kerr=debug,info,kers=error");
    EXPECT_EQ(thresholds.threshold("kerr"), LogLevel::Debug);
    EXPECT_EQ(thresholds.threshold("kers"), LogLevel::Error);
    EXPECT_EQ(thresholds.threshold("kerc"), LogLevel::Info);
    EXPECT_EQ(parsed("kerr=debug").threshold("kerc"), LogLevel::Default);
}

TEST(LogThresholdsTest, TheLaterOfTwoItemsCounts)
{
    EXPECT_EQ(parsed("debug,error").threshold("kerr"), LogLevel::Error);
    EXPECT_EQ(parsed("kerr=debug,kerr=info").threshold("kerr"), LogLevel::Info);
}

TEST(LogThresholdsTest, BlanksAroundItemsDoNotMatter)
{
    const LogThresholds thresholds = parsed(" info , kerr = debug ");
    EXPECT_EQ(thresholds.threshold("kerc"), LogLevel::Info);
    EXPECT_EQ(thresholds.threshold("kerr"), LogLevel::Debug);
}

class LogThresholdsRejectionTest : public testing::TestWithParam<std::pair<const char*, const char*>> { };

TEST_P(LogThresholdsRejectionTest, SaysWhichItemIsWrongAndWhatMayStandThere)
{
    const auto [text, item] = GetParam();
    const auto thresholds = LogThresholds::parse(text);
    ASSERT_FALSE(thresholds);
    EXPECT_EQ(thresholds.error(),
              std::string("\"") + item
                  + "\" is neither a level (error, default, info or debug) nor of the form tag=level");
}

INSTANTIATE_TEST_SUITE_P(Forms, LogThresholdsRejectionTest,
                         testing::Values(std::pair("loud", "loud"), std::pair("info,,debug", ""),
                                         std::pair("info,", ""), std::pair(",", ""), std::pair("=debug", "=debug"),
                                         std::pair("kerr=", "kerr="), std::pair("kerr=loud", "kerr=loud"),
                                         std::pair("Info", "Info"), std::pair("kerr=debug=info", "kerr=debug=info"),
                                         std::pair("kerr:debug", "kerr:debug")));

} // namespace
} // namespace platform
