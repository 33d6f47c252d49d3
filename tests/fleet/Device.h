// SPDX-License-Identifier: Apache-2.0
// One made-up device: a real store file, and the uplink's own code on it. It lives in a thread of the trial in place of
// a process, so that a thousand of them fit on one machine.
#pragma once

#include "fleet/Truth.h"
#include "kesto-uplink/rounds/Patience.h"
#include "kesto-uplink/rounds/Round.h"
#include "kesto-uplink/rules/UplinkConfiguration.h"
#include "kesto-uplink/state/State.h"
#include "kesto-uplink/transport/Credentials.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <string>
#include <vector>

namespace fleet {

// What all devices of the trial may let leave, as the lines of an uplink.toml behind its first keys.
extern const char* const rules;

// One thread at a time.
class Device {
public:
    Device(std::filesystem::path directory, const std::string& credential, std::vector<std::string> servers);

    // Its weeks, as a service kept them.
    void makeStore(std::uint32_t seed, std::size_t sessions);
    // The database is lost, and begun anew with other weeks. What was sent of the earlier one stays in the truth.
    void beginStoreAnew(std::uint32_t seed, std::size_t sessions);
    // So many more sessions, in which something is played.
    void live(int sessions);

    void useServers(std::vector<std::string> servers) { servers_ = std::move(servers); }
    // The clock of the device, beside the true time. What it stores and sends has this time.
    void setClock(double secondsAhead) { secondsAhead_ = secondsAhead; }
    // It goes on under another name, and with a copy of what another device remembers.
    void stealFrom(const Device& victim);
    void keepCopyOfState() const;
    void goBackToCopyOfState();

    kesto_uplink::RoundResult round(std::chrono::milliseconds waitForConfirmation = std::chrono::seconds(2));
    // Rounds, until the stream has all that may leave. Throws if that takes too long.
    void sendAll(std::chrono::milliseconds waitForConfirmation = std::chrono::seconds(2));
    // The same, and until the device has heard that all is stored. A device without news does not ask, so it gets some.
    void sendAllAndHear();
    [[nodiscard]] bool isAllSent();

    // What must be in the database.
    [[nodiscard]] const Chapters& chapters() const { return chapters_; }
    [[nodiscard]] std::filesystem::path store() const;
    [[nodiscard]] std::filesystem::path state() const { return directory_ / "state"; }

private:
    [[nodiscard]] double now() const;
    void noteChapter(const std::string& pseudonym, std::int64_t before);
    [[nodiscard]] bool hasHeard();
    void sendUntil(const std::function<bool()>& isDone, std::chrono::milliseconds waitForConfirmation);

    const std::filesystem::path directory_;
    const kesto_uplink::Credentials credentials_;
    const kesto_uplink::UplinkConfiguration configuration_;
    std::vector<std::string> servers_;
    double secondsAhead_ = 0;
    Chapters chapters_;
};

} // namespace fleet
