// SPDX-License-Identifier: Apache-2.0
// A lane has a share in the time for as long as items of it wait.
#include "platform/linux/queues/FairOrder.h"

#include <algorithm>
#include <cassert>
#include <deque>
#include <utility>

namespace platform {

namespace {

// Items that came together, and what they hold.
struct Batch {
    std::uint64_t end; // the number of the item behind them
    std::size_t bytes;
};

} // namespace

struct FairOrder::Lane : FairShares::Share {
    std::deque<Item> items;
    std::uint64_t added = 0; // items, ever; those that continue a pause do not count again
    std::deque<Batch> batches; // that have not run whole
    bool isPausing = false;
    std::size_t together = 1; // items that are taken at once
    bool wantsRoom = false;
    std::shared_ptr<const RoomHandler> roomHandler;
    ReleaseHandler releaseHandler;
    std::shared_ptr<ledger::Workload> workload; // null: its time is not counted
    std::shared_ptr<LogShare> logShare; // null: it may write all lines

    void release();
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

std::shared_ptr<FairOrder::Lane> FairOrder::makeLane(const Submitter& submitter)
{
    auto lane = std::make_shared<Lane>();
    shares_.admit(*lane, submitter);
    return lane;
}

void FairOrder::add(const std::shared_ptr<Lane>& lane, Item item)
{
    lane->items.push_back(std::move(item));
    ++lane->added;
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

bool FairOrder::isFull(Lane& lane, std::size_t heldBytes)
{
    if (heldBytes != 0)
        lane.batches.push_back({lane.added, heldBytes});
    if (!lane.wantsTime) // it may all have run already
        lane.release();
    return lane.wantsRoom = lane.items.size() >= mostWaiting;
}

void FairOrder::setRoomHandler(Lane& lane, std::shared_ptr<const RoomHandler> handler)
{
    lane.roomHandler = std::move(handler);
}

void FairOrder::setReleaseHandler(Lane& lane, ReleaseHandler handler)
{
    lane.releaseHandler = std::move(handler);
}

void FairOrder::setWorkload(Lane& lane, std::shared_ptr<ledger::Workload> workload)
{
    lane.workload = std::move(workload);
}

void FairOrder::setLogShare(Lane& lane, std::shared_ptr<LogShare> share)
{
    lane.logShare = std::move(share);
}

void FairOrder::Lane::release()
{
    const std::uint64_t ran = added - items.size() - (isPausing ? 1 : 0); // the item that paused goes on
    for (; !batches.empty() && batches.front().end <= ran; batches.pop_front())
        if (releaseHandler)
            releaseHandler(batches.front().bytes);
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

LogShare* FairOrder::logShare() const
{
    return static_cast<const Lane&>(shares_.first()).logShare.get();
}

void FairOrder::charge(Duration time)
{
    auto& lane = static_cast<Lane&>(shares_.first());
    lane.together =
        time < longTogether ? std::min(2 * lane.together, mostTogether) : std::max<std::size_t>(lane.together / 2, 1);
    lane.release();
    if (lane.workload)
        lane.workload->took(time);
    shares_.charge(time, !lane.items.empty() && !lane.isPausing);
}

} // namespace platform
