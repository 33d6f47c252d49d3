// SPDX-License-Identifier: Apache-2.0
// A part of long work on the server queue: between two parts, the calls of other clients run.
//
// A part is as long as a turn of several lanes, so that others wait no longer for it than for short calls; the change
// between lanes adds 3 to 5 % to it. It ends by the time and not after so many steps, because the clients decide how
// long a step takes.
#pragma once

#include "platform/Platform.h"
#include "platform/WorkQueue.h"

#include <chrono>
#include <memory>
#include <utility>

namespace utility {

// It begins when it is made. One thread.
class Slice {
public:
    static constexpr std::chrono::duration<double> longest{0.000'05};

    [[nodiscard]] bool isOver() const { return now() - began_ >= longest.count(); }

private:
    [[nodiscard]] static double now() { return platform::current().clock.systemUptime(); }
    const double began_ = now();
};

// Calls `step(turn)` until it returns false, and then `then(turn)`. If this takes long, items of other lanes run in
// between; the next ones of this lane wait. For an item of the lane, submitted by `submitLong`, as its last step.
template <typename Step, typename Then>
void inSlices(const std::shared_ptr<platform::Lane>& lane, platform::Turn& turn, Step step, Then then)
{
    const Slice slice;
    while (step(turn))
        if (slice.isOver())
            return lane->pause()([lane, step = std::move(step), then = std::move(then)](platform::Turn& next) mutable {
                inSlices(lane, next, std::move(step), std::move(then));
            });
    then(turn);
}

} // namespace utility
