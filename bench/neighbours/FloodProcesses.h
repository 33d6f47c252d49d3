// SPDX-License-Identifier: Apache-2.0
// The processes beside the well-behaved client: they prepare, all start at once, and go on until the object goes.
#pragma once

#include "platform/linux/files/FileDescriptor.h"
#include "support/ChildProcess.h"

#include <cstdint>
#include <functional>
#include <vector>

namespace bench {

constexpr std::uint32_t otherUser = 65'534; // the user without rights of most systems

class FloodProcesses {
public:
    enum class User : std::uint8_t { Same, Other }; // the other one only if this process runs as root
    // What each process does; it calls its argument once, which returns at the start.
    using Body = std::function<void(const std::function<void()>& waitForStart)>;

    // Returns when all are prepared; throws if one cannot prepare.
    FloodProcesses(int count, User user, const Body& body);
    void start();
    // Throws if one has ended by itself: then there was no flood, and a measurement says nothing.
    void expectRunning() const;

private:
    void addProcess(User user, const Body& body);

    std::vector<platform::FileDescriptor> controls_;
    std::vector<ChildProcess> processes_;
};

} // namespace bench
