// Who is being served stays at the front of its contest until it is charged: all others come in behind it.
#include "platform/linux/queues/FairOrder.h"

#include <algorithm>
#include <cassert>
#include <utility>

namespace platform {

struct FairOrder::User {
    Duration used{};
    Duration now{}; // what the lane that was served last had used before
    Contest<Lane> lanes;
    bool isInContest = false;
};

struct FairOrder::Lane {
    const std::shared_ptr<User> user;
    Duration used{};
    std::deque<Item> items;
    bool isInContest = false;
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

template <typename Contest, typename Contestant>
void enter(Contest& contest, const std::shared_ptr<Contestant>& contestant, FairOrder::Duration now)
{
    if (std::exchange(contestant->isInContest, true))
        return;
    contestant->used = std::max(contestant->used, now);
    contest.emplace(contestant->used, contestant);
}

// The first of the contest goes to its new place, or leaves.
template <typename Contest> void chargeFirst(Contest& contest, FairOrder::Duration time, bool stays)
{
    auto first = contest.extract(contest.begin());
    first.mapped()->used += time;
    first.mapped()->isInContest = stays;
    first.key() = first.mapped()->used;
    if (stays)
        contest.insert(std::move(first));
}

} // namespace

// A lane that waits and its user own each other.
FairOrder::~FairOrder()
{
    for (const auto& [used, user] : contest_)
        user->lanes.clear();
}

std::shared_ptr<FairOrder::Lane> FairOrder::makeLane(std::uint32_t user)
{
    std::erase_if(users_, [](const auto& known) { return known.second.expired(); });
    std::weak_ptr<User>& known = users_[user];
    auto owner = known.lock();
    if (owner == nullptr)
        known = owner = std::make_shared<User>();
    return std::make_shared<Lane>(std::move(owner));
}

void FairOrder::add(const std::shared_ptr<Lane>& lane, Item item)
{
    lane->items.push_back(std::move(item));
    ++waiting_;
    enter(lane->user->lanes, lane, lane->user->now);
    enter(contest_, lane->user, now_);
}

bool FairOrder::isFull(Lane& lane)
{
    return lane.wantsRoom = lane.items.size() >= mostWaiting;
}

void FairOrder::setRoomHandler(Lane& lane, std::shared_ptr<const RoomHandler> handler)
{
    lane.roomHandler = std::move(handler);
}

bool FairOrder::isContested() const
{
    return contest_.size() > 1 || (!contest_.empty() && contest_.begin()->second->lanes.size() > 1);
}

const FairOrder::Item& FairOrder::front() const
{
    return contest_.begin()->second->lanes.begin()->second->items.front();
}

std::shared_ptr<const FairOrder::RoomHandler> FairOrder::take(std::vector<Item>& items, std::size_t most)
{
    assert(waiting_ > 0);
    User& user = *contest_.begin()->second;
    Lane& lane = *user.lanes.begin()->second;
    now_ = user.used;
    user.now = lane.used;
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
    User& user = *contest_.begin()->second;
    Lane& lane = *user.lanes.begin()->second;
    lane.together =
        time < longTogether ? std::min(2 * lane.together, mostTogether) : std::max<std::size_t>(lane.together / 2, 1);
    chargeFirst(user.lanes, time, !lane.items.empty());
    chargeFirst(contest_, time, !user.lanes.empty());
}

} // namespace platform
