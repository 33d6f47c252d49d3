// SPDX-License-Identifier: Apache-2.0
// What one turn of the server queue gathers: events for the store, the letters that leave when the events are kept, and
// the counts that the ledger gets then.
//
// A queue makes its turn (see TurnQueue), and passes it by reference to everything that adds to it: a function that
// takes a turn can send events and answers, and one that takes none cannot. At the end of the turn, the platform takes
// everything that it gathered, and the next turn begins empty.
#pragma once

#include "ledger/Tally.h"
#include "platform/EventBatch.h"
#include "platform/Letters.h"

namespace platform {

// Used by the thread that runs the turn, and only until the turn is over.
struct Turn {
    EventBatch events; // see Analytics
    Letters letters; // see Connection
    ledger::Tally tally; // see Ledger
};

// Stands in for a turn: what is sent outside any turn does not wait for an end.
struct OutsideTurn { };
inline constexpr OutsideTurn outsideTurn;

} // namespace platform
