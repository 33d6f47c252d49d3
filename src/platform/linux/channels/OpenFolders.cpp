// SPDX-License-Identifier: Apache-2.0
// Every step starts from the open folder before it, so that no link on the way can lead out of the tree.
#include "platform/linux/channels/OpenFolders.h"

#include <cerrno>
#include <fcntl.h>
#include <unistd.h>

namespace platform {

std::expected<OpenFolder, int> openFolder(int parent, const char* name, int linkFlag)
{
    const int descriptor = ::openat(parent, name, O_RDONLY | O_DIRECTORY | O_CLOEXEC | linkFlag);
    if (descriptor < 0)
        return std::unexpected(errno);
    OpenFolder folder(::fdopendir(descriptor));
    if (folder)
        return folder;
    const int error = errno;
    ::close(descriptor);
    return std::unexpected(error);
}

int descriptorOf(DIR* folder) noexcept
{
    return ::dirfd(folder);
}

std::expected<DIR*, int> OpenFolders::open(const SharedPlace& place)
{
    if (open_.size() > place->depth && open_[place->depth].first == place)
        return open_[place->depth].second.get();
    const auto parent = place->parent ? open(place->parent) : root_;
    if (!parent)
        return parent;
    auto folder = openFolder(descriptorOf(*parent), place->name.c_str(), O_NOFOLLOW);
    open_.resize(place->depth);
    if (!folder)
        return std::unexpected(folder.error());
    return open_.emplace_back(place, *std::move(folder)).second.get();
}

} // namespace platform
