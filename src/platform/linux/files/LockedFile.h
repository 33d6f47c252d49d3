// SPDX-License-Identifier: Apache-2.0
// A file with which a process shows that it lives: the process holds a lock on it, and the kernel releases the lock
// when the process ends, for any reason. So process IDs, which are used again and differ between namespaces, are not
// needed.
//
// It is a write lock on the open file (F_OFD_SETLK): only users who may write the file can hold it, so no other user
// can pretend that its maker lives; and testing the lock does not disturb it. A forked child holds it together with its
// parent, until the child ends or executes another program.
#pragma once

#include "platform/linux/files/FileDescriptor.h"

#include <string>

namespace platform {

// All on any thread. A name is one step, without "/".

// Makes a new file, writable for its user and readable for all, and locks it as long as the descriptor is open. On
// failure it returns no descriptor, leaves no file and sets `errno`.
[[nodiscard]] FileDescriptor makeLockedFileAt(int directory, const std::string& name);
// Whether the file's maker has ended or the file is missing. False also if this cannot be checked, and while the file
// is being made.
[[nodiscard]] bool isMakerGoneAt(int directory, const std::string& name);

} // namespace platform
