// SPDX-License-Identifier: Apache-2.0
// Calls that reach very many sessions: of each user one at a time.
//
// Such a call goes on in slices, so that others run in between, and keeps meanwhile what it has gathered: a message, or
// the IDs of all sessions. Without this, every connection of a user could make the service keep that once more.
#pragma once

#include "platform/WorkQueue.h"

#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <memory>

namespace client {

// Owned by a shared pointer. Server queue.
class LongCalls : public std::enable_shared_from_this<LongCalls> {
public:
    // Belongs to the call that is under way. The user's next one begins when it is let go of.
    using Place = std::shared_ptr<const void>;
    using Work = std::move_only_function<void(platform::Turn& turn, Place place)>;

    // Runs the work at once, or, while another call of that user is under way, in a later item of the lane, which
    // pauses until then. For an item of the lane, submitted by `submitLong`, as its last step.
    void begin(platform::Turn& turn, std::uint32_t user, platform::Lane& lane, Work work);

private:
    struct Waiting {
        platform::Lane::Resume resume;
        Work work;
    };

    [[nodiscard]] Place placeOf(std::uint32_t user);
    void leave(std::uint32_t user);

    std::map<std::uint32_t, std::deque<Waiting>> users_; // those with a call under way
};

} // namespace client
