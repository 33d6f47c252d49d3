// SPDX-License-Identifier: Apache-2.0
// System notifications that a test posts, with states that it sets.
#pragma once

#include "platform/Notifications.h"

#include <map>
#include <string>
#include <vector>

namespace support {

// One thread.
class FakeNotifications final : public platform::Notifications {
public:
    static constexpr platform::NotificationStatus unreadable = 7;

    // Gives the name a state that can be read.
    void setState(std::string name, std::uint64_t state) { states_.insert_or_assign(std::move(name), state); }
    void removeState(const std::string& name) { states_.erase(name); }
    // Submits the handlers of the name to their queues, except those that still wait because of an earlier post.
    void post(std::string_view name);
    // Makes registrations of the name fail with that status.
    void failRegistration(std::string name, platform::NotificationStatus status)
    {
        failures_.insert_or_assign(std::move(name), status);
    }

    // The registered names; a registration's token is its index here, from 1.
    [[nodiscard]] std::vector<std::string> registered() const;
    // The tokens whose state the service read, in order.
    [[nodiscard]] const std::vector<std::int32_t>& asked() const { return asked_; }

    Registration registerNotification(std::string_view name, std::shared_ptr<platform::WorkQueue> queue,
                                      Handler handler) override;
    [[nodiscard]] std::expected<std::uint64_t, platform::NotificationStatus> state(std::int32_t token) const override;

private:
    struct Registered {
        std::string name;
        std::shared_ptr<platform::WorkQueue> queue;
        Handler handler;
        std::shared_ptr<bool> isToRun = std::make_shared<bool>(false);
    };
    std::vector<Registered> registered_;
    mutable std::vector<std::int32_t> asked_;
    std::map<std::string, std::uint64_t, std::less<>> states_;
    std::map<std::string, platform::NotificationStatus, std::less<>> failures_;
};

} // namespace support
