// SPDX-License-Identifier: Apache-2.0
// Clients and stored events use these numbers and names, so these tests pin every one.
#include "utility/MessageKinds.h"

#include <array>
#include <gtest/gtest.h>
#include <rapidcheck/gtest.h>
#include <utility>

namespace {

constexpr std::array<std::pair<AudioEventCategory, std::string_view>, 15> baseCategories{{{1, "Generic"},
                                                                                          {2, "Record"},
                                                                                          {3, "Input"},
                                                                                          {4, "Playback"},
                                                                                          {5, "Output"},
                                                                                          {6, "PlaybackAndRecord"},
                                                                                          {7, "IO"},
                                                                                          {8, "Setup"},
                                                                                          {9, "ClientRequest"},
                                                                                          {10, "RouteChange"},
                                                                                          {11, "Error"},
                                                                                          {12, "Cavlet"},
                                                                                          {13, "Performance"},
                                                                                          {14, "Volume"},
                                                                                          {15, "HearingHealth"}}};

constexpr std::array<std::pair<AudioEventCategory, std::string_view>, 6> groups{{{0x04000000, "MIDI"},
                                                                                 {0x08000000, "Session"},
                                                                                 {0x10000000, "DSP"},
                                                                                 {0x20000000, "HAL"},
                                                                                 {0x40000000, "Routing"},
                                                                                 {0x80000000, "Toolbox"}}};

constexpr std::array<std::pair<AudioEventType, std::string_view>, 19> types{{{1, "Start"},
                                                                             {2, "Stop"},
                                                                             {3, "Activate"},
                                                                             {4, "Deactivate"},
                                                                             {5, "Setup"},
                                                                             {6, "Error"},
                                                                             {7, "IssueDetector"},
                                                                             {8, "Gimbo"},
                                                                             {9, "AudioUnitUsage"},
                                                                             {10, "MIDIDriver"},
                                                                             {11, "Summary"},
                                                                             {12, "HeadphoneAudioExposure"},
                                                                             {13, "AudioExposure"},
                                                                             {14, "Listeningenhancement"},
                                                                             {15, "Tivra"},
                                                                             {16, "Simple"},
                                                                             {17, "Histogram"},
                                                                             {18, "State"},
                                                                             {65535, "Unknown"}}};

constexpr std::array<std::pair<AudioServiceType, std::string_view>, 15> services{{{0, "generic"},
                                                                                  {1, "merla"},
                                                                                  {2, "telephony"},
                                                                                  {3, "haptics"},
                                                                                  {4, "alarms"},
                                                                                  {5, "standalone"},
                                                                                  {6, "soundautoconfig"},
                                                                                  {7, "longformaudio"},
                                                                                  {8, "nonlongformaudio"},
                                                                                  {9, "audiodeviceusage"},
                                                                                  {10, "alerts"},
                                                                                  {11, "test"},
                                                                                  {12, "apiusage"},
                                                                                  {13, "systemsounds"},
                                                                                  {65535, "unknown"}}};

TEST(CategoryString, NamesEveryBaseCategory)
{
    for (const auto& [category, name] : baseCategories)
        EXPECT_EQ(KestoReportingUtilityCategoryString(category), name);
}

TEST(CategoryString, NamesEveryGroupBeforeEveryBaseCategory)
{
    for (const auto& [group, prefix] : groups)
        for (const auto& [category, name] : baseCategories)
            EXPECT_EQ(KestoReportingUtilityCategoryString(group | category),
                      std::string(prefix) + '_' + std::string(name));
}

TEST(CategoryString, CallsEveryOtherBaseCategoryUndefined)
{
    EXPECT_EQ(KestoReportingUtilityCategoryString(0), "Undefined");
    for (AudioEventCategory category = 16; category <= 0xFFFF; ++category)
        ASSERT_EQ(KestoReportingUtilityCategoryString(category), "Undefined") << category;
    EXPECT_EQ(KestoReportingUtilityCategoryString(0x00010000), "_Undefined");
    EXPECT_EQ(KestoReportingUtilityCategoryString(0x10000010), "DSP_Undefined");
}

TEST(CategoryString, KeepsTheUnderscoreOfAGroupWithoutAName)
{
    EXPECT_EQ(KestoReportingUtilityCategoryString(0x00030004), "_Playback");
    EXPECT_EQ(KestoReportingUtilityCategoryString(0x10010004), "_Playback"); // the group word is matched whole
    EXPECT_EQ(KestoReportingUtilityCategoryString(0x18000004), "_Playback"); // two groups are none
    EXPECT_EQ(KestoReportingUtilityCategoryString(0xFFFFFFFE), "_Undefined");
}

TEST(CategoryString, SeesNoGroupInAllOnes)
{
    EXPECT_EQ(KestoReportingUtilityCategoryString(0xFFFFFFFF), "Undefined");
}

TEST(CategoryString, HasTheNamesThatWereAgreedUpon)
{
    EXPECT_EQ(KestoReportingUtilityCategoryString(4), "Playback");
    EXPECT_EQ(KestoReportingUtilityCategoryString(0x10000004), "DSP_Playback");
    EXPECT_EQ(KestoReportingUtilityCategoryString(0x8000000F), "Toolbox_HearingHealth");
}

TEST(TypeString, NamesEveryType)
{
    for (const auto& [type, name] : types)
        EXPECT_EQ(KestoReportingUtilityTypeString(type), name);
}

TEST(TypeString, CallsEveryOtherTypeGeneric)
{
    EXPECT_EQ(KestoReportingUtilityTypeString(0), "Generic");
    for (AudioEventType type = 19; type < 65535; ++type)
        ASSERT_EQ(KestoReportingUtilityTypeString(type), "Generic") << type;
    EXPECT_EQ(KestoReportingUtilityTypeString(65536), "Generic");
    EXPECT_EQ(KestoReportingUtilityTypeString(0x00010001), "Generic"); // the value is matched whole
    EXPECT_EQ(KestoReportingUtilityTypeString(0xFFFFFFFF), "Generic");
}

TEST(ServiceName, NamesEveryServiceType)
{
    for (const auto& [type, name] : services)
        EXPECT_EQ(KestoReportingUtilityGenerateServiceNameFromServiceType(type), name);
}

TEST(ServiceName, CallsEveryOtherServiceTypeTelephony)
{
    for (unsigned type = 14; type < 65535; ++type)
        ASSERT_EQ(KestoReportingUtilityGenerateServiceNameFromServiceType(static_cast<AudioServiceType>(type)),
                  "telephony")
            << type;
}

TEST(ServiceType, IsFoundByEveryName)
{
    for (const auto& [type, name] : services)
        EXPECT_EQ(KestoReportingUtilityGenerateServiceTypeFromServiceName(name), type);
}

TEST(ServiceType, IsUnknownForEveryOtherName)
{
    for (const std::string_view name : {"Haptics", "HAPTICS", " haptics", "haptics ", "haptic", "hapticss", "", "0"})
        EXPECT_EQ(KestoReportingUtilityGenerateServiceTypeFromServiceName(name), 65535) << name;
    EXPECT_EQ(KestoReportingUtilityGenerateServiceTypeFromServiceName("haptics"), 3);
}

RC_GTEST_PROP(ServiceType, OfANameIsTheTypeThatBearsIt, (AudioServiceType type))
{
    const auto name = KestoReportingUtilityGenerateServiceNameFromServiceType(type);
    const bool isInTable = type <= 13 || type == 65535;
    RC_ASSERT(KestoReportingUtilityGenerateServiceTypeFromServiceName(name) == (isInTable ? type : 2));
}

TEST(Batching, IsForEveryServiceTypeButAPIUsage)
{
    for (unsigned type = 0; type <= 65535; ++type)
        ASSERT_EQ(
            KestoReportingUtilityShouldBatchBlinReportingEventsForServiceType(static_cast<AudioServiceType>(type)),
            type != 12)
            << type;
}

TEST(ABTestMode, IsOnForCategoriesThatCarryAGroup)
{
    EXPECT_FALSE(KestoReportingUtilityIsABTestModeOn(0));
    EXPECT_FALSE(KestoReportingUtilityIsABTestModeOn(0x0000FFFF));
    EXPECT_TRUE(KestoReportingUtilityIsABTestModeOn(0x00010000));
    EXPECT_TRUE(KestoReportingUtilityIsABTestModeOn(0xFFFFFFFE));
    EXPECT_FALSE(KestoReportingUtilityIsABTestModeOn(0xFFFFFFFF));
}

RC_GTEST_PROP(ABTestMode, IsOnExactlyWhereANameHasAnUnderscore, (AudioEventCategory category))
{
    const bool hasUnderscore = KestoReportingUtilityCategoryString(category).contains('_');
    RC_ASSERT(hasUnderscore == KestoReportingUtilityIsABTestModeOn(category));
}

TEST(BaseCategory, IsTheLowHalf)
{
    EXPECT_EQ(KestoReportingUtilityRetrieveBlinReportingCategoryFromCategory(0x10000004), 4U);
    EXPECT_EQ(KestoReportingUtilityRetrieveBlinReportingCategoryFromCategory(0xFFFFFFFF), 0xFFFFU);
    EXPECT_EQ(KestoReportingUtilityRetrieveBlinReportingCategoryFromCategory(0xFFFF0000), 0U);
}

TEST(Constants, AreTheSameForEveryServiceType)
{
    for (unsigned type = 0; type <= 65535; ++type)
        ASSERT_EQ(KestoReportingUtilityVolumeMinimumPlayingTime(static_cast<AudioServiceType>(type)), 0.5) << type;
    EXPECT_TRUE(KestoReportingUtilityShouldSendMessage());
    EXPECT_FALSE(KestoReportingUtilityAllowSessionTransactions());
}

} // namespace
