// SPDX-License-Identifier: Apache-2.0
// The common part of most floods: connections through which the same calls go again and again, as many as the sockets
// take. Memory stays bounded: answers are thrown away, or not even read.
#pragma once

#include "platform/linux/files/FileDescriptor.h"
#include "support/RawClient.h"

#include <functional>
#include <vector>

namespace bench {

struct FloodPipeline {
    enum class Answers : std::uint8_t { Discarded, NotRead };

    int connections;
    std::function<platform::FileDescriptor()> connect; // makes each, also in the place of one that the server ended
    std::vector<Request> calls; // with running numbers, for each connection from the mark on
    Answers answers = Answers::Discarded;

    // Does not return. `waitForStart` is called when all connections exist.
    [[noreturn]] void run(const std::function<void()>& waitForStart) const;
};

} // namespace bench
