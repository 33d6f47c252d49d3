// Threads that a debugger and a scheduler can tell apart: each has a name and a priority.
#pragma once

#include "platform/WorkQueue.h"

#include <string>
#include <string_view>
#include <thread>

namespace platform {

// The part of a dotted name that the kernel has room for (15 bytes): "com.example.server" is "server".
[[nodiscard]] std::string threadName(std::string_view name);

// Gives the calling thread the priority that goes with the quality of service, as far as the process may choose it: a
// raised one that is refused is no failure.
void setQualityOfThisThread(QualityOfService quality);

// Starts a thread of that name and quality.
[[nodiscard]] std::thread startThread(std::string_view name, QualityOfService quality, WorkItem body);

} // namespace platform
