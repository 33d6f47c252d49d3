// Device properties from device.toml in the configuration directory: one truth value for each property.
#pragma once

#include "platform/DeviceProperties.h"
#include "platform/linux/settings/WatchedTomlFile.h"

namespace platform {

// Any thread.
class LinuxDeviceProperties final : public DeviceProperties {
public:
    LinuxDeviceProperties(ConfigurationWatcher& watcher, ProviderLog log) : file_(watcher, "device.toml", log) { }

    [[nodiscard]] std::optional<bool> boolean(std::string_view name) const override;

private:
    WatchedTomlFile file_;
};

} // namespace platform
