// SPDX-License-Identifier: Apache-2.0
// A real kestod with a real kesto-uplink, and clients that play something.
#pragma once

#include "end_to_end/Kestod.h"
#include "end_to_end/WireClient.h"
#include "fleet/RealUplink.h"

#include <filesystem>
#include <memory>
#include <string>

namespace fleet {

// One thread.
class RealDevice {
public:
    RealDevice(const std::filesystem::path& directory, const std::string& credential, const std::string& servers);

    // So many sessions that play for a moment. Returns when the store has all.
    void play(int sessions);
    [[nodiscard]] RealUplink& uplink() { return *uplink_; }
    [[nodiscard]] Chapter chapter() const { return uplink_->chapter(); }

private:
    [[nodiscard]] std::filesystem::path store() const { return kestod_.directory() / "state" / "analytics.sqlite3"; }
    void say(int number);

    end_to_end::Kestod kestod_;
    std::unique_ptr<end_to_end::WireClient> witness_; // has a session that does not end
    int sessions_ = 0;
    int said_ = 0;
    std::unique_ptr<RealUplink> uplink_;
};

} // namespace fleet
