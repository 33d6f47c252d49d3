// SPDX-License-Identifier: Apache-2.0
// The facts and settings of a device, as a test sets them: preferences, feature flags, device properties and the
// process table.
#pragma once

#include "platform/DeviceProperties.h"
#include "platform/FeatureFlags.h"
#include "platform/Preferences.h"
#include "platform/ProcessTable.h"
#include "support/PrintValues.h"

#include <map>
#include <set>
#include <string>
#include <utility>
#include <vector>

namespace support {

// One thread, as are all of these.
class FakePreferences final : public platform::Preferences {
public:
    void set(std::string domain, std::string key, foundation::Value value)
    {
        values_.insert_or_assign({std::move(domain), std::move(key)}, std::move(value));
    }
    void remove(const std::string& domain, const std::string& key) { values_.erase({domain, key}); }

    [[nodiscard]] std::optional<foundation::Value> value(std::string_view domain, std::string_view key) const override
    {
        const auto found = values_.find({std::string(domain), std::string(key)});
        return found == values_.end() ? std::nullopt : std::optional(found->second);
    }

private:
    std::map<std::pair<std::string, std::string>, foundation::Value> values_;
};

class FakeFeatureFlags final : public platform::FeatureFlags {
public:
    void enable(std::string domain, std::string flag) { enabled_.emplace(std::move(domain), std::move(flag)); }
    void disable(const std::string& domain, const std::string& flag) { enabled_.erase({domain, flag}); }

    [[nodiscard]] bool isEnabled(std::string_view domain, std::string_view flag) const override
    {
        return enabled_.contains({std::string(domain), std::string(flag)});
    }

private:
    std::set<std::pair<std::string, std::string>> enabled_;
};

class FakeDeviceProperties final : public platform::DeviceProperties {
public:
    void set(std::string name, bool value) { values_.insert_or_assign(std::move(name), value); }
    void setInternalBuild(bool isInternal) { set("InternalBuild", isInternal); }
    [[nodiscard]] int timesAsked(const std::string& name) const { return asked_[name]; }

    [[nodiscard]] std::optional<bool> boolean(std::string_view name) const override
    {
        ++asked_[std::string(name)];
        const auto found = values_.find(std::string(name));
        return found == values_.end() ? std::nullopt : std::optional(found->second);
    }

private:
    std::map<std::string, bool> values_;
    mutable std::map<std::string, int> asked_;
};

class FakeProcessTable final : public platform::ProcessTable {
public:
    static constexpr std::int32_t ownPID = 900;
    static constexpr const char* ownName = "kestod";

    // Adds a process of that name, which is cut to the kernel's 15 bytes.
    void add(std::int32_t processIdentifier, std::string name);
    void remove(std::int32_t processIdentifier) { names_.erase(processIdentifier); }
    // The processes that were forgotten, in order.
    [[nodiscard]] const std::vector<std::int32_t>& forgotten() const { return forgotten_; }

    [[nodiscard]] std::int32_t ownProcessIdentifier() const override { return ownPID; }
    [[nodiscard]] std::string ownProcessName() const override { return ownName; }
    [[nodiscard]] std::optional<platform::ProcessTableEntry> entry(std::int32_t processIdentifier) const override
    {
        const auto found = names_.find(processIdentifier);
        if (found == names_.end())
            return std::nullopt;
        return platform::ProcessTableEntry{processIdentifier, found->second};
    }
    void forget(std::int32_t processIdentifier) override { forgotten_.push_back(processIdentifier); }

private:
    std::map<std::int32_t, std::string> names_{{ownPID, ownName}};
    std::vector<std::int32_t> forgotten_;
};

} // namespace support
