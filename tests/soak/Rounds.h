// SPDX-License-Identifier: Apache-2.0
// A round: some faults in random order under load, and then the sums of the ledger, which must hold.
#pragma once

#include "end_to_end/Kestod.h"
#include "end_to_end/Sums.h"
#include "soak/Faults.h"
#include "soak/Load.h"

#include <cstdint>
#include <map>
#include <string>
#include <string_view>
#include <vector>

namespace soak {

struct Options {
    std::uint64_t seconds = 600;
    std::uint32_t seed = 0;
    int clients = 3;
    std::vector<std::string> without = {}; // names of faults
};

// One thread.
class Rounds {
public:
    // Starts the service. Throws std::invalid_argument if `without` names an unknown fault.
    explicit Rounds(const Options& options);

    // The faults that this system or this user cannot cause.
    [[nodiscard]] const std::vector<std::string_view>& leftOut() const noexcept { return faults_.impossible; }

    // Runs the next round. What does not hold after it, one line each.
    [[nodiscard]] std::vector<std::string> next();

    [[nodiscard]] const std::vector<std::string_view>& faultsOfLastRound() const noexcept { return last_; }
    [[nodiscard]] const std::map<std::string_view, int>& times() const noexcept { return times_; } // of each fault
    [[nodiscard]] int count() const noexcept { return count_; }
    [[nodiscard]] int kills() const noexcept { return scene_.kills; }
    [[nodiscard]] const Known& known() const noexcept { return known_; }
    [[nodiscard]] const end_to_end::Kestod& kestod() const noexcept { return kestod_; }

private:
    [[nodiscard]] const Fault& choose();
    void happen(const Fault& fault);
    [[nodiscard]] std::vector<std::string> problems() const;

    const Options options_;
    end_to_end::Kestod kestod_{{{"analytics.toml", "maximum_size_mb = " + std::to_string(mostMegabytes) + "\n"}},
                               {{"KESTO_LOG", "error"}}};
    const end_to_end::SmallDisk disk_;
    Random random_; // chooses; each fault has numbers of its own, so that their choice depends on nothing else
    Scene scene_;
    Faults faults_;
    Known known_;
    std::vector<std::string_view> last_;
    std::map<std::string_view, int> times_;
    int count_ = 0;
};

} // namespace soak
