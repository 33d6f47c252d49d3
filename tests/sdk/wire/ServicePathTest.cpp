// SPDX-License-Identifier: Apache-2.0
// Where a client looks for the service: the option comes before the environment, and the environment before the usual
// places of the packaged service.
#include "wire/ServicePath.h"

#include "support/EnvironmentVariable.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <optional>
#include <string>

namespace {

using libkesto::servicePaths;
using support::EnvironmentVariable;
using testing::ElementsAre;

TEST(ServicePath, IsTheOneThatWasGiven)
{
    const EnvironmentVariable socket("KESTO_SOCKET", "/from/environment");
    EXPECT_THAT(servicePaths("/given", "").value(), ElementsAre("/given"));
}

TEST(ServicePath, ComesFromTheEnvironmentNext)
{
    const EnvironmentVariable socket("KESTO_SOCKET", "/from/environment");
    const EnvironmentVariable runtime("XDG_RUNTIME_DIR", "/run/user/1000");
    EXPECT_THAT(servicePaths("", "").value(), ElementsAre("/from/environment"));
}

TEST(ServicePath, IsTheUsersOwnServiceAndThenTheSystems)
{
    const EnvironmentVariable socket("KESTO_SOCKET", std::nullopt);
    const EnvironmentVariable runtime("XDG_RUNTIME_DIR", "/run/user/1000");
    EXPECT_THAT(servicePaths("", "").value(),
                ElementsAre("/run/user/1000/kesto/com.quarn.kesto.reporting", "/run/kesto/com.quarn.kesto.reporting"));
    EXPECT_THAT(servicePaths("", "other").value(), ElementsAre("/run/user/1000/kesto/other", "/run/kesto/other"));
}

TEST(ServicePath, IsTheSystemsWhereThereIsNoUsersSession)
{
    const EnvironmentVariable socket("KESTO_SOCKET", std::nullopt);
    const EnvironmentVariable runtime("XDG_RUNTIME_DIR", std::nullopt);
    EXPECT_THAT(servicePaths("", "").value(), ElementsAre("/run/kesto/com.quarn.kesto.reporting"));
    const EnvironmentVariable empty("XDG_RUNTIME_DIR", "");
    EXPECT_THAT(servicePaths("", "").value(), ElementsAre("/run/kesto/com.quarn.kesto.reporting"));
}

TEST(ServicePath, IsNeverOneThatNoSocketCanHave)
{
    EXPECT_EQ(servicePaths(std::string(108, 'x'), "").error(), KESTO_INVALID_ARGUMENT);
    EXPECT_TRUE(servicePaths(std::string(107, 'x'), ""));
    EXPECT_EQ(servicePaths("", "a/b").error(), KESTO_INVALID_ARGUMENT);
    EXPECT_EQ(servicePaths(std::string("a\0b", 3), "").error(), KESTO_INVALID_ARGUMENT);
}

} // namespace
