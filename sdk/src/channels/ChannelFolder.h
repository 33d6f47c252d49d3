// The folders of the channel tree, from the publisher's side: made where they are missing, entered step by step and
// never through a link, and filled with files that are complete when they appear.
//
// Others may write where this program does, and it may be one with more rights than theirs. So a folder that belongs
// neither to its user nor to the system's administrator is not entered: what is in it could be exchanged at any time.
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

// The name of a folder or a file for what a caller gave. KESTO_INVALID_ARGUMENT, KESTO_INVALID_UTF8 or KESTO_TOO_LARGE
// for what no channel can be called.
[[nodiscard]] std::expected<std::string, kesto_status> channelFileName(const char* given);
// The same for a group or a subgroup, of which null means that there is none.
[[nodiscard]] std::expected<std::string, kesto_status> channelGroupName(const char* given);
// Text without control characters, for a line of a file: units and names of states.
[[nodiscard]] std::expected<std::string, kesto_status> channelText(const char* given);

// Where the tree is by default. Reads the environment.
[[nodiscard]] std::string usualChannelRoot();

// One folder with channels. One thread at a time. Functions that return an int return 0 or an `errno`.
class ChannelFolder {
public:
    // `temporaryName` is under what name a new file is written: hidden, and of nobody else. The claim is the
    // publisher's to this driver.
    ChannelFolder(std::string root, ChannelPlace place, std::string temporaryName, std::shared_ptr<DriverClaim> claim);
    // Removes the folders that are empty. The claim ends with the last folder that holds it.
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
