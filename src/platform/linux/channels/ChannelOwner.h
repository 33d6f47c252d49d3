// SPDX-License-Identifier: Apache-2.0
// The owner of a channel's file: which publisher writes it, and whether that process still lives.
//
//     <root>/<driver>/.kesto-0123456789abcdef.owner                        locked as long as the publisher lives
//     <root>/<driver>/<group>/<subgroup>/<channel>                         begins with "owner 0123456789abcdef"
//     <root>/<driver>/<group>/<subgroup>/.kesto-0123456789abcdef.tmp       an unfinished file
//
// A publisher writes a random number, its owner, to the first line of every file, and holds a lock on the owner file of
// that name (LockedFile.h). If a file's owner file is missing or not locked, the publisher has ended.
//
// A file without an owner comes from a simpler writer. It counts as long as it exists.
#pragma once

#include "platform/linux/files/FileDescriptor.h"

#include <string>
#include <string_view>

namespace platform {

// All on any thread. An owner is its number, 16 hexadecimal digits (`randomDigits`); empty means none.

// The first line of a file, and the names of hidden files.
[[nodiscard]] std::string channelOwnerLine(std::string_view owner);
[[nodiscard]] std::string channelOwnerFileName(std::string_view owner);
[[nodiscard]] std::string channelTemporaryFileName(std::string_view owner);

// Removes the owner's line from the text of a file and returns the owner; other first lines stay.
[[nodiscard]] std::string_view takeChannelOwner(std::string_view& text);
// The owner in the name of an owner file or an unfinished file.
[[nodiscard]] std::string_view ownerOfChannelOwnerFile(std::string_view name);
[[nodiscard]] std::string_view ownerOfChannelTemporaryFile(std::string_view name);

// Makes the owner file, readable for all users, and locks it. On failure it returns no descriptor and sets `errno`.
[[nodiscard]] FileDescriptor makeChannelOwnerFile(int driverFolder, std::string_view owner);
// False also if this cannot be checked.
[[nodiscard]] bool isChannelOwnerGone(int driverFolder, std::string_view owner);

} // namespace platform
