// SPDX-License-Identifier: Apache-2.0
// A clock that stands still until a test moves it.
#pragma once

#include "platform/Clock.h"

namespace support {

// One thread.
class FakeClock final : public platform::Clock {
public:
    void set(double secondsSince1970) { secondsSince1970_ = secondsSince1970; }
    void setSystemUptime(double seconds) { systemUptime_ = seconds; }
    // Lets time pass for both.
    void advance(double seconds)
    {
        secondsSince1970_ += seconds;
        systemUptime_ += seconds;
    }
    // Lets so much uptime pass whenever it is asked for.
    void setPaceOfSystemUptime(double seconds) { pace_ = seconds; }

    [[nodiscard]] double secondsSince1970() const override { return secondsSince1970_; }
    [[nodiscard]] double systemUptime() const override { return systemUptime_ += pace_; }

private:
    double secondsSince1970_ = 1'000'000'000;
    mutable double systemUptime_ = 5000;
    double pace_ = 0;
};

} // namespace support
