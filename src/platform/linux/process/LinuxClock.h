// SPDX-License-Identifier: Apache-2.0
// The clocks of the kernel.
#pragma once

#include "platform/Clock.h"

namespace platform {

// Any thread.
class LinuxClock final : public Clock {
public:
    [[nodiscard]] double secondsSince1970() const override;
    [[nodiscard]] double systemUptime() const override;
};

} // namespace platform
