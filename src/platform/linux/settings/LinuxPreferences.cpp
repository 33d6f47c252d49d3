// SPDX-License-Identifier: Apache-2.0
// To notice a change the provider must know the earlier values. So a change handler makes it read all existing files;
// all other files are read on demand.
#include "platform/linux/settings/LinuxPreferences.h"

#include <algorithm>
#include <vector>

namespace platform {
namespace {

constexpr std::string_view extension = ".toml";
constexpr std::size_t longestFileName = 255;

// The domain of a file of that name, or nothing.
std::optional<std::string_view> domainOf(std::string_view fileName)
{
    if (!fileName.ends_with(extension))
        return std::nullopt;
    fileName.remove_suffix(extension.size());
    return LinuxPreferences::isDomainName(fileName) ? std::optional(fileName) : std::nullopt;
}

} // namespace

bool LinuxPreferences::isDomainName(std::string_view name) noexcept
{
    constexpr std::string_view allowed = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789-_.";
    return !name.empty() && name.front() != '.' && name.size() + extension.size() <= longestFileName
        && name.find_first_not_of(allowed) == std::string_view::npos;
}

LinuxPreferences::LinuxPreferences(ConfigurationWatcher& watcher, ProviderLog log)
    : directory_(watcher.root() / "preferences"),
      log_(log),
      watch_(watcher.watch("preferences", [this](std::string_view fileName) { handleChange(fileName); }))
{
}

std::filesystem::path LinuxPreferences::path(std::string_view domain) const
{
    return directory_ / std::string(domain).append(extension);
}

std::optional<foundation::Value> LinuxPreferences::value(std::string_view domain, std::string_view key) const
{
    const auto valueIn = [key](const TomlFile& file) {
        const foundation::Value* found = file.values().find(key);
        return found == nullptr ? std::nullopt : std::optional(*found);
    };
    if (!isDomainName(domain))
        return std::nullopt;
    const foundation::Lock lock(lock_);
    if (const auto known = files_.find(domain); known != files_.end())
        return valueIn(known->second);
    TomlFile file(path(domain), log_);
    file.reload();
    auto value = valueIn(file);
    if (files_.size() < mostKeptDomains)
        files_.emplace(domain, std::move(file));
    return value;
}

void LinuxPreferences::setChangeHandler(ChangeHandler handler)
{
    const foundation::Lock lock(lock_);
    changeHandler_ = std::move(handler);
    for (const std::string& domain : domainsThatAreThere()) // changes are noticed only against known values
        reload(domain);
}

// Whether the domain's values changed; false for a domain that is not kept in memory.
bool LinuxPreferences::reload(const std::string& domain)
{
    auto known = files_.find(domain);
    if (known == files_.end()) {
        if (!changeHandler_ || files_.size() >= mostKeptDomains)
            return false;
        known = files_.try_emplace(domain, path(domain), log_).first;
    }
    return known->second.reload();
}

void LinuxPreferences::handleChange(std::string_view fileName)
{
    std::vector<std::string> changed;
    ChangeHandler handler;
    {
        const foundation::Lock lock(lock_);
        std::set<std::string> concerned;
        if (fileName.empty()) {
            concerned = domainsThatAreThere();
            for (const auto& [domain, file] : files_)
                concerned.insert(domain);
        } else if (const auto domain = domainOf(fileName)) {
            concerned.emplace(*domain);
        }
        std::ranges::copy_if(concerned, std::back_inserter(changed),
                             [this](const std::string& domain) KESTO_REQUIRES(lock_) { return reload(domain); });
        handler = changeHandler_;
    }
    if (handler)
        std::ranges::for_each(changed, handler);
}

std::set<std::string> LinuxPreferences::domainsThatAreThere() const
{
    std::set<std::string> domains;
    std::error_code error;
    for (std::filesystem::directory_iterator file(directory_, error); file != end(file); file.increment(error)) {
        const std::string fileName = file->path().filename();
        if (const auto domain = domainOf(fileName))
            domains.emplace(*domain);
    }
    return domains;
}

} // namespace platform
