// SPDX-License-Identifier: Apache-2.0
// The users are a tree with their processes and shares; each node takes part in the contest of its group in the same
// way.
#include "platform/linux/queues/FairShares.h"

#include <algorithm>
#include <utility>

namespace platform {
namespace {

// A node that waits and its group own each other.
void clear(FairShares::Node& node)
{
    for (const auto& [used, member] : std::exchange(node.contest, {}))
        clear(*member);
}

} // namespace

FairShares::~FairShares()
{
    clear(*root_);
}

void FairShares::admit(Share& share, const Submitter& submitter)
{
    const auto user = groupOf({submitter.user, std::nullopt}, root_);
    share.group = groupOf({submitter.user, submitter.process}, user);
}

std::shared_ptr<FairShares::Node> FairShares::groupOf(const GroupKey& key, const std::shared_ptr<Node>& in)
{
    std::weak_ptr<Node>& known = groups_[key];
    if (auto group = known.lock())
        return group;
    auto group = std::make_shared<Node>(Node{.group = in, .used = {}, .now = {}, .contest = {}});
    known = group;
    if (groups_.size() > mostGroups_) {
        std::erase_if(groups_, [](const auto& each) { return each.second.expired(); });
        mostGroups_ = 2 * groups_.size();
    }
    return group;
}

void FairShares::enter(const std::shared_ptr<Share>& share)
{
    if (std::exchange(share->wantsTime, true))
        return;
    for (Node* node = share.get(); node != root_.get(); node = node->group.get())
        node->used = std::max(node->used, node->group->now); // changes nothing for one that competes already
    if (isEmpty()) {
        only_ = share;
        return;
    }
    if (only_ != nullptr)
        compete(std::exchange(only_, nullptr));
    compete(share);
}

void FairShares::compete(const std::shared_ptr<Node>& node)
{
    const auto& group = node->group;
    if (group->contest.empty() && group != root_)
        compete(group);
    group->contest.emplace(node->used, node);
}

bool FairShares::isContested() const
{
    for (const Node* node = root_.get(); !node->contest.empty(); node = node->contest.begin()->second.get())
        if (node->contest.size() > 1)
            return true;
    return false;
}

FairShares::Share& FairShares::first() const
{
    if (only_ != nullptr)
        return *only_;
    Node* node = root_.get();
    while (!node->contest.empty())
        node = node->contest.begin()->second.get();
    return static_cast<Share&>(*node);
}

FairShares::Share& FairShares::serveFirst()
{
    Share& share = first();
    for (Node* node = &share; node != root_.get(); node = node->group.get())
        node->group->now = node->used;
    return share;
}

void FairShares::charge(Duration time, bool wantsMore)
{
    Share& share = first();
    share.wantsTime = wantsMore;
    for (Node* node = &share; node != root_.get(); node = node->group.get())
        node->used += time;
    if (only_ == nullptr)
        moveFirst(*share.group, wantsMore);
    else if (!wantsMore)
        only_.reset();
}

// The first of the group goes to its new place, or leaves, and so does the group.
void FairShares::moveFirst(Node& group, bool wantsMore)
{
    auto first = group.contest.extract(group.contest.begin());
    first.key() = first.mapped()->used;
    if (wantsMore)
        group.contest.insert(std::move(first));
    if (&group != root_.get())
        moveFirst(*group.group, !group.contest.empty());
}

} // namespace platform
