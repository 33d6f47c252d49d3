// SPDX-License-Identifier: Apache-2.0
// The room of state: what the uplink remembers of the device and of what it has sent, in uplink.sqlite3.
//
// Everything is written in transactions, so that a kill at any moment leaves a state that was true. A second process
// may read and forget beside the one that sends: whoever sends names the pseudonym under which it did, and what came of
// it counts only as long as that is still the pseudonym.
//
// There are two places in the store. `queued` is behind the last row that needs no more sending: the stream has
// answered, or the row may not leave. `stored` is behind the last row that the fleet's database is known to have. Both
// are the same when nothing is under way.
#pragma once

#include "platform/linux/store/SqliteConnection.h"

#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>
#include <optional>
#include <set>
#include <stdexcept>
#include <string>
#include <string_view>

namespace kesto_uplink {

// The place behind an event or a stretch in one database and no other. An empty epoch: before everything.
struct Cursor {
    std::string epoch = {};
    std::int64_t id = 0;

    friend bool operator==(const Cursor&, const Cursor&) = default;
};

// Under which the device reports.
struct Identity {
    std::string pseudonym = {}; // 32 hexadecimal digits
    double pseudonymBorn = 0; // seconds since 1970, as every moment here
    std::string hashKey = {}; // 64 hexadecimal digits, used as text
    double hashKeyBorn = 0;
};

[[nodiscard]] Identity newIdentity(double now);
// What was made at `born` is due for renewal.
[[nodiscard]] bool isOlder(double born, double days, double now);

// Sums since the file was made.
struct Totals {
    std::int64_t rows = 0; // that the stream has answered, as the next two
    std::int64_t batches = 0;
    std::int64_t bytes = 0;
    std::int64_t retries = 0;
    std::int64_t notAllowed = 0; // rows that may not leave, or cannot
    std::int64_t lostToAge = 0; // rows that the store removed before they were read

    friend bool operator==(const Totals&, const Totals&) = default;
};

struct LastAnswer {
    std::string text = {}; // for a person: "stored", or what was wrong
    double time = 0;
};

// What came of a range of the store.
struct Progress {
    Cursor last = {};
    std::int64_t first = 1; // the first ID of the range
    std::int64_t rows = 0; // that were sent; 0: there was nothing to send
    std::int64_t bytes = 0; // that were sent
    std::int64_t notAllowed = 0;
    std::int64_t lostToAge = 0;
    std::set<std::int64_t> openSessions = {}; // whose rows have left without their end
};

enum class Renewal : std::uint8_t {
    NotDue,
    Renewed,
    Waiting // for the fleet to store what was sent under the old pseudonym; until then nothing more may be sent
};

// A line for a person.
class StateError : public std::runtime_error {
public:
    using std::runtime_error::runtime_error;
};

// One thread. Throws StateError.
class State {
public:
    static constexpr std::string_view fileName = "uplink.sqlite3";

    // Opens the file in the directory, or makes it, with a new identity, for the directory's owner alone.
    [[nodiscard]] static State open(const std::filesystem::path& directory, double now);
    // Nothing if there is no file.
    [[nodiscard]] static std::optional<State> openPresent(const std::filesystem::path& directory);

    [[nodiscard]] Identity identity();
    [[nodiscard]] Cursor queued();
    [[nodiscard]] Cursor stored();
    [[nodiscard]] std::set<std::int64_t> openSessions(); // of `queued`
    [[nodiscard]] std::int64_t bytesSentOn(std::int64_t day); // in days since 1970
    [[nodiscard]] Totals totals();
    [[nodiscard]] std::optional<LastAnswer> lastAnswer();
    [[nodiscard]] std::optional<double> onSince(); // nothing: it is off

    // Each of these is false, and changes nothing, if the pseudonym is another by now.
    //
    // The stream has answered a batch, or there was nothing to send. Only behind an answer.
    [[nodiscard]] bool noteQueued(const Identity& as, const Progress& progress, std::int64_t day);
    // The fleet's database has all that was sent up to there. Another epoch than that of `queued` says nothing.
    [[nodiscard]] bool noteStored(const Identity& as, const Cursor& upTo);
    // The answer of the stream is enough.
    [[nodiscard]] bool noteAllStored(const Identity& as);
    // Goes back to `stored`: what lies between is to be sent again.
    [[nodiscard]] bool sendAgain(const Identity& as);

    // An attempt that brought no answer; its bytes count for the day.
    void noteRetry(std::int64_t bytes, std::int64_t day);
    void noteAnswer(const LastAnswer& answer);
    void noteOn(double now); // nothing changes if it is on already
    void noteOff();

    // Renews the hash key if it is older, and the pseudonym, with the hash key, if that is older.
    Renewal renew(double pseudonymDays, double hashKeyDays, double now);
    // A new pseudonym and a new hash key. Nothing that the store has kept up to `newest` leaves any more.
    void forget(const Cursor& newest, double now);

private:
    explicit State(std::filesystem::path file);

    [[nodiscard]] bool isEmpty();
    void makeTables(double now);
    void check();

    template <typename... Values> void run(std::string_view sql, const Values&... values);
    void forEachRow(std::string_view sql, const std::function<void(const platform::SqliteStatement&)>& read);
    [[nodiscard]] std::int64_t number(std::string_view sql);
    void inTransaction(const std::function<void()>& work);
    [[nodiscard]] bool underPseudonym(const Identity& as, const std::function<void()>& work);
    [[nodiscard]] StateError failure(platform::StoreError error) const;

    void addBytesOfDay(std::int64_t bytes, std::int64_t day);
    void setIdentity(const Identity& identity);
    void setOpenSessions(const std::set<std::int64_t>& sessions);

    std::filesystem::path file_;
    std::unique_ptr<platform::SqliteConnection> connection_;
};

} // namespace kesto_uplink
