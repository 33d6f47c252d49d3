// SPDX-License-Identifier: Apache-2.0
// The files of the uplink and the store that it reads. The unit's environment comes first, with systemd's names.
#pragma once

#include <filesystem>

namespace kesto_uplink {

struct Places {
    std::filesystem::path configuration; // $CONFIGURATION_DIRECTORY/uplink.toml, else /etc/kesto/uplink.toml
    std::filesystem::path database; // the event store; /var/lib/kesto/analytics.sqlite3
    std::filesystem::path state; // the uplink's directory: $STATE_DIRECTORY, else /var/lib/kesto-uplink
};

[[nodiscard]] Places usualPlaces();

} // namespace kesto_uplink
