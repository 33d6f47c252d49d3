// Feature flags from feature-flags.toml in the configuration directory: one table for each domain, with one truth value
// for each flag.
#pragma once

#include "platform/FeatureFlags.h"
#include "platform/linux/settings/WatchedTomlFile.h"

namespace platform {

// Any thread.
class LinuxFeatureFlags final : public FeatureFlags {
public:
    LinuxFeatureFlags(ConfigurationWatcher& watcher, ProviderLog log) : file_(watcher, "feature-flags.toml", log) { }

    [[nodiscard]] bool isEnabled(std::string_view domain, std::string_view flag) const override;

private:
    WatchedTomlFile file_;
};

} // namespace platform
