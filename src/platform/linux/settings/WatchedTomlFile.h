// SPDX-License-Identifier: Apache-2.0
// A TOML file of the configuration directory; its last good values are available at any time.
#pragma once

#include "foundation/Mutex.h"
#include "platform/linux/settings/ConfigurationWatcher.h"
#include "platform/linux/settings/TomlFile.h"

#include <functional>
#include <memory>
#include <string_view>

namespace platform {

// Any thread.
class WatchedTomlFile {
public:
    // Called on the watcher's thread when the values have changed, without holding locks of this class.
    using ChangeHandler = std::function<void()>;

    // Reads the file before it returns.
    WatchedTomlFile(ConfigurationWatcher& watcher, std::string_view fileName, ProviderLog log,
                    ChangeHandler changeHandler = {});

    [[nodiscard]] foundation::Dictionary values() const;
    [[nodiscard]] std::filesystem::path path() const { return path_; }

private:
    void reload();

    const std::filesystem::path path_;
    const ChangeHandler changeHandler_;
    mutable foundation::Mutex lock_;
    TomlFile file_ KESTO_GUARDED_BY(lock_);
    std::unique_ptr<ConfigurationWatcher::Watch> watch_; // destroyed first
};

} // namespace platform
