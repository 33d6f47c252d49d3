// SPDX-License-Identifier: Apache-2.0
// The work: batches from the stream become rows of the database.
//
// Everything that a batch leads to is done before the batch is acknowledged, and all of it may be done twice: rows have
// keys, dead letters and confirmations too. So a kill at any moment loses nothing.
#pragma once

#include "kesto-ingest/Metrics.h"
#include "kesto-ingest/batch/Batch.h"
#include "kesto-ingest/database/Block.h"
#include "kesto-ingest/stream/Confirmations.h"
#include "kesto-ingest/stream/Owners.h"
#include "kesto-ingest/stream/Stream.h"

#include <array>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <expected>
#include <functional>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

namespace kesto_ingest {

struct IngestLimits {
    std::size_t rows = 10'000; // joined into one insert
    std::size_t bytes = 32 * 1024 * 1024; // the same
    std::chrono::milliseconds joining{1000}; // the longest time that a batch waits for others
    std::chrono::milliseconds shortestPause{500}; // after a failure; doubled with each, up to the longest
    std::chrono::milliseconds longestPause{30'000};
};

struct Surroundings {
    std::function<std::chrono::steady_clock::time_point()> now;
    std::function<void(std::chrono::milliseconds)> rest;
    std::function<void(std::string_view)> log;
};

// One thread. What it is given must outlive it.
class Ingest {
public:
    using Clock = std::chrono::steady_clock;

    Ingest(Stream& stream, Database& database, Metrics& metrics, IngestLimits limits, Surroundings surroundings);

    // Takes what comes, waiting a second at the most, and stores what is due. If that fails, the next attempt is due
    // after a pause.
    void turn();
    // Stores what is held, in one attempt. If that fails, what is held goes back to the stream.
    void finish();
    // Tells the stream, now and then, that what is held is not forgotten.
    void holdOn();

private:
    struct Held {
        Delivery delivery;
        std::vector<BadRow> badRows{};
        std::string refusal{}; // of the batch as a whole; empty: it is stored
        Confirmation confirmation{};
        bool isPutAside = false; // what is wrong with it
    };
    struct TableBlock {
        Table table;
        Block block;
    };

    void takeWhatComes();
    void fetch();
    [[nodiscard]] bool isFull() const;
    [[nodiscard]] bool mustWaitForAnEarlierOne(const Delivery& delivery, const std::string& device);
    void giveBack(const Delivery& delivery, const std::string& device);
    void take(Delivery delivery);
    void refuse(Delivery& delivery, Counter counter, std::string reason);
    void addRow(const Row& row, std::size_t source);
    [[nodiscard]] bool isDue() const;
    [[nodiscard]] std::expected<void, std::string> store();
    [[nodiscard]] std::expected<void, std::string> storeBlocks();
    [[nodiscard]] std::expected<void, std::string> answer();
    [[nodiscard]] std::expected<void, std::string> putAside(Held& held);
    [[nodiscard]] std::expected<void, std::string> tellDevices();
    void fail(const std::string& reason);
    void succeed();

    Stream& stream_;
    Database& database_;
    Metrics& metrics_;
    const IngestLimits limits_;
    const Surroundings surroundings_;
    Owners owners_;
    Confirmations confirmations_;

    struct GivenBack {
        std::uint64_t sequence;
        Clock::time_point time;
    };

    std::deque<Delivery> fetched_; // and not taken
    std::unordered_map<std::string, GivenBack> givenBack_; // by device: the first of its batches, for a time
    std::vector<Held> held_;
    std::vector<TableBlock> blocks_; // not stored
    std::size_t rows_ = 0; // in these
    std::size_t bytes_ = 0;
    Clock::time_point oldest_; // when the first of `fetched_` and `held_` came
    Clock::time_point heldOn_; // when the stream was told last
    std::optional<Clock::time_point> nextAttempt_; // after a failure
    std::chrono::milliseconds pause_{0};
};

} // namespace kesto_ingest
