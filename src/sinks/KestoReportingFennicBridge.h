// SPDX-License-Identifier: Apache-2.0
// The bridge to the analytics service: turns a message into events that carry its category and type in
// their names, one for all services and one for the session's own.
//
// It does not filter: the analytics service keeps or drops an event by its name.
#pragma once

#include "platform/Turn.h"
#include "sinks/SinkSession.h"

#include <cstdint>
#include <memory>

// Keeps no state. On the server queue.
class KestoReportingFennicBridge {
public:
    // Sends with the turn "com.quarn.kesto.<category>.<type>" and "com.quarn.<service>.<category>.<type>", in this
    // order. The payload is the message as it came, with the session's host application added where it names none. The
    // source is that of the message; 0: the session itself made it, so it counts as its owner's.
    static void handleEvent(platform::Turn& turn, const foundation::Dictionary& message, AudioEventCategory category,
                            AudioEventType type, const std::shared_ptr<sinks::SinkSession>& session,
                            std::uint64_t source = 0);
};
