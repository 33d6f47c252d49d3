// SPDX-License-Identifier: Apache-2.0
// A clock that stands still until a test moves it; other threads may read it meanwhile.
#pragma once

#include "platform/Clock.h"

#include <atomic>

namespace support {

class ManualClock final : public platform::Clock {
public:
    void set(double secondsSince1970) { secondsSince1970_ = secondsSince1970; }
    void advance(double seconds)
    {
        secondsSince1970_ = secondsSince1970_ + seconds;
        systemUptime_ = systemUptime_ + seconds;
    }

    [[nodiscard]] double secondsSince1970() const override { return secondsSince1970_; }
    [[nodiscard]] double systemUptime() const override { return systemUptime_; }

private:
    std::atomic<double> secondsSince1970_ = 1'800'000'000;
    std::atomic<double> systemUptime_ = 5000;
};

} // namespace support
