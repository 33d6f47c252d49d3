// SPDX-License-Identifier: Apache-2.0
// Reads the event store in slices: a few thousand rows in a transaction of their own, so that no reader holds up the
// service.
#pragma once

#include "kesto-uplink/state/State.h"
#include "kesto/store/EventDatabase.h"

#include <cstdint>
#include <filesystem>
#include <functional>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <vector>

namespace kesto_uplink {

struct StoredEvent {
    std::int64_t id = 0;
    double time = 0;
    std::string name = {};
    std::string payload = {};
    std::optional<std::int64_t> session = {};
    std::optional<double> happened = {};
};

struct StoredStretch {
    std::int64_t id = 0;
    bool isRecording = false;
    double began = 0;
    double seconds = 0;
    std::optional<std::string> device = {};
    std::optional<std::string> format = {};
    std::optional<std::int64_t> channels = {};
    std::optional<double> volume = {};
    std::string ending = {};
    std::optional<std::int64_t> session = {};
};

struct StoredSession {
    std::int64_t id = 0;
    std::int64_t reporter = 0;
    std::optional<std::string> service = {};
    std::string application = {};
    std::optional<std::string> process = {};
    double began = 0;
    std::optional<double> ended = {};
    std::optional<std::int64_t> past = {};
};

// A range of IDs, and all that stands there.
struct Slice {
    Cursor after = {}; // the range begins with the next ID
    std::int64_t last = 0;
    std::vector<StoredEvent> events = {}; // by ID, as the next
    std::vector<StoredStretch> stretches = {};
    std::map<std::int64_t, std::string> applications = {}; // of the sessions that these name
};

// One thread. Throws EventStoreError.
class StoreReader {
public:
    explicit StoreReader(std::filesystem::path database) : file_(std::move(database)) { }

    struct Limits {
        std::int64_t rows = 1024;
        std::int64_t payloadBytes = 256 * 1024; // but at least one event
    };
    // What comes behind the cursor. If it is of another database, the slice begins with the oldest row of this one; but
    // if this one was made to save the rows of that one, the slice goes on behind the cursor's ID. Nothing if nothing
    // is there, or if the service is about to put saved rows there.
    [[nodiscard]] std::optional<Slice> read(const Cursor& after, const Limits& limits);
    // Those of them that the store still knows, by ID; none if the store is another by now.
    [[nodiscard]] std::vector<StoredSession> sessions(const std::set<std::int64_t>& wanted, const std::string& epoch);

    // Behind everything; without an epoch if there is no store. Throws while that is not known.
    [[nodiscard]] Cursor newest();
    // The place before the newest so many events.
    [[nodiscard]] Cursor beforeNewest(std::int64_t events);
    // Before the first row of that time or later; behind everything if there is none.
    [[nodiscard]] Cursor before(double time);

private:
    [[nodiscard]] bool open(); // false: there is no store
    // Calls the work within a transaction, in which all questions see the same state.
    void inTransaction(const std::function<void()>& work);
    [[nodiscard]] bool isReady();
    [[nodiscard]] Cursor newestNow();
    [[nodiscard]] std::optional<std::int64_t> oldestID();
    [[nodiscard]] std::optional<std::int64_t> idOf(const std::string& sql);
    [[nodiscard]] std::int64_t placeHere(const Cursor& after, const std::string& epoch);
    void readEvents(Slice& slice, const Limits& limits);
    void readStretches(Slice& slice, const Limits& limits);
    void readApplications(Slice& slice);

    const std::filesystem::path file_;
    std::optional<EventDatabase> database_;
    bool hasStretches_ = false;
};

} // namespace kesto_uplink
