// The order in which the items of many lanes run, so that no lane and no user waits for the work of others.
//
// A lane is a sequence of items, such as the calls of one client; it belongs to a user. The next items are those of the
// user whose items have taken the least time so far, and among the user's lanes those of the lane that took the least:
// start-time fair queueing (P. Goyal, H. M. Vin, H. Cheng, 1996) at two levels. A lane or user that had nothing to run
// goes on where the others are now: a pause earns no time to be used at once later, and costs none.
#pragma once

#include "platform/WorkQueue.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <vector>

namespace platform {

// One thread at a time.
class FairOrder {
public:
    using Duration = std::chrono::nanoseconds;

    FairOrder() = default;
    ~FairOrder();
    FairOrder(const FairOrder&) = delete;
    FairOrder& operator=(const FairOrder&) = delete;

    struct Item {
        TurnItem run;
        bool mayTakeLong = false;
    };
    struct User;
    struct Lane;

    using RoomHandler = std::function<void()>;

    [[nodiscard]] std::shared_ptr<Lane> makeLane(std::uint32_t user);
    void add(const std::shared_ptr<Lane>& lane, Item item);

    // Whether so many items of the lane wait that its submitter should pause. `take` then says when few are left.
    [[nodiscard]] static bool isFull(Lane& lane);
    static void setRoomHandler(Lane& lane, std::shared_ptr<const RoomHandler> handler);

    // Whether items of several lanes wait or are being served.
    [[nodiscard]] bool isContested() const;
    // The number of items that wait.
    [[nodiscard]] std::size_t waiting() const noexcept { return waiting_; }
    // The item that runs next; not when none waits.
    [[nodiscard]] const Item& front() const;
    // Takes items that run next, all of one lane: at most so many, and only as many as took little time before. One
    // that may take long comes alone. `charge` must be called before the next call of this. Returns the lane's handler
    // if it was full and has room again.
    [[nodiscard]] std::shared_ptr<const RoomHandler> take(std::vector<Item>& items, std::size_t most);
    // What was taken last took so long.
    void charge(Duration time);

private:
    // Those that have items waiting, or are being served, by the time that they used.
    template <typename Contestant> using Contest = std::multimap<Duration, std::shared_ptr<Contestant>>;

    std::map<std::uint32_t, std::weak_ptr<User>> users_;
    Contest<User> contest_;
    Duration now_{}; // what the user that was served last had used before
    std::size_t waiting_ = 0;
};

} // namespace platform
