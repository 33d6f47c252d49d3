// SPDX-License-Identifier: Apache-2.0
// The analytics-event service: keeps the events that the device's configuration selects by name.
#pragma once

#include "foundation/values/Value.h"
#include "platform/Turn.h"

#include <functional>
#include <string>
#include <string_view>

namespace platform {

// Any thread.
class Analytics {
public:
    using PayloadBuilder = std::move_only_function<foundation::Dictionary()>;

    virtual ~Analytics() = default;
    // Whether the device keeps any events now.
    [[nodiscard]] virtual bool isEnabled() const = 0;
    // Whether the device keeps events of that name now.
    [[nodiscard]] virtual bool isAnalyticsEventUsed(std::string_view eventName) = 0;
    // Sends an event. The events of a turn are stored together when it ends; an event outside any turn is stored as
    // soon as possible. The events of one turn keep their order, and so do the events that one thread sends outside
    // turns. The service calls the builder at most once, on any thread, when it needs the payload. It drops an unwanted
    // event with its builder, and loses an event with a number that is not finite in its payload.
    //
    // The origin is one that a turn's batch announced (see EventBatch), or none. Outside a turn, the source comes with
    // the event, because the turn that announces it may still run; one without a number is none.
    virtual void sendAnalyticsEventLazy(Turn& turn, const Origin& origin, std::string_view eventName,
                                        PayloadBuilder payloadBuilder) = 0;
    virtual void sendAnalyticsEventLazy(OutsideTurn, const SourceBegin& source, std::string_view eventName,
                                        PayloadBuilder payloadBuilder) = 0;
    // Logs the losses of events that the log does not show yet. Never waits for the disk.
    virtual void reportLosses() = 0;
};

} // namespace platform
