// SPDX-License-Identifier: Apache-2.0
// The room of the history: what was played and recorded, and where it went wrong, as the event store has it.
//
// It is read in one short transaction and then plain data: whoever draws or counts no longer holds the database. Times
// are rounded to microseconds and volumes to millionths, as in the database of a fleet: so both tell the same.
#pragma once

#include <cstdint>
#include <filesystem>
#include <limits>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

// Seconds since 1970 UTC; the end is not in it.
struct TimeSpan {
    double from = -std::numeric_limits<double>::infinity();
    double until = std::numeric_limits<double>::infinity();
};

// A time in which a session played in one way. Text that was not told is empty.
struct PlayedStretch {
    std::int64_t session = 0; // 0: not known
    double began = 0; // seconds since 1970 UTC
    double seconds = 0; // of one that still runs: up to now
    std::string device = {}; // several at once are one text: "headset, speaker"
    std::string format = {}; // such as "S16LE/44100/2"
    std::optional<double> volume = {}; // 0 to 1; 0: muted
    bool isRunning = false;
    bool hasVanished = false; // its client's connection ended without a word
    bool hasServiceEnded = false; // before it did
};

struct HistorySession {
    std::int64_t id = 0;
    std::string application = {};
    std::string service = {}; // the service type's name
    std::string process = {}; // by the kernel; empty: not known
    std::optional<std::int64_t> user = {};
    std::optional<std::int64_t> processID = {};
    double began = 0;
    std::optional<double> ended = {}; // none: it lives, or the service was killed
};

// An episode in which playing or recording did not keep up, or another event of the category Error.
struct Fault {
    std::int64_t session = 0; // 0: not known
    double happened = 0; // by the message, else when it was stored
    std::string kind = {}; // the event's type: "IssueDetector"
    std::string device = {}; // empty: not told
    std::int64_t lateCycles = 0;
};

struct History {
    std::vector<PlayedStretch> stretches; // by session, then by time
    std::vector<HistorySession> sessions; // by ID; all that the other two name and that the store still knows
    std::vector<Fault> faults; // by time
    double now = 0; // up to when those that run count: the present, or the service's last word if it does not run
};

struct HistoryQuestion {
    TimeSpan span = {};
    bool isRecording = false; // what was recorded in place of what was played
    std::optional<std::int64_t> session = {}; // only this one
    std::string applications = "*"; // GLOB
    std::string devices = "*"; // GLOB
};

// What touches the span: a stretch is whole, although it may begin before it or end after it. Throws EventStoreError.
[[nodiscard]] History readHistory(const std::filesystem::path& database, const HistoryQuestion& question);

// None of a session that the store does not know any more.
[[nodiscard]] const HistorySession* sessionOf(const History& history, std::int64_t id);
// In which the fault happened; of a fault in between, the one before it, else the first. None if its session has none.
[[nodiscard]] const PlayedStretch* stretchOf(const History& history, const Fault& fault);
