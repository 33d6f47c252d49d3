// SPDX-License-Identifier: Apache-2.0
// Readers of the log filter by these tags.
#include "utility/LogCategories.h"

#include <array>
#include <gtest/gtest.h>
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

} // namespace
