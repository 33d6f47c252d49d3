// SPDX-License-Identifier: Apache-2.0
// The room of the outbox: what is new in the event store, as rows that may leave, in batches that are ready to be sent.
//
// It only reads, in short transactions, and remembers nothing itself: the caller says from where on.
#pragma once

#include "kesto-uplink/outbox/Rows.h"
#include "kesto-uplink/outbox/StoreReader.h"
#include "kesto-uplink/rules/UplinkConfiguration.h"
#include "kesto-uplink/state/State.h"

#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <vector>

namespace kesto_uplink {

// Rows of a range that do not leave, by the name of the event; that of a stretch is "stretch".
struct LeftOut {
    std::map<std::string, std::int64_t> notAllowed = {};
    std::map<std::string, std::int64_t> unreadable = {};
    std::map<std::string, std::int64_t> tooLarge = {}; // alone larger than a batch
    // Rows that the store removed before they were read: the IDs of the range at which it has nothing, because each ID
    // is that of one event or one stretch.
    std::int64_t lostToAge = 0;

    // All but those lost to age.
    [[nodiscard]] std::int64_t rows() const;
};

struct Batch {
    std::string messageID = {}; // "<pseudonym>:<epoch>:<first ID>:<last ID>"
    std::string lines = {}; // as they leave: newline-delimited JSON
    std::string bytes = {}; // the same, compressed
    Cursor first = {}; // the first and the last ID of the range
    Cursor last = {};
    std::int64_t rows = 0; // lines behind the first. 0: nothing is to be sent, and `lines` and `bytes` are empty
    std::optional<double> oldest = {}; // when the first event or stretch of these was stored or began
    LeftOut leftOut = {};
    std::set<std::int64_t> openSessions = {}; // see Progress

    [[nodiscard]] Progress progress() const;
};

// A batch is as large as a device with little memory makes it without pain: some 50 KB compressed.
struct OutboxLimits {
    std::size_t compressedBytes = largestBatch;
    std::size_t wholeBytes = std::size_t{8} * 1024 * 1024; // before they are compressed
    std::size_t rowBytes = std::size_t{512} * 1024; // of events and stretches, but at least one of them
    std::int64_t rows = 2048; // the same
    std::int64_t rowsLookedAt = 65'536; // for one batch
    std::int64_t endedSessions = 1024; // those of which the batch has nothing else
    StoreReader::Limits slice = {};
};

// One thread. Throws EventStoreError if the store cannot be read.
class Outbox {
public:
    Outbox(std::filesystem::path database, const UplinkConfiguration& configuration, const Identity& identity,
           const OutboxLimits& limits = {});

    // What comes behind the cursor, with the sessions that are open there; nothing if there is nothing. A cursor of
    // another database is as for StoreReader. `sent` is the clock of the device.
    [[nodiscard]] std::optional<Batch> next(const Cursor& after, const std::set<std::int64_t>& openSessions,
                                            double sent);

    // As those of StoreReader.
    [[nodiscard]] Cursor newest() { return store_.newest(); }
    [[nodiscard]] Cursor beforeNewest(std::int64_t events) { return store_.beforeNewest(events); }
    [[nodiscard]] Cursor before(double time) { return store_.before(time); }
    // What stands in the file by mistake, as far as the batches so far tell.
    [[nodiscard]] std::vector<Unused> unused() const { return rows_.filter().unused(); }

private:
    struct Draft;

    [[nodiscard]] std::optional<Draft> collect(const Cursor& after, std::int64_t mostRows);
    // False: the batch is full before the end of the slice.
    [[nodiscard]] bool add(Draft& draft, const Slice& slice, std::int64_t mostRows);
    [[nodiscard]] bool add(Draft& draft, const StoredEvent& event, const Slice& slice, std::int64_t mostRows);
    [[nodiscard]] bool add(Draft& draft, const StoredStretch& stretch, const Slice& slice, std::int64_t mostRows);
    void addSessions(Draft& draft, const std::set<std::int64_t>& openSessions, std::int64_t mostEnded);
    [[nodiscard]] Batch finished(const Draft& draft, double sent) const;

    StoreReader store_;
    Rows rows_;
    const std::string pseudonym_;
    const OutboxLimits limits_;
    std::set<std::int64_t> tooLarge_; // the IDs of rows that fit into no batch
};

} // namespace kesto_uplink
