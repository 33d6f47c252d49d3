// SPDX-License-Identifier: Apache-2.0
// A platform like another except for a few providers: for tests and measurements that want some of them real, slow, or
// watched.
#pragma once

#include "platform/Platform.h"

#include <cassert>
#include <type_traits>

namespace support {

// Each given provider replaces the one with the same interface.
template <typename... Providers>
[[nodiscard]] platform::Platform withExchanged(const platform::Platform& platform, Providers&... exchanged)
{
    [[maybe_unused]] std::size_t matches = 0;
    const auto pick = [&]<typename Interface>(Interface& provider) -> Interface& {
        Interface* picked = &provider;
        const auto exchange = [&]<typename Provider>(Provider& other) {
            if constexpr (std::is_base_of_v<Interface, Provider>) {
                picked = &other;
                ++matches;
            }
        };
        (exchange(exchanged), ...);
        return *picked;
    };
    const platform::Platform result{.log = pick(platform.log),
                                    .ledger = pick(platform.ledger),
                                    .clock = pick(platform.clock),
                                    .workQueues = pick(platform.workQueues),
                                    .preferences = pick(platform.preferences),
                                    .featureFlags = pick(platform.featureFlags),
                                    .deviceProperties = pick(platform.deviceProperties),
                                    .processTable = pick(platform.processTable),
                                    .notifications = pick(platform.notifications),
                                    .analytics = pick(platform.analytics),
                                    .traceEmitter = pick(platform.traceEmitter),
                                    .reportingChannels = pick(platform.reportingChannels),
                                    .bugCapture = pick(platform.bugCapture),
                                    .kernelTrace = pick(platform.kernelTrace),
                                    .performanceWriter = pick(platform.performanceWriter),
                                    .fileSystem = pick(platform.fileSystem),
                                    .memory = pick(platform.memory)};
    assert(matches == sizeof...(exchanged) && "one of them has no interface of a provider");
    return result;
}

} // namespace support
