// What the kernel tells, at the moment of a bug, about the process in which it was seen and about the sound system.
//
// Processes name themselves, end while they are looked at, and leave their number to others; so each is opened once,
// and everything is read through that: it is one process's, or it is not there. Nothing is followed, and everything
// has a limit.
#pragma once

#include "foundation/values/Value.h"

#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <string_view>

namespace platform {

// How much is kept.
struct BugEvidenceLimits {
    std::size_t mostProcesses = 4; // of the same name
    std::size_t longestProcessFile = std::size_t{16} * 1024; // in bytes
    std::size_t mostSoundFiles = 512;
    std::size_t longestSoundFile = std::size_t{16} * 1024;
    std::size_t mostSoundBytes = std::size_t{256} * 1024; // of all of them
};

// The processes of that name, as {"name", "found": how many there are, "processes": [{"pid", "status": [line...],
// "stat", "cmdline", "wchan", "limits"}...]}: first the one of that number, if it is given and has the name, then those
// of the lowest numbers. `proc` is where the kernel shows processes. Any thread.
[[nodiscard]] foundation::Dictionary processEvidence(const std::filesystem::path& proc, std::string_view processName,
                                                     std::int64_t first = 0, const BugEvidenceLimits& limits = {});

// Every file below asound/ of `proc`, as {"card0/pcm0p/sub0/status": [line...]}; empty where there is no sound. Any
// thread.
[[nodiscard]] foundation::Dictionary soundEvidence(const std::filesystem::path& proc,
                                                   const BugEvidenceLimits& limits = {});

} // namespace platform
