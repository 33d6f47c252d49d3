// What one turn of the server queue gathers: the events to be kept, and the letters that leave once they are.
//
// A turn is made by its queue (see TurnQueue) and reaches everything that adds to it by reference: a function that
// takes a turn can send events and answers, and one that takes none cannot. When the turn is over, the platform takes
// what it gathered, as a whole, and the next turn begins empty.
#pragma once

#include "platform/EventBatch.h"
#include "platform/Letters.h"

namespace platform {

// Used by the thread that runs the turn, and only until the turn is over.
struct Turn {
    EventBatch events; // see Analytics
    Letters letters; // see Connection
};

// In the place of a turn: there is none, so what is sent does not wait for the end of one.
struct OutsideTurn { };
inline constexpr OutsideTurn outsideTurn;

} // namespace platform
