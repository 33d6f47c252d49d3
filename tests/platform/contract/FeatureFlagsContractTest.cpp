// SPDX-License-Identifier: Apache-2.0
// The contract of platform/FeatureFlags.h: a flag is on only if its owner has switched it on.
#include "platform/contract/Contract.h"
#include "platform/linux/settings/LinuxDeviceSettings.h"
#include "support/TemporaryDirectory.h"
#include "support/fakes/FakeLog.h"
#include "support/fakes/FakeSettings.h"

namespace contract {
namespace {

class FeatureFlagsSubject {
public:
    virtual ~FeatureFlagsSubject() = default;
    [[nodiscard]] virtual const platform::FeatureFlags& flags() const = 0;
    // The device's owner sets the flag of the test. It takes effect a moment later.
    virtual void set(const std::string& domain, const std::string& flag, bool isEnabled) = 0;
};

class FakeFeatureFlagsSubject final : public FeatureFlagsSubject {
public:
    [[nodiscard]] const platform::FeatureFlags& flags() const override { return flags_; }
    void set(const std::string& domain, const std::string& flag, bool isEnabled) override
    {
        if (isEnabled)
            flags_.enable(domain, flag);
        else
            flags_.disable(domain, flag);
    }

private:
    support::FakeFeatureFlags flags_;
};

class LinuxFeatureFlagsSubject final : public FeatureFlagsSubject {
public:
    [[nodiscard]] const platform::FeatureFlags& flags() const override { return flags_; }
    void set(const std::string& domain, const std::string& flag, bool isEnabled) override
    {
        support::replaceFile(directory_ / "feature-flags.toml",
                             "[" + domain + "]\n" + flag + (isEnabled ? " = true\n" : " = false\n"));
    }

private:
    const support::TemporaryDirectory directory_;
    support::FakeLog log_;
    platform::ConfigurationWatcher watcher_{directory_.path(), platform::ProviderLog(log_)};
    platform::LinuxDeviceSettings flags_{watcher_, platform::ProviderLog(log_)};
};

using FeatureFlagsContract = Suite<FeatureFlagsSubject>;
KESTO_CONTRACT(FeatureFlagsContract, (provider<FeatureFlagsSubject, FakeFeatureFlagsSubject>("Fake")),
               (provider<FeatureFlagsSubject, LinuxFeatureFlagsSubject>("Linux")));

TEST_P(FeatureFlagsContract, AreOffByDefault)
{
    EXPECT_FALSE(subject->flags().isEnabled("Sonalis", "Tracing"));
}

TEST_P(FeatureFlagsContract, FollowTheirOwner)
{
    subject->set("Sonalis", "Tracing", true);
    EXPECT_TRUE(eventually([&] { return subject->flags().isEnabled("Sonalis", "Tracing"); }));
    subject->set("Sonalis", "Tracing", false);
    EXPECT_TRUE(eventually([&] { return !subject->flags().isEnabled("Sonalis", "Tracing"); }));
}

TEST_P(FeatureFlagsContract, AreKnownByDomainAndName)
{
    subject->set("Sonalis", "Tracing", true);
    ASSERT_TRUE(eventually([&] { return subject->flags().isEnabled("Sonalis", "Tracing"); }));
    EXPECT_FALSE(subject->flags().isEnabled("Sonalis", "tracing"));
    EXPECT_FALSE(subject->flags().isEnabled("Other", "Tracing"));
    EXPECT_FALSE(subject->flags().isEnabled("Sonalis", ""));
    EXPECT_FALSE(subject->flags().isEnabled("", "Sonalis"));
}

} // namespace
} // namespace contract
