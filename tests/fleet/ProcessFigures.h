// SPDX-License-Identifier: Apache-2.0
// What a process has taken so far, as the kernel counts it.
#pragma once

#include <chrono>
#include <cstdint>
#include <sys/types.h>

namespace fleet {

struct Memory {
    std::int64_t peak = 0; // in kB, all of it (VmHWM)
    std::int64_t own = 0; // in kB, at present, without files that others share (RssAnon)
};

[[nodiscard]] Memory memoryOf(pid_t process);
// Of all its threads, also those that have ended.
[[nodiscard]] std::chrono::nanoseconds processorTimeOf(pid_t process);

} // namespace fleet
