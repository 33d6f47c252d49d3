// SPDX-License-Identifier: Apache-2.0
// Threads as the kernel shows them, for tests of waiting: such a test goes on when a thread sleeps, and not after a
// fixed time.
#pragma once

#include <atomic>
#include <cstdint>
#include <fstream>
#include <functional>
#include <string>
#include <string_view>
#include <thread>
#include <unistd.h>
#include <utility>

namespace support {

// Whether that thread of this process sleeps, according to the kernel: "1234 (name) S ...".
inline bool isAsleep(pid_t thread)
{
    std::ifstream file("/proc/self/task/" + std::to_string(thread) + "/stat");
    std::string text;
    std::getline(file, text, ')');
    file >> text;
    return text.starts_with('S');
}

// How often that thread of this process has fallen asleep, according to the kernel.
inline std::uint64_t timesAsleep(pid_t thread)
{
    constexpr std::string_view field = "voluntary_ctxt_switches:";
    std::ifstream file("/proc/self/task/" + std::to_string(thread) + "/status");
    for (std::string line; std::getline(file, line);)
        if (line.starts_with(field))
            return std::stoull(line.substr(field.size()));
    return 0; // it has ended
}

// Does its work on a thread of its own. Its destructor waits until the work is done.
class WatchedThread {
public:
    explicit WatchedThread(std::function<void()> work)
        : thread_([this, work = std::move(work)] {
              number_ = ::gettid();
              work();
              isDone_ = true;
          })
    {
    }

    [[nodiscard]] bool isDone() const { return isDone_; }
    // Waits until the thread sleeps or its work is done. True if it sleeps.
    [[nodiscard]] bool fallsAsleep() const
    {
        while (!isDone_) {
            if (number_ != 0 && isAsleep(number_))
                return true;
            std::this_thread::yield();
        }
        return false;
    }

private:
    std::atomic<pid_t> number_{0};
    std::atomic<bool> isDone_{false};
    std::jthread thread_; // destroyed first: it uses the other members
};

} // namespace support
