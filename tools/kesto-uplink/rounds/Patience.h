// SPDX-License-Identifier: Apache-2.0
// How long the device has waited for the fleet to confirm more. It is kept in a small file, so that devices that are
// switched off each night have patience for a day, too, and no longer.
#pragma once

#include "kesto-uplink/state/State.h"

#include <chrono>
#include <filesystem>
#include <utility>

namespace kesto_uplink {

// One thread. A file that cannot be written makes the wait begin anew with the next start, which loses nothing.
class Patience {
public:
    // Longer than a fleet's database is out of order, and short beside what a store keeps.
    static constexpr std::chrono::hours limit{24};

    explicit Patience(std::filesystem::path file) : file_(std::move(file)) { }

    // More than `stored` is sent. Goes on waiting if it was so before, with the same `stored`, and the clock was not
    // set back since; else the wait begins now.
    void wait(const Cursor& stored, double now);
    // Whether that has been so for longer than the limit.
    [[nodiscard]] bool isOver(const Cursor& stored, double now) const;
    // Nothing is waited for, or it is sent again.
    void rest();

private:
    std::filesystem::path file_;
};

} // namespace kesto_uplink
