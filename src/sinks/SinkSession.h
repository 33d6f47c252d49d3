// SPDX-License-Identifier: Apache-2.0
// A sink's view of a session: only what it needs to name an event and the application.
#pragma once

#include "foundation/values/Value.h"
#include "platform/Turn.h"
#include "utility/MessageKinds.h"

namespace sinks {

// Any thread: a payload may be built after the session's own work went on.
class SinkSession {
public:
    virtual ~SinkSession() = default;
    [[nodiscard]] virtual AudioServiceType serviceType() const = 0;
    [[nodiscard]] virtual foundation::Dictionary configuration() const = 0;
    // The session's number and its owner's, for the origin of its events; the turn announces what the session is where
    // the store does not know it yet. None: it is not among the sessions that the store knows. Server queue.
    [[nodiscard]] virtual platform::Origin announcedOrigin(platform::Turn& turn) = 0;
};

} // namespace sinks
