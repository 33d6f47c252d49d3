// SPDX-License-Identifier: Apache-2.0
// The memory of what is on its way through connections: frames that have come only in part, calls that wait to be
// carried out, and answers that their clients have not read. Each connection has limits of its own; this adds up what
// all of them hold, so that many connections cannot do together what one cannot do alone.
//
// It has the limits of limits.toml: of all clients, of those of one user, and of one client. Beyond half of a limit,
// the connections that it concerns are not read, until a quarter of that half is free again. No frame is lost: what
// clients send stays in their sockets. Calls that were read go on meanwhile, and their answers may take the other half.
// Beyond the limit itself, a connection must end: of the user with the most, the one with the most unread answers.
//
// Two exceptions keep connections without room from waiting for each other for ever. A connection that holds next to
// nothing is read a little at a time, so that small calls always pass. Of each user, one connection at a time may
// complete a frame of which a part has come, however large it is.
#pragma once

#include "foundation/Mutex.h"
#include "platform/Memory.h"

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <limits>
#include <map>
#include <memory>

namespace platform {

// Any thread, if nothing else is said.
class TransitMemory {
public:
    // What a connection may hold in any case; that much of each is not counted.
    static constexpr std::size_t free = 2048;
    // What is read at once of a connection that has room only for that.
    static constexpr std::size_t leastRead = 1024;
    static constexpr std::size_t partForReading = 2; // of each limit: a half
    static constexpr MemoryLimits unlimited{.ofTheService = std::numeric_limits<std::size_t>::max(),
                                            .ofAUser = std::numeric_limits<std::size_t>::max(),
                                            .ofAClient = std::numeric_limits<std::size_t>::max()};

    // What holds memory together: a connection, a user, or all.
    struct Holder {
        std::atomic<std::size_t> bytes = 0;
        bool isFull = false; // since reading paused; only for the connection thread
    };
    struct Share;
    struct User : Holder {
        const Share* completing = nullptr; // the share whose frame may be completed; only for the connection thread
    };
    // What one connection holds. It belongs to one memory.
    struct Share : Holder {
        std::shared_ptr<User> user;
    };

    // `wake` makes the connection thread look for room (`mayHaveRoom`) soon. Any thread calls it, so it must not wait
    // for anything.
    explicit TransitMemory(std::function<void()> wake) : wake_(std::move(wake)) { }

    // Without this there are no limits. Before the first share is made.
    void setLimits(std::function<MemoryLimits()> limits) { limits_ = std::move(limits); }

    [[nodiscard]] std::shared_ptr<Share> makeShare(std::uint32_t user);

    // The connection holds so many bytes more, or less. True if they count.
    bool add(Share& share, std::size_t bytes) noexcept;
    void remove(Share& share, std::size_t bytes) noexcept;

    // How much may be read for the share, of whose bytes so many are a part of a frame; 0: the connection has to wait.
    // Connection thread.
    [[nodiscard]] std::size_t roomFor(Share& share, std::size_t ofAPart);
    // Whether `roomFor` would not be 0. Connection thread.
    [[nodiscard]] bool mayHaveRoom(Share& share, std::size_t ofAPart) { return find(share, ofAPart) != Room::None; }
    // The share has no part of a frame any more. Connection thread.
    void completed(const Share& share);

    // Who must give up what it holds, because a limit is exceeded.
    enum class Excess : std::uint8_t { None, OfTheClient, OfTheUser, OfTheService };
    [[nodiscard]] Excess excess(const Share& share) const;
    // The user whose connections hold the most, or null.
    [[nodiscard]] std::shared_ptr<const User> largestUser();

private:
    enum class Room : std::uint8_t { None, Little, ForTheFrame, Ample };

    [[nodiscard]] bool hasRoomForReading(Share& share);
    [[nodiscard]] Room look(Share& share, std::size_t ofAPart);
    [[nodiscard]] Room find(Share& share, std::size_t ofAPart);

    const std::function<void()> wake_;
    std::function<MemoryLimits()> limits_ = [] { return unlimited; };
    Holder all_;
    std::atomic<bool> isRoomAwaited_ = false;
    foundation::Mutex lock_;
    std::map<std::uint32_t, std::weak_ptr<User>> users_ KESTO_GUARDED_BY(lock_); // by number
};

} // namespace platform
