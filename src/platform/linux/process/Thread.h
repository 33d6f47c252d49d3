// SPDX-License-Identifier: Apache-2.0
// Threads with a name, for debuggers, and a priority, for the scheduler.
#pragma once

#include "platform/WorkQueue.h"

#include <string>
#include <string_view>
#include <thread>

namespace platform {

// The last part of a dotted name, cut to the kernel's 15 bytes: "com.example.server" gives "server".
[[nodiscard]] std::string threadName(std::string_view name);

// Gives the calling thread the priority of the quality of service. If the system refuses a higher priority, this is not
// a failure.
void setQualityOfThisThread(QualityOfService quality);

// Starts a thread of that name and quality.
[[nodiscard]] std::thread startThread(std::string_view name, QualityOfService quality, WorkItem body);

} // namespace platform
