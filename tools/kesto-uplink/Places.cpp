// SPDX-License-Identifier: Apache-2.0
// A device has one uplink, so there are no places of a user's own.
#include "kesto-uplink/Places.h"

#include "kesto-uplink/Commands.h"
#include "platform/linux/process/Environment.h"

#include <string>

namespace kesto_uplink {

namespace {

// The first of the variable's directories, because systemd passes several when a unit has several.
std::filesystem::path directoryIn(const char* variable, const std::filesystem::path& usual)
{
    const std::string value = platform::environment(variable);
    return value.empty() ? usual : std::filesystem::path(value.substr(0, value.find(':')));
}

} // namespace

Places usualPlaces()
{
    return {.configuration = directoryIn("CONFIGURATION_DIRECTORY", "/etc/kesto") / "uplink.toml",
            .database = "/var/lib/kesto/analytics.sqlite3",
            .state = directoryIn("STATE_DIRECTORY", "/var/lib/kesto-uplink")};
}

void addPlaceOptions(CLI::App& command, Places& places)
{
    places = usualPlaces();
    command.add_option("--configuration", places.configuration, "The rules, if they are not in /etc/kesto/uplink.toml");
    command.add_option("--database", places.database, "The event store, if it is not /var/lib/kesto/analytics.sqlite3");
    command.add_option("--state", places.state,
                       "The directory of the uplink's state, if it is not /var/lib/kesto-uplink");
}

} // namespace kesto_uplink
