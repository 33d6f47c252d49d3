// SPDX-License-Identifier: Apache-2.0
// Names under which the store keeps applications that it must not know: a keyed hash. The same application has the same
// pseudonym, so that its sessions can be counted, and without the key no one can try which name yields it.
//
// The key is random and lies beside the store, readable by the service alone. A service that starts without it makes
// another key: no one can connect its pseudonyms to the earlier ones.
#pragma once

#include "platform/linux/log/ProviderLog.h"

#include <filesystem>
#include <string>
#include <string_view>

namespace platform {

// Any thread; nothing changes after the constructor.
class Pseudonyms {
public:
    static constexpr std::string_view fileName = "applications.key";

    // Reads the key of the directory, or makes it. Without a key that lasts, it takes one that this process forgets,
    // and logs why.
    Pseudonyms(const std::filesystem::path& directory, ProviderLog log);
    // With this key.
    explicit Pseudonyms(std::string key) : key_(std::move(key)) { }

    // "app-" and the name's `keyedHash`.
    [[nodiscard]] std::string of(std::string_view name) const;

private:
    std::string key_;
};

} // namespace platform
