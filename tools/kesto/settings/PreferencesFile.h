// SPDX-License-Identifier: Apache-2.0
// The room of settings: the commands that change preferences and post notifications. It writes to the configuration
// directory and to the folder of notifications. The service watches both.
//
// One domain's preferences, for changing: preferences/<domain>.toml in the configuration directory, in the form in
// which the service reads it. A change is made in one step and under a lock, so that two programs can change different
// keys at the same time.
#pragma once

#include "foundation/values/Value.h"

#include <filesystem>
#include <string>
#include <string_view>
#include <vector>

// Every failure is a std::runtime_error with a line for a person.
class PreferencesFile {
public:
    // The domain must be valid (`LinuxPreferences::isDomainName`).
    PreferencesFile(std::filesystem::path configurationDirectory, std::string_view domain);

    // All keys, sorted. The file must exist.
    [[nodiscard]] foundation::Dictionary values() const;
    // Sets the key to a value given as TOML, and makes the file if it is missing.
    void set(std::string_view key, std::string_view toml) const;
    // Removes the key, which must exist.
    void unset(std::string_view key) const;

    // The error that the domain lacks the key.
    [[nodiscard]] std::runtime_error noSuchKey(std::string_view key) const;

    // The domains that have a file, sorted.
    [[nodiscard]] static std::vector<std::string> domains(const std::filesystem::path& configurationDirectory);

private:
    [[nodiscard]] bool exists() const;
    // The content of the file, which is checked to be TOML.
    [[nodiscard]] std::string read() const;
    void write(const std::string& before, const std::string& after) const;

    const std::filesystem::path configurationDirectory_;
    const std::filesystem::path directory_;
    const std::string domain_;
    const std::filesystem::path path_;
};
