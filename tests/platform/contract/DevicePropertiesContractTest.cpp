// SPDX-License-Identifier: Apache-2.0
// The contract of platform/DeviceProperties.h: a property is true, false, or missing.
#include "platform/contract/Contract.h"
#include "platform/linux/settings/LinuxDeviceSettings.h"
#include "support/TemporaryDirectory.h"
#include "support/fakes/FakeLog.h"
#include "support/fakes/FakeSettings.h"

namespace contract {
namespace {

class DevicePropertiesSubject {
public:
    virtual ~DevicePropertiesSubject() = default;
    [[nodiscard]] virtual const platform::DeviceProperties& properties() const = 0;
    // The device's maker sets the property of the test. It takes effect a moment later.
    virtual void set(const std::string& name, bool value) = 0;
};

class FakeDevicePropertiesSubject final : public DevicePropertiesSubject {
public:
    [[nodiscard]] const platform::DeviceProperties& properties() const override { return properties_; }
    void set(const std::string& name, bool value) override { properties_.set(name, value); }

private:
    support::FakeDeviceProperties properties_;
};

class LinuxDevicePropertiesSubject final : public DevicePropertiesSubject {
public:
    [[nodiscard]] const platform::DeviceProperties& properties() const override { return properties_; }
    void set(const std::string& name, bool value) override
    {
        support::replaceFile(directory_ / "device.toml", name + (value ? " = true\n" : " = false\n"));
    }

private:
    const support::TemporaryDirectory directory_;
    support::FakeLog log_;
    platform::ConfigurationWatcher watcher_{directory_.path(), platform::ProviderLog(log_)};
    platform::LinuxDeviceSettings properties_{watcher_, platform::ProviderLog(log_)};
};

using DevicePropertiesContract = Suite<DevicePropertiesSubject>;
KESTO_CONTRACT(DevicePropertiesContract, (provider<DevicePropertiesSubject, FakeDevicePropertiesSubject>("Fake")),
               (provider<DevicePropertiesSubject, LinuxDevicePropertiesSubject>("Linux")));

TEST_P(DevicePropertiesContract, AreNothingWhereTheDeviceDoesNotHaveThem)
{
    EXPECT_EQ(subject->properties().boolean("InternalBuild"), std::nullopt);
    subject->set("InternalBuild", true);
    ASSERT_TRUE(eventually([&] { return subject->properties().boolean("InternalBuild") == true; }));
    EXPECT_EQ(subject->properties().boolean("internalbuild"), std::nullopt);
    EXPECT_EQ(subject->properties().boolean(""), std::nullopt);
}

TEST_P(DevicePropertiesContract, AreTrueOrFalse)
{
    subject->set("InternalBuild", false);
    EXPECT_TRUE(eventually([&] { return subject->properties().boolean("InternalBuild") == false; }));
    subject->set("InternalBuild", true);
    EXPECT_TRUE(eventually([&] { return subject->properties().boolean("InternalBuild") == true; }));
}

} // namespace
} // namespace contract
