// Tags are what a reader of the log filters by.
#include "utility/KestoReportingLogCategories.h"
#include "support/TestPlatform.h"

#include <array>
#include <gmock/gmock.h>
#include <utility>

namespace {

using platform::LogCategory;

constexpr std::array<std::pair<LogCategory& (*)(), std::string_view>, 9> categories{
    {{KestoReportingClientCategory, "kerc"},
     {KestoReportingServiceDelegateCategory, "kers"},
     {KestoReportingSessionCategory, "kerr"},
     {KestoReportingSessionBlinReportingCategory, "keri"},
     {KestoReportingDriverUtilityCategory, "kerd"},
     {KestoReportingTraceCategory, "kert"},
     {KestoReportingGimboCategory, "kerp"},
     {KestoReportingTrelmLogCategory, "kera"},
     {KestoReportingVorpLogCategory, "kerb"}}};

TEST(LogCategories, HaveTheirTagsAndOneSubsystem)
{
    for (const auto& [category, tag] : categories) {
        EXPECT_EQ(category().tag(), tag);
        EXPECT_EQ(category().subsystem(), "com.quarn.kesto");
    }
}

TEST(LogCategories, AreTheSameObjectEachTime)
{
    for (const auto& [category, tag] : categories)
        EXPECT_EQ(&category(), &category()) << tag;
}

TEST(LogLines, CarryTheirCategoryAndTheSourceFileAndLineOfTheStatement)
{
    support::TestPlatform platform;
    const int here = __LINE__;
    KESTO_LOG(KestoReportingGimboCategory(), Default, "{} watts", 3);

    const auto lines = platform.log.lines();
    ASSERT_EQ(lines.size(), 1U);
    EXPECT_THAT(lines[0], support::IsLine(platform::LogLevel::Default, "kerp", "3 watts"));
    EXPECT_EQ(lines[0].subsystem, "com.quarn.kesto");
    EXPECT_EQ(lines[0].file, "KestoReportingLogCategoriesTest");
    EXPECT_EQ(lines[0].line, here + 1);
}

TEST(LogLines, StartWithTheFileRightAlignedAndTheLineLeftAligned)
{
    EXPECT_EQ(platform::logPrefix({"KestoReportingSession", 42}), "    KestoReportingSession:42    ");
    EXPECT_EQ(platform::logPrefix({"KestoReportingServiceDelegateConnections", 123456}),
              "KestoReportingServiceDelegateConnections:123456 ");
}

TEST(LogLines, BelowTheThresholdAreNotEvenFormatted)
{
    support::TestPlatform platform;
    platform.log.setThreshold(platform::LogLevel::Default);
    int evaluated = 0;
    KESTO_LOG(KestoReportingSessionCategory(), Debug, "{}", ++evaluated);
    KESTO_LOG(KestoReportingSessionCategory(), Info, "{}", ++evaluated);
    EXPECT_EQ(evaluated, 0);
    KESTO_LOG(KestoReportingSessionCategory(), Default, "{}", ++evaluated);
    KESTO_LOG(KestoReportingSessionCategory(), Error, "{}", ++evaluated);
    EXPECT_EQ(evaluated, 2);
    EXPECT_EQ(platform.log.lines().size(), 2U);
}

} // namespace
