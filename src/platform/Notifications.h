// SPDX-License-Identifier: Apache-2.0
// System notifications: names that processes post, each with a 64-bit state.
#pragma once

#include "platform/WorkQueue.h"

#include <cstdint>
#include <expected>
#include <functional>
#include <memory>
#include <string_view>

namespace platform {

// 0 is success, as everywhere a status is shown.
using NotificationStatus = std::uint32_t;

// Any thread.
class Notifications {
public:
    struct Registration {
        NotificationStatus status = 0;
        std::int32_t token = 0; // 0 when the registration failed
    };
    using Handler = std::function<void(std::int32_t token)>;

    virtual ~Notifications() = default;
    // Calls the handler on the queue after each post of the name, until the process ends. For several posts before the
    // handler has run, it may run once. A post counts even if the state stays the same.
    virtual Registration registerNotification(std::string_view name, std::shared_ptr<WorkQueue> queue,
                                              Handler handler) = 0;
    // The present state of the registration's name; a status other than 0 if the name has no state, and for an unknown
    // token.
    [[nodiscard]] virtual std::expected<std::uint64_t, NotificationStatus> state(std::int32_t token) const = 0;
};

} // namespace platform
