// SPDX-License-Identifier: Apache-2.0
// The life of the service: rounds, and the sleep between them. An idle device is not woken: the uplink then sleeps
// until the store's files change.
#pragma once

#include "kesto-uplink/rounds/Round.h"
#include "kesto-uplink/rounds/Schedule.h"

#include <functional>
#include <optional>
#include <string>

namespace kesto_uplink {

class Sleep {
public:
    virtual ~Sleep() = default;
    // Both are false when the program was told to end.
    [[nodiscard]] virtual bool sleep(double seconds) = 0;
    // Returns when the store changes, or has changed since this was called last.
    [[nodiscard]] virtual bool untilNews() = 0;
};

// Returns when the program was told to end.
void runRounds(const std::function<RoundResult()>& round, Schedule& schedule, Sleep& sleep,
               const std::function<void(const RoundResult&)>& report);

// Which results a person should read in the log: what changes, not what lasts.
class Diary {
public:
    [[nodiscard]] std::optional<std::string> line(const RoundResult& result);

private:
    std::string last_; // that was told, without the names of servers
    Outcome lastOutcome_ = Outcome::Sent;
};

} // namespace kesto_uplink
