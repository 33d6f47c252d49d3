// SPDX-License-Identifier: Apache-2.0
// What plays and records now, by the event store.
#pragma once

#include "kesto/store/EventDatabase.h"

#include <cstdint>
#include <filesystem>
#include <map>
#include <optional>
#include <string>
#include <utility>
#include <vector>

// A session that plays or records at the moment. Text that was not told is empty.
struct PlayingStream {
    std::int64_t session = 0; // 0: not known
    std::string application = {};
    bool isRecording = false;
    double since = 0; // seconds since 1970 UTC; without a pause, but maybe on several devices or at several volumes
    std::string device = {};
    std::string format = {};
    std::optional<double> volume = {}; // 0 to 1
    std::uint64_t faults = 0; // of the session, since it began
};

// Reads the store again and again, and each time only what is new. One thread.
class PlayingStreams {
public:
    explicit PlayingStreams(std::filesystem::path database) : path_(std::move(database)) { }

    // Throws EventStoreError.
    [[nodiscard]] std::vector<PlayingStream> read();

private:
    using Key = std::pair<std::int64_t, bool>; // session, and whether it records

    void refresh();
    void forget();
    [[nodiscard]] std::vector<PlayingStream> readOpen();
    void readEnded();
    void readFaults();
    void forgetEndedSessions();

    const std::filesystem::path path_;
    std::optional<EventDatabase> database_; // none: it did not exist yet
    std::int64_t seen_ = 0; // nothing with this ID or a lower one is new
    std::map<Key, double> began_; // when what went over into a stretch that is open began
    std::map<std::int64_t, std::uint64_t> faults_; // by session, of those that have not ended
};
