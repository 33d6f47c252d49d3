// SPDX-License-Identifier: Apache-2.0
// Who comes next when many share the time of one thread, so that no one waits for the work of others.
//
// A share is what one connection wants of that time. Next comes the user whose shares have taken the least time so far,
// among the user's processes the one that took the least, and among the process's shares again: start-time fair
// queueing (P. Goyal, H. M. Vin, H. Cheng, 1996) at three levels. So a process gains nothing by many connections. Who
// wanted nothing for a while goes on where the others are now: a pause earns no time to be used at once later, and
// costs none. There are two limits. After a pause of all, the one that was served last comes behind the others, by the
// time that it took. And new processes of a user may delay the older processes of that user, but not other users.
#pragma once

#include "platform/WorkQueue.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <utility>

namespace platform {

// One thread at a time.
class FairShares {
public:
    using Duration = std::chrono::nanoseconds;

    struct Node;
    // Those of a node that want time, by the time that they used. Who is being served stays at the front: all others
    // come in behind.
    using Contest = std::multimap<Duration, std::shared_ptr<Node>>;
    // A user, a process, or a share.
    struct Node {
        std::shared_ptr<Node> group; // that it takes part in; null: it is the root
        Duration used{};
        Duration now{}; // what the member that was served last had used before
        Contest contest; // empty in a share
    };
    // What takes part derives from this, and leaves it to this class.
    struct Share : Node {
        bool wantsTime = false; // or is being served
    };

    FairShares() = default;
    ~FairShares();
    FairShares(const FairShares&) = delete;
    FairShares& operator=(const FairShares&) = delete;

    // Once for each share, first.
    void admit(Share& share, const Submitter& submitter);
    // The share wants time, until it is charged as one that wants no more.
    void enter(const std::shared_ptr<Share>& share);

    [[nodiscard]] bool isEmpty() const noexcept { return only_ == nullptr && root_->contest.empty(); }
    // Whether several shares want time.
    [[nodiscard]] bool isContested() const;
    // The share that comes next; not if none wants time.
    [[nodiscard]] Share& first() const;
    // The same, which is served now. `charge` must be called before the next call of this.
    [[nodiscard]] Share& serveFirst();
    // The share that was served took so long.
    void charge(Duration time, bool wantsMore);

private:
    using GroupKey = std::pair<std::uint32_t, std::optional<std::int32_t>>; // a user, or one of its processes

    [[nodiscard]] std::shared_ptr<Node> groupOf(const GroupKey& key, const std::shared_ptr<Node>& in);
    void compete(const std::shared_ptr<Node>& node);
    void moveFirst(Node& group, bool wantsMore);

    const std::shared_ptr<Node> root_ = std::make_shared<Node>(); // its members are the users
    std::map<GroupKey, std::weak_ptr<Node>> groups_;
    std::size_t mostGroups_ = 0; // then those without shares are removed
    std::shared_ptr<Share> only_; // the one that wants time, if there is no other: then nothing has to be sorted
};

} // namespace platform
