// SPDX-License-Identifier: Apache-2.0
// The publisher's side of the channel tree: it makes missing folders, opens them step by step and never through a link,
// and puts complete files into them.
//
// Other users may write to the tree, too, and this program may have more rights than they have. So it does not use a
// folder that belongs neither to its user nor to the system's administrator: the owner could replace its content at any
// time.
#pragma once

#include "channels/DriverClaim.h"
#include "kesto/channels.h"
#include "platform/linux/files/FileDescriptor.h"

#include <array>
#include <expected>
#include <memory>
#include <string>
#include <string_view>

namespace libkesto {

// Driver, group and subgroup, as names of folders.
using ChannelPlace = std::array<std::string, 3>;

// The name of a folder or a file for a caller's name. KESTO_INVALID_ARGUMENT, KESTO_INVALID_UTF8 or KESTO_TOO_LARGE if
// a channel cannot have that name.
[[nodiscard]] std::expected<std::string, kesto_status> channelFileName(const char* given);
// The same for a group or a subgroup, where null means none.
[[nodiscard]] std::expected<std::string, kesto_status> channelGroupName(const char* given);
// Text without control characters, for a line of a file: units and names of states.
[[nodiscard]] std::expected<std::string, kesto_status> channelText(const char* given);

// The default path of the tree. Reads the environment.
[[nodiscard]] std::string usualChannelRoot();

// One folder with channels. One thread at a time. Functions that return an int return 0 or an `errno`.
class ChannelFolder {
public:
    // New files are written as `temporaryName`, which is hidden and belongs to this publisher alone. `claim` is the
    // publisher's claim to this driver.
    ChannelFolder(std::string root, ChannelPlace place, std::string temporaryName, std::shared_ptr<DriverClaim> claim);
    // Removes empty folders. The claim ends with the last folder that holds it.
    ~ChannelFolder();
    ChannelFolder(const ChannelFolder&) = delete;
    ChannelFolder& operator=(const ChannelFolder&) = delete;

    // Puts a file with this content in place. Makes the folders if they are missing.
    [[nodiscard]] int replace(const std::string& name, std::string_view text) noexcept;
    void remove(const std::string& name) noexcept;

private:
    [[nodiscard]] int open() noexcept;
    [[nodiscard]] int write(const std::string& name, std::string_view text) noexcept;

    const std::string root_;
    const ChannelPlace place_;
    const std::string temporaryName_;
    std::shared_ptr<DriverClaim> claim_;
    platform::FileDescriptor folder_;
};

} // namespace libkesto
