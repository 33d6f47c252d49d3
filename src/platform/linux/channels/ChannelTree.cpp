// SPDX-License-Identifier: Apache-2.0
// The root is opened here; the walk below it is in a file of its own.
#include "platform/linux/channels/ChannelTree.h"

#include "foundation/text/Format.h"
#include "platform/linux/channels/ChannelWalk.h"
#include "platform/linux/channels/OpenFolders.h"

#include <cerrno>
#include <fcntl.h>

namespace platform {

std::vector<std::string> LeftOutChannels::inWords(const ChannelTreeLimits& limits) const
{
    using foundation::format;
    std::vector<std::string> lines;
    if (beyondDrivers > 0)
        lines.push_back(format("drivers left out of a sample: at least {}, beyond the {} names in the channel root "
                               "that it looks at",
                               beyondDrivers, limits.drivers));
    if (beyondFolders > 0)
        lines.push_back(
            format("folders left out of a sample: {}, beyond the {} that it opens", beyondFolders, limits.folders));
    if (beyondNames > 0)
        lines.push_back(format("folders left out of a sample, in part or whole: at least {}, beyond the {} names that "
                               "it looks at",
                               beyondNames, limits.names));
    if (beyondChannels > 0)
        lines.push_back(
            format("channels left out of a sample: {}, beyond the {} that it takes", beyondChannels, limits.channels));
    if (beyondBytes > 0)
        lines.push_back(format("channels left out of a sample: {}, beyond the {} bytes of files that it takes",
                               beyondBytes, limits.bytes));
    if (beyondTime > 0)
        lines.push_back(format("folders and channels left out of a sample: at least {}, beyond the {} ms that it takes",
                               beyondTime, limits.time.count()));
    return lines;
}

std::expected<ChannelReading, std::error_code> ChannelTree::read(const std::vector<ChannelSelection>& selections,
                                                                 const std::vector<std::string>& knownDrivers) const
{
    const auto root = openFolder(AT_FDCWD, root_.c_str(), 0);
    if (!root && root.error() == ENOENT)
        return ChannelReading();
    if (!root)
        return std::unexpected(std::error_code(root.error(), std::generic_category()));
    return ChannelWalk(root->get(), selections, limits_, now_).run(knownDrivers);
}

} // namespace platform
