// SPDX-License-Identifier: Apache-2.0
// The kernel's information, at the moment of a bug, about the process that showed it and about the sound system.
//
// Processes choose their names, may end meanwhile, and their IDs are used again. So each process's folder is opened
// once, and all its files are read through it: they belong to one process, or are missing. Links are not followed, and
// every size has a limit.
#pragma once

#include "foundation/values/Value.h"

#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <string_view>

namespace platform {

// The limits of the evidence.
struct BugEvidenceLimits {
    std::size_t mostProcesses = 4; // of the same name
    std::size_t longestProcessFile = std::size_t{16} * 1024; // in bytes
    std::size_t mostSoundFiles = 512;
    std::size_t longestSoundFile = std::size_t{16} * 1024;
    std::size_t mostSoundBytes = std::size_t{256} * 1024; // of all of them
};

// The processes of that name, as {"name", "found": their number, "processes": [{"pid", "status": [line...], "stat",
// "cmdline", "wchan", "limits"}...]}: first the process with that ID, if it is given and has the name, then those with
// the lowest IDs. `proc` is the kernel's folder of processes. Any thread.
[[nodiscard]] foundation::Dictionary processEvidence(const std::filesystem::path& proc, std::string_view processName,
                                                     std::int64_t first = 0, const BugEvidenceLimits& limits = {});

// Every file below asound/ of `proc`, as {"card0/pcm0p/sub0/status": [line...]}; empty without a sound system. Any
// thread.
[[nodiscard]] foundation::Dictionary soundEvidence(const std::filesystem::path& proc,
                                                   const BugEvidenceLimits& limits = {});

} // namespace platform
