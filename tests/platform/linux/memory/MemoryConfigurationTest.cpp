// SPDX-License-Identifier: Apache-2.0
// How much memory what clients send may take: by the machine's memory, by what an owner writes, and by wrong values.
#include "platform/linux/memory/MemoryConfiguration.h"

#include "platform/linux/settings/TomlFile.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace platform {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

constexpr std::uint64_t megabyte = 1024 * 1024;
constexpr std::uint64_t gigabyte = 1024 * megabyte;
constexpr bool is64Bit = sizeof(void*) == 8;

CheckedMemoryLimits read(std::string_view text, std::uint64_t bytesOfTheMachine = gigabyte)
{
    const auto values = parseToml(text);
    EXPECT_TRUE(values);
    return readMemoryLimits(values.value_or(foundation::Dictionary()), bytesOfTheMachine);
}

TEST(MemoryConfiguration, NothingSaidIsASixteenthOfTheMachineWithinBounds)
{
    EXPECT_EQ(read("").limits.ofTheService, 64 * megabyte);
    EXPECT_EQ(read("", 24 * gigabyte).limits.ofTheService, 256 * megabyte);
    EXPECT_EQ(read("", 4 * gigabyte).limits.ofTheService, 256 * megabyte);
    EXPECT_EQ(read("", 4 * gigabyte - 16 * megabyte).limits.ofTheService, 255 * megabyte);
    EXPECT_EQ(read("", 257 * megabyte).limits.ofTheService, 257 * megabyte / 16);
    EXPECT_EQ(read("", 128 * megabyte).limits.ofTheService, 16 * megabyte);
}

TEST(MemoryConfiguration, NothingSaidIsThreeQuartersForAUserAndHalfForAClient)
{
    const auto [limits, problems] = read("");
    EXPECT_EQ(limits.ofAUser, 48 * megabyte);
    EXPECT_EQ(limits.ofAClient, 32 * megabyte);
    EXPECT_THAT(problems, IsEmpty());
}

TEST(MemoryConfiguration, EverythingCanBeSaid)
{
    const auto [limits, problems] = read("memory_mb = 10\nmemory_part_of_user = 1\nmemory_part_of_client = 0.125\n");
    EXPECT_EQ(limits, (MemoryLimits{10 * megabyte, 10 * megabyte, 10 * megabyte / 8}));
    EXPECT_THAT(problems, IsEmpty());
    EXPECT_EQ(read("memory_mb = 1.5").limits.ofTheService, 3 * megabyte / 2);
    EXPECT_EQ(read("memory_mb = 1048576").limits.ofTheService, is64Bit ? 1024 * gigabyte : 2 * gigabyte - 1)
        << "more than the machine has, but not more than half of what a process can address";
}

TEST(MemoryConfiguration, AClientGetsNoMoreThanItsUser)
{
    const auto [limits, problems] = read("memory_mb = 10\nmemory_part_of_user = 0.25\nmemory_part_of_client = 1\n");
    EXPECT_EQ(limits.ofAClient, limits.ofAUser);
    EXPECT_EQ(limits.ofAUser, 10 * megabyte / 4);
    EXPECT_THAT(problems, IsEmpty());
}

TEST(MemoryConfiguration, WhatIsWrongHasItsDefaultAndALine)
{
    const auto [limits, problems] = read("memory = 3\nmemory_mb = 0.5\nmemory_part_of_client = 0\n"
                                         "memory_part_of_user = 1.01\n");
    EXPECT_EQ(limits, read("").limits);
    EXPECT_THAT(problems,
                ElementsAre("unknown key memory, ignored; the keys are memory_mb, memory_part_of_user, "
                            "memory_part_of_client",
                            "memory_mb = 0.5 should be a number of megabytes from 1 to 1048576; the default counts "
                            "until this is corrected",
                            "memory_part_of_client = 0 should be a part above 0, up to 1; the default counts until "
                            "this is corrected",
                            "memory_part_of_user = 1.01 should be a part above 0, up to 1; the default counts until "
                            "this is corrected"));
    for (const char* wrong : {"memory_mb = true", "memory_mb = \"64\"", "memory_mb = 1048577", "memory_mb = nan",
                              "memory_part_of_user = -0.5", "memory_part_of_client = false"}) {
        EXPECT_EQ(read(wrong).limits, read("").limits) << wrong;
        EXPECT_EQ(read(wrong).problems.size(), 1U) << wrong;
    }
}

} // namespace
} // namespace platform
