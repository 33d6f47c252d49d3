// SPDX-License-Identifier: Apache-2.0
// The stretches of this run of the service: those that run, and those that are over and wait for the database.
//
// It follows every message, also those that the store loses. What was not written because a transaction failed waits
// for the next one, so that no stretch is lost or written twice; what waits is bounded, and what goes beyond is
// counted.
//
// docs/store.md says where a stretch begins, where it is cut and where it ends.
#pragma once

#include "platform/EventBatch.h"
#include "platform/linux/store/stretches/Stretch.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <optional>
#include <span>
#include <unordered_map>
#include <unordered_set>
#include <utility>
#include <vector>

namespace platform {

// What was counted of a client until its connection broke, by the client's own clock.
struct CountedTime {
    double from = 0;
    double until = 0;
};

// One thread at a time.
class Stretches {
public:
    // So many may wait for a database that cannot be written to.
    static constexpr std::size_t mostWaiting = 1024;
    // So many that ended with their connection are remembered, the last ones.
    static constexpr std::size_t mostBrokenOff = 1024;

    // The owner of a session, as before the ends that the batch announces; nothing if the session does not live.
    using OwnerOf = std::function<std::optional<SessionOwner>(std::uint64_t session)>;
    // Follows the messages of a batch and what it announces. `vanished` is the ending of what a lost connection ends.
    void take(std::span<const EventRow> rows, const OriginAnnouncements& announced, const OwnerOf& ownerOf,
              StretchEnding vanished);
    // Everything that runs ends with the service, and no session is known any more.
    void endAll(double time);
    // An earlier run of the service has counted everything up to that time.
    void setEarlierEnd(double time) { earlierEnd_ = time; }

    // --- For the transaction that writes them

    // A number of its own for each direction of each session.
    using Key = std::uint64_t;
    // One that runs, with its state, to be written again; or one whose row is to be removed.
    struct Change {
        Key key;
        const OpenStretch* open; // null: it does not run any more
        bool isRecording;
        const PlayingState* state; // null as above
    };
    [[nodiscard]] bool hasChanges() const noexcept { return !ended_.empty() || !changed_.empty(); }
    [[nodiscard]] const std::vector<Stretch>& ended() const noexcept { return ended_; }
    // Valid until the next call.
    [[nodiscard]] std::vector<Change> rowChanges();
    // All of that is in the database.
    void written();
    // Whether anything of this run was ever written.
    [[nodiscard]] bool wereWritten() const noexcept { return wereWritten_; }
    // Nothing of that could be written; as much as may wait, waits.
    void notWritten();
    // The database is another one, without rows of what runs.
    void forgetRows();

    // How many have not been kept and never will be, since the last call: those of 0 seconds, and those that were too
    // many to wait.
    [[nodiscard]] std::uint64_t takeLeftOut() noexcept { return std::exchange(leftOut_, 0); }

private:
    struct Session {
        PlayingState state;
        std::array<std::optional<OpenStretch>, 2> open; // playing, recording: all in that state
        SessionOwner owner;
        std::array<std::optional<CountedTime>, 2> counted; // of an earlier session of the owner
    };
    struct BrokenOff {
        SessionOwner owner;
        std::size_t direction;
        CountedTime counted;
    };
    using Sessions = std::unordered_map<std::uint64_t, Session>;

    void take(const EventRow& row, const OwnerOf& ownerOf);
    void end(std::uint64_t session, double time, StretchEnding ending);
    void end(std::uint64_t number, Session& session, std::size_t direction, const StretchMoment& when,
             StretchEnding ending);
    void begin(std::uint64_t number, Session& session, std::size_t direction, const OpenStretch& open);
    [[nodiscard]] Session* sessionOf(std::uint64_t number, const OwnerOf& ownerOf);
    [[nodiscard]] Session* find(std::uint64_t number);
    void rememberBrokenOff(const BrokenOff& brokenOff);
    [[nodiscard]] std::optional<CountedTime> lastBrokenOff(const SessionOwner& owner, std::size_t direction) const;
    void sortChanged();

    Sessions sessions_;
    std::deque<BrokenOff> brokenOff_; // the latest last
    std::optional<double> earlierEnd_;
    std::vector<Stretch> ended_;
    std::vector<Key> changed_; // may repeat
    std::unordered_set<Key> rows_; // that the database has
    std::uint64_t leftOut_ = 0;
    bool wereWritten_ = false;
};

} // namespace platform
