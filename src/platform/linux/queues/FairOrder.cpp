// A lane has a share in the time for as long as items of it wait.
#include "platform/linux/queues/FairOrder.h"

#include <algorithm>
#include <cassert>
#include <deque>
#include <utility>

namespace platform {

struct FairOrder::Lane : FairShares::Share {
    std::deque<Item> items;
    bool isPausing = false;
    std::size_t together = 1; // items that are taken at once
    bool wantsRoom = false;
    std::shared_ptr<const RoomHandler> roomHandler;
};

namespace {

// So many items are taken together, and fewer if they take longer: another lane then does not wait for them much longer
// than for one.
constexpr std::size_t mostTogether = 16;
constexpr std::chrono::microseconds longTogether{20};

// What waits of a lane keeps the queue busy until the submitter's next items come, and costs little memory.
constexpr std::size_t mostWaiting = 512;
constexpr std::size_t fewWaiting = mostWaiting / 2;

} // namespace

std::shared_ptr<FairOrder::Lane> FairOrder::makeLane(std::uint32_t user)
{
    auto lane = std::make_shared<Lane>();
    shares_.admit(*lane, user);
    return lane;
}

void FairOrder::add(const std::shared_ptr<Lane>& lane, Item item)
{
    lane->items.push_back(std::move(item));
    if (lane->isPausing) {
        ++heldBack_;
        return;
    }
    ++waiting_;
    shares_.enter(lane);
}

void FairOrder::pause(Lane& lane)
{
    assert(!lane.isPausing);
    lane.isPausing = true;
    ++pausing_;
    heldBack_ += lane.items.size();
    waiting_ -= lane.items.size();
}

void FairOrder::resume(const std::shared_ptr<Lane>& lane, Item item)
{
    assert(lane->isPausing);
    lane->isPausing = false;
    --pausing_;
    heldBack_ -= lane->items.size();
    lane->items.push_front(std::move(item));
    waiting_ += lane->items.size();
    shares_.enter(lane);
}

bool FairOrder::isFull(Lane& lane)
{
    return lane.wantsRoom = lane.items.size() >= mostWaiting;
}

void FairOrder::setRoomHandler(Lane& lane, std::shared_ptr<const RoomHandler> handler)
{
    lane.roomHandler = std::move(handler);
}

const FairOrder::Item& FairOrder::front() const
{
    return static_cast<const Lane&>(shares_.first()).items.front();
}

std::shared_ptr<const FairOrder::RoomHandler> FairOrder::take(std::vector<Item>& items, std::size_t most)
{
    assert(waiting_ > 0);
    auto& lane = static_cast<Lane&>(shares_.serveFirst());
    const std::size_t count = std::min({lane.items.size(), lane.together, most});
    do {
        items.push_back(std::move(lane.items.front()));
        lane.items.pop_front();
    } while (items.size() < count && !items.back().mayTakeLong && !lane.items.front().mayTakeLong);
    waiting_ -= items.size();
    if (!lane.wantsRoom || lane.items.size() > fewWaiting)
        return nullptr;
    lane.wantsRoom = false;
    return lane.roomHandler;
}

void FairOrder::charge(Duration time)
{
    auto& lane = static_cast<Lane&>(shares_.first());
    lane.together =
        time < longTogether ? std::min(2 * lane.together, mostTogether) : std::max<std::size_t>(lane.together / 2, 1);
    shares_.charge(time, !lane.items.empty() && !lane.isPausing);
}

} // namespace platform
