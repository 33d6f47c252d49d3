// SPDX-License-Identifier: Apache-2.0
// The providers together: each is made from the launch configuration, and their connections work.
#include "platform/linux/LinuxPlatform.h"

#include "platform/linux/store/StoreReader.h"
#include "support/ProcessThreads.h"
#include "support/TemporaryDirectory.h"

#include <future>
#include <gtest/gtest.h>
#include <optional>

namespace platform {
namespace {

namespace fs = std::filesystem;

class LinuxPlatformTest : public testing::Test {
protected:
    LaunchConfiguration launch()
    {
        LaunchConfiguration configuration;
        configuration.stateDirectory = make("state");
        configuration.logsDirectory = make("logs");
        configuration.configurationDirectory = make("etc");
        configuration.runtimeDirectory = make("run");
        return configuration;
    }
    fs::path make(const char* name)
    {
        fs::create_directories(directory.path() / name);
        return directory.path() / name;
    }

    support::TemporaryDirectory directory;
};

TEST_F(LinuxPlatformTest, EveryProviderReadsWhatTheLaunchConfigurationNames)
{
    fs::create_directories(make("etc") / "preferences");
    support::writeFile(make("etc") / "preferences" / "com.quarn.kesto.toml", "device_name = \"Kitchen\"");
    support::writeFile(make("etc") / "feature-flags.toml", "[Sonalis]\nTracing = true");
    support::writeFile(make("etc") / "device.toml", "InternalBuild = true");
    support::writeFile(make("etc") / "analytics.toml", "used = [\"a.*\"]");
    LinuxPlatform providers(launch());
    const Platform platform = providers.platform();
    EXPECT_EQ(platform.preferences.value("com.quarn.kesto", "device_name"), foundation::Value("Kitchen"));
    EXPECT_TRUE(platform.featureFlags.isEnabled("Sonalis", "Tracing"));
    EXPECT_EQ(platform.deviceProperties.boolean("InternalBuild"), true);
    EXPECT_TRUE(platform.analytics.isAnalyticsEventUsed("a.b"));
    EXPECT_FALSE(platform.analytics.isAnalyticsEventUsed("com.quarn.kesto.Playback.Start"));
    EXPECT_EQ(platform.fileSystem.diagnosticLogRoot(), make("logs"));
    EXPECT_GT(platform.clock.secondsSince1970(), 1'700'000'000);
    EXPECT_EQ(platform.processTable.entry(platform.processTable.ownProcessIdentifier())->commandName,
              platform.processTable.ownProcessName());
}

TEST_F(LinuxPlatformTest, PreferencesThatChangePostTheNotificationOfTheirDomain)
{
    for (const auto& [domain, notification] :
         {std::pair("com.quarn.kesto", "com.quarn.kesto.reporting"),
          std::pair("com.quarn.halden", "com.quarn.halden.spatial-audio-accessory-feature.changed")}) {
        LinuxPlatform providers(launch());
        const Platform platform = providers.platform();
        const auto posted = std::make_shared<std::promise<void>>();
        const auto queue = platform.workQueues.makeSerialQueue("posts", {});
        platform.notifications.registerNotification(notification, queue,
                                                    [posted](std::int32_t) { posted->set_value(); });
        fs::create_directories(make("etc") / "preferences");
        support::replaceFile(make("etc") / "preferences" / (std::string(domain) + ".toml"), "key = 1");
        EXPECT_EQ(posted->get_future().wait_for(std::chrono::seconds(20)), std::future_status::ready) << domain;
    }
}

TEST_F(LinuxPlatformTest, ItsThreadsAreNoNicerThanTheProcess)
{
    const LinuxPlatform providers(launch());
    EXPECT_EQ(support::nicenessBeyondOwn("configuration"), 0);
}

// A client's answer waits for both.
TEST_F(LinuxPlatformTest, ItsStoreHasThePriorityOfTheServerQueue)
{
    LinuxPlatform providers(launch());
    const auto queue = providers.platform().workQueues.makeTurnQueue("com.quarn.kesto.test",
                                                                     {.quality = QualityOfService::UserInteractive});
    EXPECT_EQ(support::nicenessBeyondOwn("analytics"), support::nicenessBeyondOwn("kesto.test"));
}

TEST_F(LinuxPlatformTest, ATurnOfTheServerQueueIsKeptAtItsEnd)
{
    LinuxPlatform providers(launch());
    const Platform platform = providers.platform();
    const auto queue = platform.workQueues.makeTurnQueue("com.quarn.kesto.test", {});
    std::promise<void> sent;
    queue->submit([&](Turn& turn) {
        platform.analytics.sendAnalyticsEventLazy(turn, {}, "com.quarn.kesto.test",
                                                  [] { return foundation::Dictionary(); });
        sent.set_value();
    });
    sent.get_future().wait();
    std::promise<void> turnEnded; // the next item's turn begins after it
    queue->submit([&] { turnEnded.set_value(); });
    turnEnded.get_future().wait();
    providers.analyticsStore().flush();
    EXPECT_EQ(support::StoreReader(directory.path() / "state" / "analytics.sqlite3").eventCount(), 1);
}

TEST_F(LinuxPlatformTest, ASnapshotThatWasAskedForIsTakenBeforeThePlatformEnds)
{
    std::optional<foundation::Dictionary> response;
    {
        LinuxPlatform providers(launch());
        const auto reporter = providers.platform().bugCapture.makeReporter();
        reporter->requestSnapshot(reporter->makeSignature("domain", "type", "", "", "", std::nullopt), 0, std::nullopt,
                                  std::nullopt, [&](foundation::Dictionary given) { response = std::move(given); });
    }
    ASSERT_TRUE(response);
    EXPECT_TRUE(response->find("success")->asBoolean()) << foundation::Value(*response).text();
    EXPECT_TRUE(fs::exists(fs::path(response->find("directory")->stringView()) / "signature.json"));
}

TEST_F(LinuxPlatformTest, WhatWasSentIsKeptWhenThePlatformEnds)
{
    {
        LinuxPlatform providers(launch());
        providers.platform().analytics.sendAnalyticsEventLazy(outsideTurn, {}, "com.quarn.kesto.test",
                                                              [] { return foundation::Dictionary(); });
    }
    EXPECT_EQ(support::StoreReader(directory.path() / "state" / "analytics.sqlite3").eventCount(), 1);
}

} // namespace
} // namespace platform
