// SPDX-License-Identifier: Apache-2.0
// Weeks of playing and recording that nobody heard: made up from a seed, told as the service would have kept them, with
// the truth beside them. A reader of the event store can then be held against what is known to have happened.
//
// In them are nights over midnight, players that stay open over a pause of hours, a browser with two streams at once,
// clients that vanish, sessions that end without a word of goodbye, one that a killed service left behind, one that
// still plays at the end, a device that goes bad in the last week, recordings, an application that never tells a
// volume, muted times, and sound on two devices at once.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace weeks {

// Times are seconds since 1970 UTC.
struct Wish {
    std::uint32_t seed = 1;
    std::size_t sessions = 600;
    // Where the days begin in some time zone, and where the last of them ends. The last is the present.
    std::vector<double> midnights = {};
    // Messages that change nothing, each time a session plays, beside those that do: a store that is to be large.
    std::size_t idleMessages = 0;
};

// The beginnings of so many days of 24 hours, the last of which ends at that time.
[[nodiscard]] std::vector<double> midnightsBefore(double end, std::size_t days);

enum class Ending : std::uint8_t { Change, Stopped, Vanished, ServiceEnded, None }; // None: it runs

struct Stretch {
    std::int64_t session = 0;
    bool isRecording = false;
    double began = 0;
    double seconds = 0; // of one that runs, up to the present
    std::string devices; // empty: not told, as in the next
    std::string format;
    std::optional<double> volume;
    Ending ending = Ending::None;
};

struct Session {
    std::int64_t id = 0; // from 1, one after the other
    std::string application;
    std::string service;
    std::string process;
    std::int64_t user = 0;
    std::int64_t processID = 0;
    double began = 0;
    std::optional<double> ended = {}; // none: it lives, or the service was killed
};

struct Fault {
    std::int64_t session = 0;
    double happened = 0; // within a stretch of its session
    std::string devices; // those of that stretch
    std::int64_t lateCycles = 0;
};

enum class MessageKind : std::uint8_t { Start, Stop, Deactivate, Volume, Route, Fault, Idle };

// What a client said. Its text is made only when it is written.
struct Message {
    MessageKind kind = MessageKind::Idle;
    bool isRecording = false;
    std::int64_t session = 0;
    double happened = 0;
    double number = 0; // the volume, the missed cycles or the length of the session, by its kind
};

struct Weeks {
    std::vector<Session> sessions; // by ID
    std::vector<Stretch> stretches; // by session, then by time
    std::vector<Fault> faults; // by session, then by time
    std::vector<Message> messages; // by time
    double now = 0;
};

// The same wish gives the same weeks.
[[nodiscard]] Weeks makeWeeks(const Wish& wish);

} // namespace weeks
