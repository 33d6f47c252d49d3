// SPDX-License-Identifier: Apache-2.0
// All texts are one prefix, the owner and one suffix.
#include "platform/linux/channels/ChannelOwner.h"

#include "foundation/text/Format.h"
#include "platform/linux/files/FilesAt.h"
#include "platform/linux/files/LockedFile.h"

#include <unistd.h>

namespace platform {
namespace {

constexpr std::string_view lineBegin = "owner ";
constexpr std::string_view lineEnd = "\n";
constexpr std::string_view nameBegin = ".kesto-";
constexpr std::string_view ownerFileEnd = ".owner";
constexpr std::string_view temporaryFileEnd = ".tmp";

} // namespace

std::string channelOwnerLine(std::string_view owner)
{
    return foundation::format("{}{}{}", lineBegin, owner, lineEnd);
}

std::string channelOwnerFileName(std::string_view owner)
{
    return foundation::format("{}{}{}", nameBegin, owner, ownerFileEnd);
}

std::string channelTemporaryFileName(std::string_view owner)
{
    return foundation::format("{}{}{}", nameBegin, owner, temporaryFileEnd);
}

std::string_view takeChannelOwner(std::string_view& text)
{
    const std::string_view line = text.substr(0, text.find('\n') + 1);
    const std::string_view owner = randomDigitsBetween(lineBegin, lineEnd, line);
    if (!owner.empty())
        text.remove_prefix(line.size());
    return owner;
}

std::string_view ownerOfChannelOwnerFile(std::string_view name)
{
    return randomDigitsBetween(nameBegin, ownerFileEnd, name);
}

std::string_view ownerOfChannelTemporaryFile(std::string_view name)
{
    return randomDigitsBetween(nameBegin, temporaryFileEnd, name);
}

FileDescriptor makeChannelOwnerFile(int driverFolder, std::string_view owner)
{
    const std::string name = channelOwnerFileName(owner);
    ::unlinkat(driverFolder, name.c_str(), 0); // another process had made a file of that name
    return makeLockedFileAt(driverFolder, name);
}

bool isChannelOwnerGone(int driverFolder, std::string_view owner)
{
    return isMakerGoneAt(driverFolder, channelOwnerFileName(owner));
}

} // namespace platform
