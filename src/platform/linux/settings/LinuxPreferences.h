// SPDX-License-Identifier: Apache-2.0
// Preferences as files: preferences/<domain>.toml in the configuration directory holds the keys of one domain.
#pragma once

#include "foundation/Mutex.h"
#include "platform/Preferences.h"
#include "platform/linux/settings/ConfigurationWatcher.h"
#include "platform/linux/settings/TomlFile.h"

#include <functional>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <string_view>

namespace platform {

// Any thread.
class LinuxPreferences final : public Preferences {
public:
    // Files of this many domains are kept in memory; those of other domains are read each time, and their changes are
    // not reported.
    static constexpr std::size_t mostKeptDomains = 64;

    using ChangeHandler = std::function<void(std::string_view domain)>;

    LinuxPreferences(ConfigurationWatcher& watcher, ProviderLog log);

    // The last good value; nothing for a name that is not a valid domain (`isDomainName`).
    [[nodiscard]] std::optional<foundation::Value> value(std::string_view domain, std::string_view key) const override;

    // From now on calls the handler, on the watcher's thread, with each domain in which a value changed, came or went.
    // Call it at most once.
    void setChangeHandler(ChangeHandler handler);

    // Letters, digits, "-", "_" and ".", not beginning with ".", and short enough for a file name: such a name cannot
    // lead out of the directory.
    [[nodiscard]] static bool isDomainName(std::string_view name) noexcept;

private:
    [[nodiscard]] std::filesystem::path path(std::string_view domain) const;
    [[nodiscard]] std::set<std::string> domainsThatAreThere() const;
    bool reload(const std::string& domain) KESTO_REQUIRES(lock_);
    void handleChange(std::string_view fileName);

    const std::filesystem::path directory_;
    const ProviderLog log_;
    mutable foundation::Mutex lock_;
    mutable std::map<std::string, TomlFile, std::less<>> files_ KESTO_GUARDED_BY(lock_); // by domain
    ChangeHandler changeHandler_ KESTO_GUARDED_BY(lock_);
    std::unique_ptr<ConfigurationWatcher::Watch> watch_; // destroyed first
};

} // namespace platform
