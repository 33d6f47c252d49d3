// SPDX-License-Identifier: Apache-2.0
// The kernel says how much room the groups take if there is too little.
#include "platform/linux/connection/TrustedPeer.h"

#include <algorithm>
#include <sys/socket.h>

namespace platform {

bool isTrusted(uid_t user, std::span<const gid_t> groups, uid_t ownUser, gid_t ownGroup)
{
    return user == 0 || user == ownUser || std::ranges::find(groups, ownGroup) != groups.end();
}

std::vector<gid_t> groupsOfPeer(int socket, gid_t primaryGroup)
{
    gid_t first = 0;
    socklen_t size = 0;
    ::getsockopt(socket, SOL_SOCKET, SO_PEERGROUPS, &first, &size);
    std::vector<gid_t> groups(size / sizeof(gid_t));
    if (::getsockopt(socket, SOL_SOCKET, SO_PEERGROUPS, groups.data(), &size) != 0)
        groups.clear();
    groups.push_back(primaryGroup);
    return groups;
}

} // namespace platform
