// SPDX-License-Identifier: Apache-2.0
// Which clients may know what others did: whose messages and events the service refused, lost or removed.
#pragma once

#include <span>
#include <sys/types.h>
#include <vector>

namespace platform {

// Whether a process of this user and these groups may: root, the service's own user, and members of its group.
[[nodiscard]] bool isTrusted(uid_t user, std::span<const gid_t> groups, uid_t ownUser, gid_t ownGroup);

// The groups that the process at the other end of the socket had when it connected, its primary group included. Only
// that if the kernel does not say the others.
[[nodiscard]] std::vector<gid_t> groupsOfPeer(int socket, gid_t primaryGroup);

} // namespace platform
