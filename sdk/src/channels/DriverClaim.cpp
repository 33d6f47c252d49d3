// SPDX-License-Identifier: Apache-2.0
// The files of dead publishers are found by a search through the driver's folders, because no list of them exists.
#include "channels/DriverClaim.h"

#include "platform/linux/channels/ChannelOwner.h"
#include "platform/linux/files/FilesAt.h"

#include <fcntl.h>
#include <limits>
#include <map>
#include <sys/stat.h>
#include <unistd.h>
#include <utility>
#include <vector>

namespace libkesto {
namespace {

using platform::FileDescriptor;

std::vector<std::string> namesIn(int folder)
{
    return platform::namesIn(folder, std::numeric_limits<std::size_t>::max()).value_or(std::vector<std::string>());
}

// Opens a folder in which only this user and the administrator can replace files.
FileDescriptor openOwn(int parent, const std::string& name)
{
    auto folder = platform::openDirectoryAt(parent, name);
    struct stat status = {};
    const bool isOwn =
        folder && ::fstat(folder->get(), &status) == 0 && (status.st_uid == ::geteuid() || status.st_uid == 0);
    return isOwn ? *std::move(folder) : FileDescriptor();
}

class Clearance {
public:
    // `aside` is a name of hidden files that only this publisher uses.
    Clearance(int driverFolder, std::string aside) : driver_(driverFolder), aside_(std::move(aside)) { }

    void run()
    {
        const auto names = namesIn(driver_);
        for (const std::string& name : names)
            clearGroup(name);
        for (const std::string& name : names) // last, because the other files are recognised by them
            if (isGone(platform::ownerOfChannelOwnerFile(name)) && platform::isOwnFileAt(driver_, name))
                ::unlinkat(driver_, name.c_str(), 0);
    }

private:
    void clearGroup(const std::string& name)
    {
        const FileDescriptor group = openOwn(driver_, name);
        bool isClearer = false;
        for (const std::string& subgroup : group ? namesIn(group.get()) : std::vector<std::string>())
            isClearer = clearSubgroup(group.get(), subgroup) || isClearer;
        if (isClearer)
            ::unlinkat(driver_, name.c_str(), AT_REMOVEDIR); // if it is empty
    }

    // Returns whether something was removed.
    bool clearSubgroup(int group, const std::string& name)
    {
        const FileDescriptor subgroup = openOwn(group, name);
        bool isClearer = false;
        for (const std::string& file : subgroup ? namesIn(subgroup.get()) : std::vector<std::string>())
            isClearer = clearFile(subgroup.get(), file) || isClearer;
        if (isClearer)
            ::unlinkat(group, name.c_str(), AT_REMOVEDIR);
        return isClearer;
    }

    // A living publisher may put its channel in the place of a dead one's at any moment.
    bool clearFile(int folder, const std::string& name)
    {
        return platform::removeFileAtIf(folder, name, aside_, [&](const std::string& file) {
            const bool isUnfinished = name.starts_with('.');
            return platform::isOwnFileAt(folder, file)
                && isGone(isUnfinished ? platform::ownerOfChannelTemporaryFile(name) : ownerOfChannel(folder, file));
        });
    }

    // Valid until the next call.
    std::string_view ownerOfChannel(int folder, const std::string& name)
    {
        text_ = platform::readFileAt(folder, name, longestLine).value_or(std::string());
        std::string_view text = text_;
        return platform::takeChannelOwner(text);
    }

    bool isGone(std::string_view owner)
    {
        if (owner.empty())
            return false;
        const auto known = owners_.find(owner);
        if (known != owners_.end())
            return known->second;
        return owners_.emplace(owner, platform::isChannelOwnerGone(driver_, owner)).first->second;
    }

    static constexpr std::size_t longestLine = 64;

    const int driver_;
    const std::string aside_;
    std::string text_;
    std::map<std::string, bool, std::less<>> owners_; // whether each has ended
};

} // namespace

DriverClaim::DriverClaim(std::string owner)
    : owner_(std::move(owner)),
      fileName_(platform::channelOwnerFileName(owner_))
{
}

DriverClaim::~DriverClaim()
{
    if (file_)
        ::unlinkat(folder_.get(), fileName_.c_str(), 0);
}

void DriverClaim::renew(int driverFolder)
{
    if (holds(driverFolder))
        return;
    file_ = platform::makeChannelOwnerFile(driverFolder, owner_);
    folder_ = FileDescriptor(::fcntl(driverFolder, F_DUPFD_CLOEXEC, 0));
    line_ = file_ ? platform::channelOwnerLine(owner_) : std::string();
    Clearance(driverFolder, platform::channelTemporaryFileName(owner_)).run();
}

bool DriverClaim::holds(int driverFolder) const noexcept
{
    struct stat held = {};
    struct stat there = {};
    return file_ && ::fstat(file_.get(), &held) == 0
        && ::fstatat(driverFolder, fileName_.c_str(), &there, AT_SYMLINK_NOFOLLOW) == 0 && held.st_dev == there.st_dev
        && held.st_ino == there.st_ino;
}

bool DriverClaim::isLost() const noexcept
{
    struct stat status = {};
    return file_ && ::fstat(file_.get(), &status) == 0 && status.st_nlink == 0;
}

} // namespace libkesto
