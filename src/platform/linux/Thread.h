// Threads that a debugger and a scheduler can tell apart: each has a name and a priority.
#pragma once

#include "platform/WorkQueue.h"

#include <string>
#include <string_view>
#include <thread>

namespace platform {

// The part of a dotted name that the kernel has room for (15 bytes): "com.example.server" is "server".
[[nodiscard]] std::string threadName(std::string_view name);

// Starts a thread. The quality of service becomes its priority as far as the process may choose it: a raised
// one that is refused is no failure.
[[nodiscard]] std::thread startThread(std::string_view name, QualityOfService quality, WorkItem body);

} // namespace platform
