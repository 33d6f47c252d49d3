// The analytics-event service: keeps events whose names the device's configuration selects.
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
    // Whether the device keeps events of that name now.
    [[nodiscard]] virtual bool isAnalyticsEventUsed(std::string_view eventName) = 0;
    // Sends an event: with the turn, which is kept as a whole when it is over, or outside of any, at once. Of the
    // events of one turn the order is kept, and of those that one thread sends outside of turns. The builder is called
    // only if and when the payload is needed, once, on any thread. An event that nobody wants now is dropped with its
    // builder; one whose payload holds a number that is not finite is lost.
    virtual void sendAnalyticsEventLazy(Turn& turn, std::string_view eventName, PayloadBuilder payloadBuilder) = 0;
    virtual void sendAnalyticsEventLazy(OutsideTurn, std::string_view eventName, PayloadBuilder payloadBuilder) = 0;
};

} // namespace platform
