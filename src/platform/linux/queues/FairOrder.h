// SPDX-License-Identifier: Apache-2.0
// The order in which the items of many lanes run, so that no lane, process or user waits for the work of others.
//
// A lane is a sequence of items, such as the calls of one client. The time of those that run decides whose are next
// (see FairShares).
#pragma once

#include "ledger/Workload.h"
#include "platform/WorkQueue.h"
#include "platform/linux/queues/FairShares.h"

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <vector>

namespace platform {

// One thread at a time.
class FairOrder {
public:
    using Duration = FairShares::Duration;

    struct Item {
        TurnItem run;
        bool mayTakeLong = false;
    };
    struct Lane;

    using RoomHandler = std::function<void()>;
    using ReleaseHandler = std::function<void(std::size_t bytes)>;

    [[nodiscard]] std::shared_ptr<Lane> makeLane(const Submitter& submitter);
    void add(const std::shared_ptr<Lane>& lane, Item item);

    // Whether so many items of the lane wait that its submitter should pause. `take` then says when few are left. What
    // was added since the last call holds so many bytes: the release handler gets them when all of it has run.
    [[nodiscard]] static bool isFull(Lane& lane, std::size_t heldBytes);
    static void setRoomHandler(Lane& lane, std::shared_ptr<const RoomHandler> handler);
    static void setReleaseHandler(Lane& lane, ReleaseHandler handler);
    // The time of the lane's items counts there, too.
    static void setWorkload(Lane& lane, std::shared_ptr<ledger::Workload> workload);
    // The lane's items write to the log for that share.
    static void setLogShare(Lane& lane, std::shared_ptr<LogShare> share);

    // The lane's items no longer wait, until `resume` makes this item its first. The lane must be the one that is being
    // served, and its item must have come alone.
    void pause(Lane& lane);
    void resume(const std::shared_ptr<Lane>& lane, Item item);
    // The number of lanes that pause, and of the items in them.
    [[nodiscard]] std::size_t pausing() const noexcept { return pausing_; }
    [[nodiscard]] std::size_t heldBack() const noexcept { return heldBack_; }

    // Whether items of several lanes wait or are being served.
    [[nodiscard]] bool isContested() const { return shares_.isContested(); }
    // The number of items that wait; those of lanes that pause do not.
    [[nodiscard]] std::size_t waiting() const noexcept { return waiting_; }
    // The item that runs next; not when none waits.
    [[nodiscard]] const Item& front() const;
    // Takes items that run next, all of one lane: at most so many, and only as many as took little time before. One
    // that may take long comes alone. `charge` must be called before the next call of this. Returns the lane's handler
    // if it was full and has room again.
    [[nodiscard]] std::shared_ptr<const RoomHandler> take(std::vector<Item>& items, std::size_t most);
    // For whose share the items that were taken last write to the log; null: for none. Valid until `charge`.
    [[nodiscard]] LogShare* logShare() const;
    // What was taken last has run, and took so long.
    void charge(Duration time);

private:
    FairShares shares_;
    std::size_t waiting_ = 0;
    std::size_t pausing_ = 0;
    std::size_t heldBack_ = 0;
};

} // namespace platform
