// SPDX-License-Identifier: Apache-2.0
// The threads of the process: their number, without those of a sanitizer, and the nice value of one of them.
#pragma once

#include "support/Sanitizers.h"

#include <chrono>
#include <cstddef>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <optional>
#include <string>
#include <string_view>
#include <sys/resource.h>
#include <thread>
#include <unistd.h>

namespace support {

// Starts a thread and waits for its complete end. The thread sanitizer starts its own thread with the first one.
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

// The nice value of the thread of that name, relative to the calling thread's; nothing if no such thread appears.
inline std::optional<int> nicenessBeyondOwn(std::string_view name)
{
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(20);
    while (std::chrono::steady_clock::now() < deadline)
        for (const auto& thread : std::filesystem::directory_iterator("/proc/self/task")) {
            std::string found;
            std::ifstream comm(thread.path() / "comm");
            if (std::getline(comm, found) && found == name)
                return ::getpriority(PRIO_PROCESS, static_cast<id_t>(std::stoi(thread.path().filename())))
                    - ::getpriority(PRIO_PROCESS, 0);
        }
    return std::nullopt;
}

} // namespace support
