// SPDX-License-Identifier: Apache-2.0
// Who may know what others did.
#include "platform/linux/connection/TrustedPeer.h"

#include "platform/linux/files/FileDescriptor.h"

#include <array>
#include <gmock/gmock.h>
#include <sys/socket.h>
#include <unistd.h>

namespace platform {
namespace {

constexpr uid_t serviceUser = 990;
constexpr gid_t serviceGroup = 980;

bool isTrustedHere(uid_t user, const std::vector<gid_t>& groups)
{
    return isTrusted(user, groups, serviceUser, serviceGroup);
}

TEST(TrustedPeer, IsRootAndTheServicesOwnUser)
{
    EXPECT_TRUE(isTrustedHere(0, {}));
    EXPECT_TRUE(isTrustedHere(serviceUser, {100}));
}

TEST(TrustedPeer, IsAMemberOfTheServicesGroup)
{
    EXPECT_TRUE(isTrustedHere(1000, {100, serviceGroup, 27}));
    EXPECT_TRUE(isTrustedHere(1000, {serviceGroup}));
}

TEST(TrustedPeer, IsNoOtherUserWhateverItsGroups)
{
    EXPECT_FALSE(isTrustedHere(1000, {}));
    EXPECT_FALSE(isTrustedHere(1000, {100, 27, 0}));
    EXPECT_FALSE(isTrustedHere(serviceGroup, {serviceUser})) << "users and groups are not the same numbers";
}

TEST(TrustedPeer, HasTheGroupsThatTheKernelReports)
{
    std::array<int, 2> ends = {};
    ASSERT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends.data()), 0);
    const FileDescriptor one(ends[0]);
    const FileDescriptor other(ends[1]);
    std::vector<gid_t> expected(static_cast<std::size_t>(::getgroups(0, nullptr)));
    ASSERT_GE(::getgroups(static_cast<int>(expected.size()), expected.data()), 0);
    expected.push_back(4711);
    EXPECT_THAT(groupsOfPeer(one.get(), 4711), testing::UnorderedElementsAreArray(expected));
}

TEST(TrustedPeer, HasItsPrimaryGroupIfTheKernelDoesNotSayTheOthers)
{
    EXPECT_THAT(groupsOfPeer(-1, 4711), testing::ElementsAre(4711));
}

} // namespace
} // namespace platform
