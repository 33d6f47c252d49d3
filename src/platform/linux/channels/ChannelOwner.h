// Who writes the file of a channel, and whether that process is still there.
//
//     <root>/<driver>/.kesto-0123456789abcdef.owner                        locked as long as the publisher lives
//     <root>/<driver>/<group>/<subgroup>/<channel>                         begins with "owner 0123456789abcdef"
//     <root>/<driver>/<group>/<subgroup>/.kesto-0123456789abcdef.tmp       a file in the making
//
// A publisher calls itself by a random number, in the first line of every file that it writes, and holds a lock on the
// owner file of that name. The kernel takes the lock away with the process, however it ends. So nobody has to know a
// process by its ID, which is used again and is another one in each namespace. What names an owner whose file is not
// there, or is not locked, was left by a process that is gone.
//
// The lock is one for writing, on the open file (F_OFD_SETLK): only those who may write the file can hold it, so that
// nobody else can pretend that an owner lives; and whoever asks for it does not disturb it. A child that was forked off
// holds it with its parent, until it ends or executes another program.
//
// A file that names no owner is that of a writer who knows nothing of this. It counts as long as it is there.
#pragma once

#include "platform/linux/files/FileDescriptor.h"

#include <string>
#include <string_view>

namespace platform {

// All on any thread. An owner is its number, 16 hexadecimal digits; empty means none.

[[nodiscard]] std::string randomChannelOwner();

// The line that files begin with, and the names of hidden files.
[[nodiscard]] std::string channelOwnerLine(std::string_view owner);
[[nodiscard]] std::string channelOwnerFileName(std::string_view owner);
[[nodiscard]] std::string channelTemporaryFileName(std::string_view owner);

// Takes the line of the owner off the text of a file; what is no such line stays.
[[nodiscard]] std::string_view takeChannelOwner(std::string_view& text);
// Whom an owner file, or a file in the making, belongs to by its name.
[[nodiscard]] std::string_view ownerOfChannelOwnerFile(std::string_view name);
[[nodiscard]] std::string_view ownerOfChannelTemporaryFile(std::string_view name);

// Makes the owner file and locks it, readable for everybody. Nothing where that cannot be, with `errno`.
[[nodiscard]] FileDescriptor makeChannelOwnerFile(int driverFolder, std::string_view owner);
// False also where it cannot be told.
[[nodiscard]] bool isChannelOwnerGone(int driverFolder, std::string_view owner);

} // namespace platform
