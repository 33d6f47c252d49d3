// The frames that a turn of the server queue sends, held back until the turn is over and what it stored
// is kept: a client that reads an answer may rely on it.
//
// Gathering them also makes sending cheap: all that a turn has for one connection leaves in one system call.
#pragma once

#include "platform/WorkQueue.h"

#include <memory>
#include <string_view>

namespace platform {

class LinuxConnection;

// One a thread that runs turns, made on first use.
class Outbox {
public:
    // Adds a frame to those of the turn that the calling thread runs.
    static void gather(LinuxConnection& connection, std::string_view frame);

    // Ends the turn that the calling thread ran. What is returned sends all that was gathered, from whichever
    // thread calls it; those of several turns must be called one after the other, in the order of the
    // turns. It is empty when nothing was gathered.
    [[nodiscard]] static WorkItem endTurn();
};

} // namespace platform
