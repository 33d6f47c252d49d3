// SPDX-License-Identifier: Apache-2.0
// Clients in a process of their own: the connections of one process share what they may write to the log.
#pragma once

#include <sys/wait.h>
#include <unistd.h>

namespace end_to_end {

// Does the work there. Whether nothing was thrown.
template <typename Work> [[nodiscard]] bool doInAnotherProcess(Work work)
{
    const pid_t child = ::fork();
    if (child == 0) {
        try {
            work();
        } catch (...) {
            ::_exit(1);
        }
        ::_exit(0);
    }
    int status = 0;
    return child > 0 && ::waitpid(child, &status, 0) == child && status == 0;
}

} // namespace end_to_end
