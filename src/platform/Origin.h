// SPDX-License-Identifier: Apache-2.0
// Who is behind an event: the connection that it came over, its source, and the session that it belongs to.
//
// Events carry numbers, because a name for each event would cost as much as the event. What the numbers stand for is
// announced once, in the batch of the first event that has them, so that it is kept with that event or not at all.
#pragma once

#include <atomic>
#include <compare>
#include <cstddef>
#include <cstdint>
#include <map>
#include <string>
#include <vector>

namespace platform {

// The service gives out the numbers; each is unique for as long as the service runs. 0: none.
struct Origin {
    std::uint64_t source = 0;
    std::uint64_t session = 0;

    friend auto operator<=>(const Origin&, const Origin&) = default;
};

// How many events each has.
using EventsByOrigin = std::map<Origin, std::uint64_t>;

// The next number of a source or of a session. Any thread.
[[nodiscard]] inline std::uint64_t nextOriginNumber() noexcept
{
    static std::atomic<std::uint64_t> last = 0;
    return ++last;
}

// A connection, as the kernel describes its other end.
struct SourceBegin {
    std::uint64_t number = 0;
    std::uint32_t userIdentifier = 0;
    std::int32_t processIdentifier = 0;
    std::string processName = {}; // empty if it is not known
    double time = 0; // seconds since 1970 UTC, as below

    friend bool operator==(const SourceBegin&, const SourceBegin&) = default;
};

struct SessionBegin {
    std::uint64_t number = 0;
    std::uint64_t source = 0; // of the session's owner
    std::int64_t reporterID = 0;
    std::string serviceType = {}; // its name; empty until one is set
    std::string application = {};
    double time = 0;

    friend bool operator==(const SessionBegin&, const SessionBegin&) = default;
};

struct OriginEnd {
    std::uint64_t number = 0;
    double time = 0;

    friend bool operator==(const OriginEnd&, const OriginEnd&) = default;
};

// A session plays and records nothing any more, although it may begin again.
enum class PlayingEnding : std::uint8_t {
    Stopped, // the client stopped it
    Vanished // its connection ended
};
struct PlayingEnd {
    std::uint64_t session = 0; // its number
    double time = 0;
    PlayingEnding ending = PlayingEnding::Stopped;
    std::size_t place = 0; // behind so many messages of its batch

    friend bool operator==(const PlayingEnd&, const PlayingEnd&) = default;
};

// What one batch announces. The begins count before its events, the ends after them, except for those of playing.
struct OriginAnnouncements {
    std::vector<SourceBegin> sources;
    std::vector<SessionBegin> sessions;
    std::vector<OriginEnd> sourceEnds;
    std::vector<OriginEnd> sessionEnds;
    std::vector<PlayingEnd> playingEnds; // in their order

    [[nodiscard]] bool empty() const noexcept
    {
        return sources.empty() && sessions.empty() && sourceEnds.empty() && sessionEnds.empty() && playingEnds.empty();
    }
};

} // namespace platform
