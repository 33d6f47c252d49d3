// SPDX-License-Identifier: Apache-2.0
// `kesto prefs`: shows and changes the preferences of the device, which the service adds to its sessions.
#include "foundation/values/Json.h"
#include "kesto/Commands.h"
#include "kesto/ServiceDirectories.h"
#include "kesto/Terminal.h"
#include "kesto/settings/PreferencesFile.h"
#include "kesto/settings/TomlText.h"
#include "platform/linux/settings/LinuxPreferences.h"

#include <algorithm>
#include <charconv>
#include <filesystem>
#include <fmt/format.h>
#include <functional>
#include <memory>
#include <stdexcept>
#include <string>

namespace {

using foundation::Value;

struct PrefsOptions {
    std::filesystem::path directory;
    std::string domain;
    std::string key;
    std::string value;
    bool isString = false;
    bool isJson = false;

    [[nodiscard]] PreferencesFile file() const { return {directory, domain}; }
};

void printLine(std::string_view text)
{
    fmt::print("{}\n", text);
}

std::string jsonOf(const Value& value)
{
    std::string json;
    if (!foundation::appendJson(value, json))
        throw std::runtime_error("a number is not finite, which JSON cannot express: try without --json");
    return json;
}

// A value as a person or a script wants it: text without quotes.
void get(const PrefsOptions& options)
{
    const PreferencesFile file = options.file();
    const foundation::Dictionary values = file.values();
    const Value* value = values.find(options.key);
    if (value == nullptr)
        throw file.noSuchKey(options.key);
    printLine(options.isJson ? jsonOf(*value) : shownText(*value));
}

bool isTooLargeInteger(std::string_view text)
{
    std::int64_t number = 0;
    const std::string_view digits = text.substr(text.starts_with('+') ? 1 : 0);
    const auto [end, error] = std::from_chars(digits.data(), digits.data() + digits.size(), number);
    return error == std::errc::result_out_of_range && end == digits.data() + digits.size();
}

// The value in TOML: unchanged if it is TOML, else as text. A value that looks like TOML but is not valid is refused
// rather than kept as text.
std::string spelling(const PrefsOptions& options)
{
    constexpr std::string_view beginnings = "\"'[{";
    const std::string_view text = options.value;
    if (options.isString)
        return tomlString(text);
    if (tomlValue(text))
        return options.value;
    if (!text.empty() && beginnings.contains(text.front()))
        throw std::runtime_error(
            fmt::format("{} begins like a TOML value but is not valid: correct it, or use --string", text));
    if (isTooLargeInteger(text))
        throw std::runtime_error(fmt::format("{} does not fit in 64 bits: use --string to keep it as text", text));
    return tomlString(text);
}

void set(const PrefsOptions& options)
{
    options.file().set(options.key, spelling(options));
}

void unset(const PrefsOptions& options)
{
    options.file().unset(options.key);
}

void list(const PrefsOptions& options)
{
    if (options.domain.empty()) {
        const std::vector<std::string> domains = PreferencesFile::domains(options.directory);
        if (options.isJson)
            printLine(jsonOf(foundation::Array({domains.begin(), domains.end()})));
        else
            std::ranges::for_each(domains, printLine);
        return;
    }
    const foundation::Dictionary values = options.file().values();
    if (options.isJson)
        return printLine(jsonOf(values));
    for (const auto& [key, value] : values) {
        std::string text;
        foundation::appendJsonText(value, text);
        printLine(printable(fmt::format("{} = {}", key.view(), text)));
    }
}

std::string wrongDomain(const std::string& name)
{
    if (platform::LinuxPreferences::isDomainName(name))
        return {};
    return "\"" + name + R"(" is not a domain: use letters, digits, "-", "_" and ".", not beginning with ".")";
}

class Verbs {
public:
    Verbs(CLI::App& command, int& exitStatus) : command_(command), exitStatus_(exitStatus) { }

    CLI::App* add(const std::string& name, const std::string& description,
                  const std::function<void(const PrefsOptions&)>& action)
    {
        CLI::App* verb = command_.add_subcommand(name, description);
        verb->add_option("--directory", options_->directory,
                         "The configuration directory, if it is not at its usual place");
        verb->add_option("DOMAIN", options_->domain, "Such as com.quarn.kesto")->required()->check(wrongDomain);
        verb->callback([options = options_, action, &exitStatus = exitStatus_] {
            if (options->directory.empty())
                options->directory = usualConfigurationDirectory();
            action(*options);
            exitStatus = exitOk;
        });
        return verb;
    }

    CLI::App* addWithKey(const std::string& name, const std::string& description,
                         const std::function<void(const PrefsOptions&)>& action)
    {
        CLI::App* verb = add(name, description, action);
        verb->add_option("KEY", options_->key, "Such as device_name")->required();
        return verb;
    }

    void addJson(CLI::App* verb) { verb->add_flag("--json", options_->isJson, "As JSON, for programs"); }

    [[nodiscard]] PrefsOptions& options() { return *options_; }

private:
    CLI::App& command_;
    int& exitStatus_;
    const std::shared_ptr<PrefsOptions> options_ = std::make_shared<PrefsOptions>();
};

} // namespace

void addPrefsCommand(CLI::App& application, int& exitStatus)
{
    CLI::App* command = application.add_subcommand("prefs", "Shows and changes the preferences of the device");
    requireSubcommand(*command);
    Verbs verbs(*command, exitStatus);
    verbs.addJson(verbs.addWithKey("get", "Prints the value of a key", get));
    CLI::App* setting = verbs.addWithKey("set", "Sets a key to a value", set);
    setting->add_option("VALUE", verbs.options().value, "true, 5, 0.5, \"text\", [1, 2] or any other TOML, else text")
        ->required();
    setting->add_flag("--string", verbs.options().isString, "VALUE is always text");
    verbs.addWithKey("unset", "Removes a key", unset);
    CLI::App* listing = verbs.add("list", "Lists the keys of a domain, or the domains", list);
    listing->get_option("DOMAIN")->required(false);
    verbs.addJson(listing);
    command->footer(R"(A running service notices each change:
  kesto prefs set com.quarn.kesto device_name "Kitchen radio"
  kesto prefs set com.quarn.halden spatial-audio-accessory-feature true
A VALUE that begins with "-" and is not a number must follow "--": kesto prefs set DOMAIN KEY -- -text)");
}
