// SPDX-License-Identifier: Apache-2.0
// What the device's maker has set, in two files of the configuration directory.
//
// feature-flags.toml has one table for each domain, with one truth value for each flag. device.toml has one truth value
// for each property.
#pragma once

#include "platform/DeviceProperties.h"
#include "platform/FeatureFlags.h"
#include "platform/linux/settings/WatchedTomlFile.h"

namespace platform {

// Any thread.
class LinuxDeviceSettings final : public FeatureFlags, public DeviceProperties {
public:
    LinuxDeviceSettings(ConfigurationWatcher& watcher, ProviderLog log)
        : flags_(watcher, "feature-flags.toml", log),
          properties_(watcher, "device.toml", log)
    {
    }

    [[nodiscard]] bool isEnabled(std::string_view domain, std::string_view flag) const override;
    [[nodiscard]] std::optional<bool> boolean(std::string_view name) const override;

private:
    WatchedTomlFile flags_;
    WatchedTomlFile properties_;
};

} // namespace platform
