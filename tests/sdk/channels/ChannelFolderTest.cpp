// SPDX-License-Identifier: Apache-2.0
// The default place of channels.
#include "channels/ChannelFolder.h"

#include "support/EnvironmentVariable.h"
#include "support/TemporaryDirectory.h"

#include <filesystem>
#include <gtest/gtest.h>
#include <optional>

namespace {

using support::EnvironmentVariable;

TEST(ChannelRoot, IsTheOneOfTheEnvironment)
{
    const EnvironmentVariable root("KESTO_CHANNEL_ROOT", "/given");
    EXPECT_EQ(libkesto::usualChannelRoot(), "/given");
}

TEST(ChannelRoot, IsThatOfTheUsersServiceWhereThereIsOne)
{
    const support::TemporaryDirectory runtime;
    const EnvironmentVariable root("KESTO_CHANNEL_ROOT", "");
    const EnvironmentVariable directory("XDG_RUNTIME_DIR", runtime.path().string());
    EXPECT_EQ(libkesto::usualChannelRoot(), "/run/kesto/channels") << "the user has no service";
    std::filesystem::create_directory(runtime / "kesto");
    EXPECT_EQ(libkesto::usualChannelRoot(), runtime / "kesto/channels");
}

TEST(ChannelRoot, IsTheSystemsWithoutAUsersSession)
{
    const EnvironmentVariable root("KESTO_CHANNEL_ROOT", std::nullopt);
    const EnvironmentVariable directory("XDG_RUNTIME_DIR", std::nullopt);
    EXPECT_EQ(libkesto::usualChannelRoot(), "/run/kesto/channels");
}

} // namespace
