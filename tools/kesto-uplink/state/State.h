// SPDX-License-Identifier: Apache-2.0
// The room of state: what the uplink remembers of the device and of what it has sent, in uplink.sqlite3.
//
// Everything is written in transactions, so that a kill at any moment leaves a state that was true. A second process may
// read and forget beside the one that sends: whoever sends names the pseudonym under which it did, and what came of it
// counts only as long as that is still the pseudonym.
#pragma once

#include "platform/linux/store/SqliteConnection.h"

#include <cstdint>
#include <filesystem>
#include <memory>
#include <optional>
#include <set>
#include <stdexcept>
#include <string>

namespace kesto_uplink {

// The place behind an event or a stretch in one database and no other. An empty epoch: before everything.
struct Cursor {
    std::string epoch;
    std::int64_t id = 0;

    friend bool operator==(const Cursor&, const Cursor&) = default;
};

// Under which the device reports.
struct Identity {
    std::string pseudonym; // 32 hexadecimal digits
    double pseudonymBorn = 0; // seconds since 1970, as every moment here
    std::string hashKey; // 32 bytes
    double hashKeyBorn = 0;
};

// Sums since the state was begun.
struct Totals {
    std::int64_t rows = 0; // of batches that the stream has answered, as the next two
    std::int64_t batches = 0;
    std::int64_t bytes = 0;
    std::int64_t retries = 0;
    std::int64_t notAllowed = 0; // rows that may not leave, or cannot
    std::int64_t lostToAge = 0; // see Batch
};

struct LastAnswer {
    std::string text; // for a person: "stored", or what was wrong
    double time = 0;
};

// A line for a person.
class StateError : public std::runtime_error {
public:
    using std::runtime_error::runtime_error;
};

// What a batch did, for the state.
struct Progress {
    Cursor last; // of the batch
    std::int64_t rows = 0; // 0: nothing was to be sent
    std::int64_t bytes = 0; // sent
    std::int64_t notAllowed = 0;
    std::int64_t lostToAge = 0;
    std::set<std::int64_t> openSessions; // those whose rows have left, and whose end has not
};

enum class Renewal : std::uint8_t {
    NotDue,
    Renewed,
    Waiting // due, but the fleet has not stored all that was sent under the old pseudonym: nothing more may be sent
};

// One thread. Throws StateError.
class State {
public:
    static constexpr std::string_view fileName = "uplink.sqlite3";

    // Opens the file in the directory, or makes it for its owner alone, with a new identity.
    static State open(const std::filesystem::path& directory, double now);
    // None if there is no file.
    static std::optional<State> openPresent(const std::filesystem::path& directory);

    [[nodiscard]] Identity identity();
    [[nodiscard]] Cursor queued(); // what the stream has, or needs not have, as far as it answered
    [[nodiscard]] Cursor stored(); // what the fleet's database has; never behind... `queued`
    [[nodiscard]] std::set<std::int64_t> openSessions(); // as in Progress, of the cursor `queued`
    [[nodiscard]] std::int64_t bytesSentOn(std::int64_t day); // days since 1970
    [[nodiscard]] Totals totals();
    [[nodiscard]] std::optional<LastAnswer> lastAnswer();
    [[nodiscard]] std::optional<double> onSince(); // none: it is off

    // Each of the next three is false, and changes nothing, if the pseudonym is another by now.
    //
    // The stream has answered the batch, or there was nothing to send in its range.
    [[nodiscard]] bool noteQueued(const Identity& as, const Progress& progress, std::int64_t day);
    // The fleet's database has everything up to there.
    [[nodiscard]] bool noteStored(const Identity& as, const Cursor& upTo);
    // The answer of the stream is enough (`forget = "queued"`).
    [[nodiscard]] bool noteStoredAsQueued(const Identity& as);
    // Goes back to what is stored: what the stream had answered is sent again.
    [[nodiscard]] bool sendAgain(const Identity& as);

    void noteRetry();
    void noteAnswer(const LastAnswer& answer);
    void setOn(std::optional<double> since); // keeps the time if it is on already

    // Renews what is older.
    Renewal renew(double pseudonymDays, double hashKeyDays, double now);
    // A new pseudonym, a new hash key, and nothing that was kept before this moment leaves any more.
    void forget(const Cursor& newest, double now);

private:
    explicit State(std::filesystem::path file, std::unique_ptr<platform::SqliteConnection> connection);

    std::filesystem::path file_;
    std::unique_ptr<platform::SqliteConnection> connection_;
};

} // namespace kesto_uplink
