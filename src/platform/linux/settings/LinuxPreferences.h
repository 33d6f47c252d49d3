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
    // Files of that many domains are kept in memory; those of others are read each time, and changes in them are
    // not told.
    static constexpr std::size_t mostKeptDomains = 64;

    using ChangeHandler = std::function<void(std::string_view domain)>;

    LinuxPreferences(ConfigurationWatcher& watcher, ProviderLog log);

    // The last good value. A name that cannot be a domain (`isDomainName`) has none.
    [[nodiscard]] std::optional<foundation::Value> value(std::string_view domain, std::string_view key) const override;

    // From now on the handler is called, on the watcher's thread, with each domain in which a value changed, came
    // or went. At most once in the life of this object.
    void setChangeHandler(ChangeHandler handler);

    // Letters, digits, "-", "_" and ".", not beginning with ".", and short enough for the name of a file: such a
    // name cannot lead out of the directory.
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
    std::unique_ptr<ConfigurationWatcher::Watch> watch_; // ends first
};

} // namespace platform
