// How many threads the process has, told without surprise by those that a sanitizer keeps for itself.
#pragma once

#include "support/Sanitizers.h"

#include <cstddef>
#include <filesystem>
#include <iterator>
#include <string>
#include <thread>
#include <unistd.h>

namespace support {

// Starts a thread and waits until nothing is left of it. The thread sanitizer starts its own beside the first one.
inline void bringForthTheSanitizersThread()
{
    std::filesystem::path folder;
    std::thread([&] { folder = "/proc/self/task/" + std::to_string(::gettid()); }).join();
    while (std::filesystem::exists(folder))
        std::this_thread::yield();
}

inline std::size_t threadsOfTheProcess()
{
    if constexpr (threadSanitizerWatches)
        bringForthTheSanitizersThread();
    return static_cast<std::size_t>(
        std::distance(std::filesystem::directory_iterator("/proc/self/task"), std::filesystem::directory_iterator()));
}

} // namespace support
