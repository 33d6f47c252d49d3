// SPDX-License-Identifier: Apache-2.0
// Asked anew each time, over a connection of its own: rounds are rare, and a connection that is kept would wake the
// program with other messages of the bus.
#include "kesto-uplink/rounds/Metered.h"

#include <systemd/sd-bus.h>

#include <memory>

namespace kesto_uplink {

Metered networkIsMetered()
{
    constexpr std::uint64_t limit = 2'000'000; // microseconds
    constexpr unsigned yes = 1; // NM_METERED_YES and NM_METERED_GUESS_YES
    constexpr unsigned guessedYes = 3;
    constexpr unsigned unknown = 0;
    sd_bus* opened = nullptr;
    if (sd_bus_open_system(&opened) < 0)
        return Metered::Unknown;
    const std::unique_ptr<sd_bus, decltype(&sd_bus_flush_close_unref)> bus(opened, &sd_bus_flush_close_unref);
    sd_bus_message* asked = nullptr;
    sd_bus_message* answered = nullptr;
    unsigned value = unknown;
    int status =
        sd_bus_message_new_method_call(bus.get(), &asked, "org.freedesktop.NetworkManager",
                                       "/org/freedesktop/NetworkManager", "org.freedesktop.DBus.Properties", "Get");
    if (status >= 0)
        status = sd_bus_message_set_auto_start(asked, 0); // a question starts no service
    if (status >= 0)
        status = sd_bus_message_append(asked, "ss", "org.freedesktop.NetworkManager", "Metered");
    if (status >= 0)
        status = sd_bus_call(bus.get(), asked, limit, nullptr, &answered);
    if (status >= 0)
        status = sd_bus_message_read(answered, "v", "u", &value);
    sd_bus_message_unref(asked);
    sd_bus_message_unref(answered);
    if (status < 0 || value == unknown)
        return Metered::Unknown;
    return value == yes || value == guessedYes ? Metered::Yes : Metered::No;
}

} // namespace kesto_uplink
