// SPDX-License-Identifier: Apache-2.0
// A table that was enlarged stays so: it is enough to open its last descriptor once.
#include "platform/linux/process/DescriptorTable.h"

#include "platform/linux/files/FileDescriptor.h"

#include <algorithm>
#include <fcntl.h>
#include <sys/eventfd.h>
#include <sys/resource.h>

namespace platform {

void reserveDescriptors(std::size_t count)
{
    rlimit limit = {};
    ::getrlimit(RLIMIT_NOFILE, &limit);
    const auto last = static_cast<int>(std::min<rlim_t>(count, limit.rlim_cur)) - 1;
    const FileDescriptor any(::eventfd(0, EFD_CLOEXEC));
    const FileDescriptor atTheEnd(::fcntl(any.get(), F_DUPFD_CLOEXEC, last));
}

} // namespace platform
