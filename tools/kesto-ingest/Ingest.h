// SPDX-License-Identifier: Apache-2.0
// The work: batches from the stream become rows of the database.
//
// Everything that a batch leads to is done before the batch is acknowledged, and all of it may be done twice: rows have
// keys, dead letters and confirmations too. So a kill at any moment loses nothing.
//
// While the database stores one load, the next is taken. It may become larger: reading rows is quicker than inserting
// them.
#pragma once

#include "kesto-ingest/Load.h"
#include "kesto-ingest/Metrics.h"
#include "kesto-ingest/stream/Confirmations.h"
#include "kesto-ingest/stream/Owners.h"
#include "kesto-ingest/stream/Stream.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <expected>
#include <functional>
#include <future>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

namespace kesto_ingest {

struct IngestLimits {
    std::size_t rows = 10'000; // joined into one insert
    std::size_t insertsOfALoad = 4; // are taken at the most while the database stores another load
    std::size_t bytes = 32 * 1024 * 1024; // of a load
    std::chrono::milliseconds joining{1000}; // the longest time that a batch waits for others
    std::chrono::milliseconds shortestPause{500}; // after a failure; doubled with each, up to the longest
    std::chrono::milliseconds longestPause{30'000};
};

// The error is for a person.
using Outcome = std::expected<void, std::string>;

struct Surroundings {
    std::function<std::chrono::steady_clock::time_point()> now;
    std::function<void(std::chrono::milliseconds)> rest;
    std::function<void(std::string_view)> log;
    std::function<std::future<Outcome>(std::function<Outcome()>)> start; // work that another thread does
};

// One thread; another uses the database. What it is given must outlive it.
class Ingest {
public:
    using Clock = std::chrono::steady_clock;

    Ingest(Stream& stream, Database& database, Metrics& metrics, IngestLimits limits, Surroundings surroundings);

    // Takes what comes, waiting a second at the most, and stores what is due. If that fails, the next attempt is due
    // after a pause.
    void turn();
    // Stores what is held, in one attempt. What cannot be stored goes back to the stream.
    void finish();
    // Tells the stream, now and then, that what is held is not forgotten.
    void holdOn();

private:
    void takeWhatComes();
    void fetch();
    [[nodiscard]] bool isFull() const;
    [[nodiscard]] bool mustWaitForAnEarlierOne(const Delivery& delivery, const std::string& device);
    void giveBack(const Delivery& delivery, const std::string& device);
    void take(Delivery delivery);
    void hold(Held held);
    void refuse(Delivery& delivery, Counter counter, std::string reason);
    [[nodiscard]] bool isDue() const;
    [[nodiscard]] bool isStoring() const { return stored_.valid(); }
    [[nodiscard]] bool isStored(std::chrono::milliseconds wait) const;
    void startStoring();
    void endStoring();
    [[nodiscard]] Outcome answerWhatIsStored();
    [[nodiscard]] Outcome answer();
    [[nodiscard]] Outcome putAside(Held& held);
    [[nodiscard]] Outcome tellDevices();
    void giveBackAll(const Load& load);
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
    Load taking_;
    Load storing_; // its blocks are the other thread's while `stored_` is awaited
    std::future<Outcome> stored_;
    Clock::time_point heldOn_; // when the stream was told last
    std::optional<Clock::time_point> nextAttempt_; // after a failure
    std::chrono::milliseconds pause_{0};
};

} // namespace kesto_ingest
