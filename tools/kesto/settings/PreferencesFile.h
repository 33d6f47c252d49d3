// One domain's preferences, for changing: preferences/<domain>.toml in the configuration directory, in the form in
// which the service reads it. A change is made in one step and under a lock, so that two who change different keys at
// once both get their way.
#pragma once

#include "foundation/values/Value.h"

#include <filesystem>
#include <string>
#include <string_view>
#include <vector>

// Whatever cannot be done is a std::runtime_error with a line for a person.
class PreferencesFile {
public:
    // The domain must be the name of one (`LinuxPreferences::isDomainName`).
    PreferencesFile(std::filesystem::path configurationDirectory, std::string_view domain);

    // All keys, sorted. There must be such a file.
    [[nodiscard]] foundation::Dictionary values() const;
    // Sets the key to a value given as TOML, and makes the file if there is none.
    void set(std::string_view key, std::string_view toml) const;
    // Removes the key, which must be there.
    void unset(std::string_view key) const;

    // The error that the domain lacks the key.
    [[nodiscard]] std::runtime_error noSuchKey(std::string_view key) const;

    // The domains that have a file, sorted.
    [[nodiscard]] static std::vector<std::string> domains(const std::filesystem::path& configurationDirectory);

private:
    [[nodiscard]] bool exists() const;
    // What the file says, TOML for sure.
    [[nodiscard]] std::string read() const;
    void write(const std::string& before, const std::string& after) const;

    const std::filesystem::path configurationDirectory_;
    const std::filesystem::path directory_;
    const std::string domain_;
    const std::filesystem::path path_;
};
