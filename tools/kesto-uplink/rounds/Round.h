// SPDX-License-Identifier: Apache-2.0
// The room of rounds: when the uplink sends, how much, and what it does with the answers.
//
// One round sends all that waits, until nothing is left, the day's bytes are used up, or an answer says no. It connects
// only if something is to be sent or told. At "stored by the stream" the place `queued` moves, at the fleet's
// confirmation the place `stored`. A kill at any moment lets the next round begin at a place that was true: at worst a
// batch is sent once more, and its rows have the same keys.
//
// What the stream has is not sent again, unless the fleet has not confirmed it for a day: then the stream has lost it.
#pragma once

#include "kesto-uplink/outbox/Outbox.h"
#include "kesto-uplink/rounds/Patience.h"
#include "kesto-uplink/state/State.h"
#include "kesto-uplink/transport/Transport.h"

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <set>
#include <string>

namespace kesto_uplink {

enum class Outcome : std::uint8_t {
    Nothing, // nothing was new: no connection
    Sent, // all that waited
    Waiting, // for the fleet, before more may be sent
    Metered, // something waits, and the network costs money
    DayUsedUp, // something waits for the next day
    Away,
    Full,
    Refused,
    Failed, // the device itself: its state or its store
    Off, // by the configuration
    Interrupted,
};

struct RoundResult {
    Outcome outcome = Outcome::Nothing;
    std::string sentence = {}; // for people
    std::int64_t batches = 0;
};

// What is new behind a place, for an identity.
class Source {
public:
    virtual ~Source() = default;
    [[nodiscard]] virtual std::optional<Batch> next(const Cursor& after,
                                                    const std::set<std::int64_t>& openSessions) = 0;
};

// What a round may do.
struct Terms {
    ForgetWhen forgetWhen = ForgetWhen::Stored;
    std::uint64_t maximumBytesADay = 0;
    double pseudonymDays = 0;
    double hashKeyDays = 0;
    std::chrono::milliseconds waitForConfirmation = std::chrono::seconds(5);
};

// One moment of the device.
struct Today {
    double now = 0; // seconds since 1970
    std::int64_t day = 0; // for the day's bytes
};

// One thread. Throws StateError and EventStoreError.
class Round {
public:
    Round(const Terms& terms, State& state, Patience& patience, Transport& transport,
          std::function<std::unique_ptr<Source>(const Identity&)> sourceFor, std::function<Today()> clock,
          std::function<bool()> isMetered);

    [[nodiscard]] RoundResult run();

private:
    [[nodiscard]] std::optional<Batch> nextToSend();
    [[nodiscard]] std::optional<RoundResult> whyNotNow(const Batch& batch);
    [[nodiscard]] Answer connect();
    [[nodiscard]] RoundResult sendConnected(Batch batch, bool isPseudonymDue);
    [[nodiscard]] bool goesBack(const Batch& next);
    [[nodiscard]] bool isPatienceOver();
    [[nodiscard]] RoundResult awaitRenewal();
    [[nodiscard]] RoundResult sendAll(std::optional<Batch> waiting);
    void askForConfirmation();
    void awaitConfirmation();
    [[nodiscard]] bool awaitsConfirmation();
    void note(const Confirmation& confirmation);
    void keep(bool isStillThePseudonym);
    void noteQueued(const Batch& batch);

    Terms terms_;
    State& state_;
    Patience& patience_;
    Transport& transport_;
    std::function<std::unique_ptr<Source>(const Identity&)> sourceFor_;
    std::function<Today()> clock_;
    std::function<bool()> isMetered_;

    Identity identity_; // of this round
    std::unique_ptr<Source> source_;
    bool isForgotten_ = false; // somebody gave the device a new pseudonym meanwhile: this round is over
    std::string complaint_; // of confirmations, which hold up nothing
};

} // namespace kesto_uplink
