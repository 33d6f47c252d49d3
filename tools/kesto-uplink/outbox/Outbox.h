// SPDX-License-Identifier: Apache-2.0
// The room of the outbox: what is new in the event store, as rows that may leave, in batches that are ready to be sent.
//
// It only reads, in short transactions, and remembers nothing itself: the caller says from where on.
#pragma once

#include "kesto-uplink/rules/UplinkConfiguration.h"
#include "kesto-uplink/state/State.h"

#include <cstdint>
#include <filesystem>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>

namespace kesto_uplink {

// Why rows of a range do not leave, by the name of the event; stretches are called "stretch".
struct LeftOut {
    std::map<std::string, std::int64_t> notAllowed; // no rule is about them
    std::map<std::string, std::int64_t> unreadable; // the payload is no JSON object, or holds what JSON cannot
    std::map<std::string, std::int64_t> tooLarge; // alone larger than a batch
    // Rows that the store had removed before they were read: each ID in the range is one event or one stretch, so it is
    // the number of IDs without a row.
    std::int64_t lostToAge = 0;

    [[nodiscard]] std::int64_t rows() const; // all but those lost to age
};

struct Batch {
    std::string messageID; // "<pseudonym>:<epoch>:<first>:<last>"
    std::string lines; // as they leave: newline-delimited JSON
    std::string bytes; // the same, compressed; empty if there are no rows
    Cursor first; // the first and the last ID of the range
    Cursor last;
    std::int64_t rows = 0; // events and stretches; 0: nothing of the range may leave, and nothing is to be sent
    LeftOut leftOut;
    std::set<std::int64_t> openSessions; // see Progress

    [[nodiscard]] Progress progress() const;
};

struct OutboxLimits {
    std::size_t compressedBytes = 512 * 1024; // of a batch
    std::size_t lineBytes = 1024 * 1024; // of a batch, unless one row alone has more
    std::int64_t rows = 4096; // of a batch
    std::int64_t idsInOneRead = 2048; // of one transaction
    std::int64_t idsInOneBatch = 65'536; // of the range of a batch
};

// One thread. Throws EventStoreError if the store cannot be read.
class Outbox {
public:
    Outbox(std::filesystem::path database, const UplinkConfiguration& configuration, const Identity& identity,
           OutboxLimits limits = {});
    ~Outbox();
    Outbox(const Outbox&) = delete;
    Outbox& operator=(const Outbox&) = delete;

    // What comes behind the cursor; nothing if nothing is new. If the cursor is of another database, it begins with the
    // oldest row of this one. `sent` is the clock of the device.
    [[nodiscard]] std::optional<Batch> next(const Cursor& after, const std::set<std::int64_t>& openSessions,
                                            double sent);

    // The cursor behind everything that is there. An empty epoch: there is no database.
    [[nodiscard]] Cursor newest();
    // The cursor before the first event that was stored then or later.
    [[nodiscard]] Cursor before(double time);

private:
    class Reading;
    std::unique_ptr<Reading> reading_;
};

} // namespace kesto_uplink
