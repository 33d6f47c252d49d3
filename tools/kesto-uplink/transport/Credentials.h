// SPDX-License-Identifier: Apache-2.0
// The name under which a device speaks to the fleet's servers, and its proof: a password or a key. They stand in a TOML
// file of their own, which no other user may read, so that the configuration itself can be shown to anybody.
#pragma once

#include <filesystem>
#include <stdexcept>
#include <string>

namespace kesto_uplink {

struct Credentials {
    std::string name = {}; // a token of a subject: letters, digits, - and _
    std::string password = {}; // empty with a key
    std::string publicKey = {}; // NKey, U...
    std::string seed = {}; // of that key, SU...
    bool isPlain = false; // may be used without encryption
};

// A line for a person.
class CredentialsError : public std::runtime_error {
public:
    using std::runtime_error::runtime_error;
};

// Throws CredentialsError.
[[nodiscard]] Credentials readCredentials(const std::filesystem::path& file);

} // namespace kesto_uplink
