// A user takes part among the users as a share does among those of its user.
#include "platform/linux/queues/FairShares.h"

#include <algorithm>
#include <utility>

namespace platform {

struct FairShares::User {
    Duration used{};
    Duration now{}; // what the share that was served last had used before
    Contest<Share> shares;
};

// A share that waits and its user own each other.
FairShares::~FairShares()
{
    for (const auto& [used, user] : contest_)
        user->shares.clear();
}

void FairShares::admit(Share& share, std::uint32_t user)
{
    std::weak_ptr<User>& known = users_[user];
    share.user = known.lock();
    if (share.user != nullptr)
        return;
    known = share.user = std::make_shared<User>();
    std::erase_if(users_, [](const auto& each) { return each.second.expired(); });
}

void FairShares::enter(const std::shared_ptr<Share>& share)
{
    if (std::exchange(share->wantsTime, true))
        return;
    User& user = *share->user;
    share->used = std::max(share->used, user.now);
    user.used = std::max(user.used, now_); // changes nothing for one that competes already
    if (isEmpty()) {
        only_ = share;
        return;
    }
    if (only_ != nullptr)
        compete(std::exchange(only_, nullptr));
    compete(share);
}

void FairShares::compete(const std::shared_ptr<Share>& share)
{
    const auto& user = share->user;
    if (user->shares.empty())
        contest_.emplace(user->used, user);
    user->shares.emplace(share->used, share);
}

bool FairShares::isContested() const
{
    return contest_.size() > 1 || (!contest_.empty() && contest_.begin()->second->shares.size() > 1);
}

FairShares::Share& FairShares::first() const
{
    return only_ != nullptr ? *only_ : *contest_.begin()->second->shares.begin()->second;
}

FairShares::Share& FairShares::serveFirst()
{
    Share& share = first();
    now_ = share.user->used;
    share.user->now = share.used;
    return share;
}

// The first goes to its new place, or leaves.
template <typename Each> void FairShares::chargeFirst(Contest<Each>& contest, Duration time, bool wantsMore)
{
    auto first = contest.extract(contest.begin());
    first.mapped()->used += time;
    first.key() = first.mapped()->used;
    if (wantsMore)
        contest.insert(std::move(first));
}

void FairShares::charge(Duration time, bool wantsMore)
{
    first().wantsTime = wantsMore;
    if (only_ != nullptr) {
        only_->used += time;
        only_->user->used += time;
        if (!wantsMore)
            only_.reset();
        return;
    }
    User& user = *contest_.begin()->second;
    chargeFirst(user.shares, time, wantsMore);
    chargeFirst(contest_, time, !user.shares.empty());
}

} // namespace platform
