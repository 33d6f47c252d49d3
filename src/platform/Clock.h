// SPDX-License-Identifier: Apache-2.0
// Time, as a service, so that no test sleeps to make it pass.
#pragma once

namespace platform {

// Any thread.
class Clock {
public:
    virtual ~Clock() = default;
    // Seconds since 1970 UTC; may be set back and forth by the device's owner.
    [[nodiscard]] virtual double secondsSince1970() const = 0;
    // Seconds since the device started, time asleep included. Never goes back.
    [[nodiscard]] virtual double systemUptime() const = 0;
};

} // namespace platform
