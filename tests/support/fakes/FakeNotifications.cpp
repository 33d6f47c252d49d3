// SPDX-License-Identifier: Apache-2.0
// Handlers run on the queue of their registration, as with the real provider, and as rarely as the contract allows.
#include "support/fakes/FakeNotifications.h"

#include <utility>

namespace support {

void FakeNotifications::post(std::string_view name)
{
    for (std::size_t place = 0; place < registered_.size(); ++place) {
        const auto& [registeredName, queue, handler, isToRun] = registered_[place];
        if (registeredName == name && !std::exchange(*isToRun, true))
            queue->submit([handler, isToRun, token = static_cast<std::int32_t>(place + 1)] {
                *isToRun = false;
                handler(token);
            });
    }
}

std::vector<std::string> FakeNotifications::registered() const
{
    std::vector<std::string> names;
    for (const auto& registration : registered_)
        names.push_back(registration.name);
    return names;
}

platform::Notifications::Registration
FakeNotifications::registerNotification(std::string_view name, std::shared_ptr<platform::WorkQueue> queue,
                                        Handler handler)
{
    if (const auto failure = failures_.find(name); failure != failures_.end())
        return {.status = failure->second, .token = 0};
    registered_.push_back({.name = std::string(name), .queue = std::move(queue), .handler = std::move(handler)});
    return {.status = 0, .token = static_cast<std::int32_t>(registered_.size())};
}

std::expected<std::uint64_t, platform::NotificationStatus> FakeNotifications::state(std::int32_t token) const
{
    asked_.push_back(token);
    const auto place = static_cast<std::size_t>(token) - 1;
    if (place >= registered_.size())
        return std::unexpected(unreadable);
    const auto found = states_.find(registered_[place].name);
    if (found == states_.end())
        return std::unexpected(unreadable);
    return found->second;
}

} // namespace support
