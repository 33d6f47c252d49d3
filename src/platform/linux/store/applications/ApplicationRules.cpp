// SPDX-License-Identifier: Apache-2.0
// Where a payload names its application: under one key in every message, and under another in the event with which the
// service reports that a client has gone.
#include "platform/linux/store/applications/ApplicationRules.h"

#include "platform/linux/settings/CheckedSettings.h"
#include "platform/linux/settings/TomlFile.h"
#include "platform/linux/store/AnalyticsConfiguration.h"

#include <array>
#include <string_view>
#include <tuple>

namespace platform {

using foundation::Dictionary;
using foundation::Value;

namespace {

constexpr std::array<std::string_view, 2> namingKeys = {"HostApplicationDisplayID", "processName"};

constexpr std::string_view patterns = "a list of patterns such as [\"org.example.*\"]";

constexpr Setting<ApplicationsConfiguration> settings[] = {
    {"not_stored", patterns,
     [](const Value& value, ApplicationsConfiguration& rules) { return readStrings(value, rules.notStored); }},
    {"hashed", patterns,
     [](const Value& value, ApplicationsConfiguration& rules) { return readStrings(value, rules.hashed); }}};

} // namespace

CheckedApplicationsConfiguration readApplicationsConfiguration(const Dictionary& values)
{
    CheckedApplicationsConfiguration checked;
    checked.problems = readSettings<ApplicationsConfiguration>(values, settings, checked.configuration);
    return checked;
}

std::optional<std::string> ApplicationRules::shown(const std::string& name) const
{
    if (matchesAny(configuration_.notStored, name))
        return std::nullopt;
    return matchesAny(configuration_.hashed, name) ? pseudonyms_->of(name) : name;
}

std::optional<Dictionary> ApplicationRules::shown(const Dictionary& payload) const
{
    Dictionary result = payload;
    for (const std::string_view key : namingKeys) {
        const Value* const name = payload.find(key);
        if (name == nullptr || name->kind() != Value::Kind::String)
            continue;
        auto asShown = shown(name->text());
        if (!asShown)
            return std::nullopt;
        if (*asShown != name->text())
            result = result.with(key, *std::move(asShown));
    }
    return result;
}

void ApplicationRules::hideNames(OriginAnnouncements& announcements) const
{
    for (SourceBegin& source : announcements.sources)
        source.processName = shown(source.processName).value_or(std::string());
    for (SessionBegin& session : announcements.sessions)
        session.application = shown(session.application).value_or(std::string());
}

std::unique_ptr<const ApplicationRules> loadApplicationRules(const std::filesystem::path& configurationDirectory,
                                                             const std::filesystem::path& stateDirectory,
                                                             ProviderLog log)
{
    TomlFile file(configurationDirectory / "applications.toml", log);
    std::ignore = file.reload();
    auto [configuration, problems] = readApplicationsConfiguration(file.values());
    logProblems(file.path(), problems, log);
    if (configuration.empty())
        return nullptr;
    auto pseudonyms = configuration.hashed.empty() ? nullptr : std::make_shared<const Pseudonyms>(stateDirectory, log);
    return std::make_unique<const ApplicationRules>(std::move(configuration), std::move(pseudonyms));
}

} // namespace platform
