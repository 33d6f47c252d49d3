// SPDX-License-Identifier: Apache-2.0
// The room of transport: how batches reach the fleet's servers, and what the servers answer.
//
// The interface has a few calls, each with a time limit, and an answer of five kinds. The kinds differ in what the
// device does next: it goes on, tries again soon, or waits long because only a person can help. Nothing on the device
// depends on NATS but the provider of this interface.
#pragma once

#include <chrono>
#include <cstdint>
#include <expected>
#include <optional>
#include <string>
#include <string_view>

namespace kesto_uplink {

struct Answer {
    enum class Kind : std::uint8_t {
        Stored, // the stream has it
        Away, // no server answers within the time limit
        Full, // the stream takes nothing more for now, and has taken nothing of this
        Refused, // not before a person changes something: rights, password, certificate, configuration
        Interrupted, // `interrupt` was called
    };

    Kind kind = Kind::Stored;
    bool duplicate = false; // the stream had a message of this ID already
    std::string sentence = {}; // for people, of every kind but `Stored`: what was wrong, and what to do

    [[nodiscard]] bool isStored() const noexcept { return kind == Kind::Stored; }
};

// The fleet's store has all rows of this epoch up to this ID.
struct Confirmation {
    std::string epoch = {};
    std::int64_t id = 0;

    bool operator==(const Confirmation&) const = default;
};

// One thread; `interrupt` is for any.
class Transport {
public:
    using Confirmed = std::expected<std::optional<Confirmation>, Answer>;

    Transport() = default;
    virtual ~Transport() = default;
    Transport(const Transport&) = delete;
    Transport& operator=(const Transport&) = delete;

    // Connects to the first server that answers. Without a connection the other calls answer `Away`.
    virtual Answer connect() = 0;
    virtual void disconnect() = 0;

    // The stream stores a message of this ID once, as far back as it remembers IDs.
    virtual Answer put(const std::string& id, std::string_view batch) = 0;

    // The last confirmation for the device of this pseudonym, or none if there never was one. A connection is that of
    // one device.
    virtual Confirmed lastConfirmation(const std::string& device) = 0;
    // The next confirmation behind that of `lastConfirmation`, for the same device, or none within the limit.
    virtual Confirmed awaitConfirmation(std::chrono::milliseconds limit) = 0;

    // Ends the call that runs, and each later one at once. Only the setting up of a connection goes on to its limit.
    virtual void interrupt() = 0;
};

} // namespace kesto_uplink
