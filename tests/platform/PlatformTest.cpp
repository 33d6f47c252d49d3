// SPDX-License-Identifier: Apache-2.0
// The one installed platform.
#include "platform/Platform.h"

#include "support/TestPlatform.h"

#include <gtest/gtest.h>

namespace platform {
namespace {

TEST(Platform, IsThereBetweenInstallationAndRemoval)
{
    EXPECT_FALSE(isInstalled());
    {
        support::TestPlatform fakes;
        ASSERT_TRUE(isInstalled());
        EXPECT_EQ(&current().clock, &fakes.clock);
        EXPECT_EQ(&current().analytics, &fakes.analytics);
    }
    EXPECT_FALSE(isInstalled());
}

TEST(Platform, CountsItsInstallations)
{
    const auto before = installationNumber();
    {
        support::TestPlatform fakes;
        EXPECT_EQ(installationNumber(), before + 1);
    }
    EXPECT_EQ(installationNumber(), before + 1);
    const support::TestPlatform fakes;
    EXPECT_EQ(installationNumber(), before + 2);
}

#ifndef NDEBUG
TEST(PlatformDeathTest, AskingForOneThatIsNotThereIsABug)
{
    EXPECT_DEATH(static_cast<void>(current()), "no platform is installed");
}
#endif

} // namespace
} // namespace platform
