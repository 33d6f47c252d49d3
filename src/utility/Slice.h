// A part of long work on the server queue: between two parts, the calls of other clients run.
//
// A part is a little longer than a turn, so that the change between lanes costs next to nothing. It ends by the time
// and not after so many steps, because the clients decide how long a step takes.
#pragma once

#include "platform/Platform.h"

#include <chrono>

namespace utility {

// It begins when it is made. One thread.
class Slice {
public:
    static constexpr std::chrono::duration<double> longest{0.000'2};

    [[nodiscard]] bool isOver() const { return now() - began_ >= longest.count(); }

private:
    [[nodiscard]] static double now() { return platform::current().clock.systemUptime(); }
    const double began_ = now();
};

} // namespace utility
