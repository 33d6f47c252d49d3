// SPDX-License-Identifier: Apache-2.0
// A table of users; one without such ends is not in it.
#include "platform/linux/connection/UnfinishedEnds.h"

#include <cassert>
#include <utility>

namespace platform {

void UnfinishedEnds::add(const Submitter& process)
{
    const foundation::Lock lock(lock_);
    User& user = users_[process.user];
    ++user.ends;
    ++user.endsOfProcesses[process.process];
}

void UnfinishedEnds::remove(const Submitter& process)
{
    const foundation::Lock lock(lock_);
    const auto user = users_.find(process.user);
    assert(user != users_.end());
    const auto ofProcess = user->second.endsOfProcesses.find(process.process);
    assert(ofProcess != user->second.endsOfProcesses.end());
    if (--ofProcess->second == 0)
        user->second.endsOfProcesses.erase(ofProcess);
    if (--user->second.ends == 0)
        users_.erase(user);
}

std::optional<UnfinishedEnds::Refusal> UnfinishedEnds::refusal(const Submitter& process)
{
    const foundation::Lock lock(lock_);
    const auto known = users_.find(process.user);
    if (known == users_.end() || known->second.ends < mostOfAUser)
        return std::nullopt;
    User& user = known->second;
    const auto ofProcess = user.endsOfProcesses.find(process.process);
    if (ofProcess == user.endsOfProcesses.end() || ofProcess->second < alwaysOfAProcess)
        return std::nullopt;
    return Refusal{
        .endsOfUser = user.ends, .endsOfProcess = ofProcess->second, .isFirst = !std::exchange(user.wasRefused, true)};
}

} // namespace platform
