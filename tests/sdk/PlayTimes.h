// SPDX-License-Identifier: Apache-2.0
// How a test sees the play times of a program that links the library: the program's surroundings, and what a real
// service stored.
#pragma once

#include "end_to_end/Kestod.h"
#include "sdk/Process.h"

#include <string>
#include <vector>

namespace sdk_test {

// The configuration of a service that computes play times.
[[nodiscard]] inline end_to_end::Kestod::Files internalBuild()
{
    return {{"device.toml", "InternalBuild = true\n"}};
}

// The environment in which a program's clocks move only when it sleeps, and then at once (SleeplessClock.cpp).
[[nodiscard]] inline Process::Environment surroundings(const end_to_end::Kestod& service)
{
    return {"KESTO_SOCKET=" + service.socketPath().string(), "LD_PRELOAD=" SLEEPLESS_CLOCK};
}

// The stretches of playing, such as "2.0 s at 0.5 on speaker as S16LE/44100/2, 2 channels, by org.example.player".
// Waits for so many.
[[nodiscard]] inline std::vector<std::string> playTimes(const end_to_end::Kestod& service, std::size_t count)
{
    static_cast<void>(service.waitForEvents("com.quarn.kesto.Volume.Summary", count));
    return service.query("SELECT printf('%.1f s at %g on %s as %s, %d channels, by %s', payload ->> '$.play_seconds', "
                         "payload ->> '$.PomoSessionVolume', payload ->> '$.active_devices', "
                         "payload ->> '$.session_selected_format', payload ->> '$.mChannelsPerFrame', "
                         "payload ->> '$.HostApplicationDisplayID') FROM events "
                         "WHERE name = 'com.quarn.kesto.Volume.Summary' ORDER BY id");
}

// The messages with the value of this key, such as "Volume.State 0.5". Waits for so many.
[[nodiscard]] inline std::vector<std::string> messagesWith(const end_to_end::Kestod& service, const std::string& key,
                                                           std::size_t count)
{
    const std::string condition = "name LIKE 'com.quarn.kesto.%' AND name NOT LIKE '%.Summary' AND payload ->> '$."
        + key + "' IS NOT NULL ORDER BY id";
    const auto read = [&] {
        return service.query("SELECT substr(name, 17) || ' ' || round(payload ->> '$." + key
                             + "', 1) FROM events WHERE " + condition);
    };
    static_cast<void>(end_to_end::waitUntil([&] { return read().size() >= count; }));
    return read();
}

} // namespace sdk_test
