// SPDX-License-Identifier: Apache-2.0
// The end of a session leaves with the next row. So another client, whose session goes on, always has the last word.
#include "fleet/RealDevice.h"

#include "support/MessageKinds.h"

#include <ctime>
#include <fmt/format.h>
#include <stdexcept>

namespace fleet {

namespace {

using end_to_end::WireClient;
using foundation::Array;
using foundation::Dictionary;

constexpr int witness = 1;
constexpr const char* timeKey = "kestoreporting_timestamp";
constexpr const char* applicationKey = "HostApplicationDisplayID";

} // namespace

RealDevice::RealDevice(const std::filesystem::path& directory, const std::string& credential,
                       const std::string& servers)
{
    kestod_.startAndAwait();
    witness_ = std::make_unique<WireClient>(kestod_.socketPath());
    witness_->ask(end_to_end::Create, witness);
    witness_->ask(end_to_end::SetConfiguration, Dictionary{{applicationKey, "org.example.Witness"}}, witness);
    say(0);
    uplink_ = std::make_unique<RealUplink>(directory, store(), credential, servers);
    uplink_->start();
}

void RealDevice::play(int sessions)
{
    using namespace end_to_end;
    WireClient player(kestod_.socketPath());
    for (int count = 0; count < sessions; ++count) {
        const int session = ++sessions_;
        const auto send = [&](const Dictionary& payload, int category, int type) {
            player.ask(SendMessage, payload, category, type, Array{session});
        };
        player.ask(Create, session);
        player.ask(SetConfiguration, Dictionary{{applicationKey, "org.example.Player"}}, session);
        player.call(Start, session); // is answered when the session ends
        const double now = static_cast<double>(std::time(nullptr));
        send({{"session_output_running", true}, {"PomoSessionVolume", 0.5}, {timeKey, now - 60}}, support::playback,
             support::typeStart);
        send({{"PomoSessionVolume", 0.25}, {timeKey, now - 40}}, support::volume, support::typeState);
        send({{"late_cycles", session % 150}, {timeKey, now - 30}}, support::errorCategory, support::typeIssueDetector);
        send({{"session_output_running", false}, {timeKey, now - 10}}, support::playback, support::typeStop);
        player.call(Stop, session);
        const std::uint64_t last = player.call(Destroy, session);
        while (player.nextReply().value()[0] != foundation::Value(last)) { }
    }
    say(++said_);
}

// With a number of its own each time, since the service drops repeated messages.
void RealDevice::say(int number)
{
    witness_->ask(end_to_end::SendMessage, Dictionary{{"number", number}}, support::setup, support::typeState,
                  Array{witness});
    const std::string query = fmt::format(
        "SELECT count(*) FROM events WHERE name GLOB 'com.quarn.kesto.*' AND payload ->> '$.number' = {}", number);
    if (!end_to_end::waitUntil([&] { return kestod_.query(query).at(0) == "1"; }))
        throw std::runtime_error("a real kestod does not store what a client says");
}

} // namespace fleet
