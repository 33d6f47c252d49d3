// The analytics-event service: keeps named events whose names somebody wants.
#pragma once

#include "foundation/values/Value.h"

#include <functional>
#include <string>
#include <string_view>

namespace platform {

// Any thread.
class Analytics {
public:
    using PayloadBuilder = std::move_only_function<foundation::Dictionary()>;

    virtual ~Analytics() = default;
    // Whether some consumer on the device wants events of that name now.
    [[nodiscard]] virtual bool isAnalyticsEventUsed(std::string_view eventName) = 0;
    // Sends an event; of the events of one thread the order is kept. The builder is called only if and when the payload
    // is needed, once, on any thread. An event that nobody wants now is dropped with its builder; one whose payload
    // holds a number that is not finite is lost.
    virtual void sendAnalyticsEventLazy(std::string_view eventName, PayloadBuilder payloadBuilder) = 0;
};

} // namespace platform
