// SPDX-License-Identifier: Apache-2.0
// System notifications as files: a file in the notifications directory is a name, and its text the 64-bit state in
// decimal. Writing or touching the file posts the name. So a shell, or any process with rights on the directory, can
// post, and a name's state lasts.
#pragma once

#include "foundation/Mutex.h"
#include "platform/Notifications.h"
#include "platform/linux/settings/ConfigurationWatcher.h"

#include <filesystem>
#include <memory>
#include <string>
#include <vector>

namespace platform {

// Any thread.
class LinuxNotifications final : public Notifications {
public:
    // Statuses other than 0.
    static constexpr NotificationStatus invalidName = 1; // not a valid file name
    static constexpr NotificationStatus unknownToken = 2;
    static constexpr NotificationStatus noState = 3; // the file is missing, or does not hold a number

    // Makes the directory if it is missing; only its owner may write there. Without a directory no name has a state,
    // and only `post` posts.
    LinuxNotifications(std::filesystem::path directory, ConfigurationWatcher& watcher, ProviderLog log);

    Registration registerNotification(std::string_view name, std::shared_ptr<WorkQueue> queue,
                                      Handler handler) override;
    [[nodiscard]] std::expected<std::uint64_t, NotificationStatus> state(std::int32_t token) const override;

    // Calls the handlers of the name, each on its queue.
    void post(std::string_view name);

private:
    struct Registered {
        std::string name;
        std::shared_ptr<WorkQueue> queue;
        Handler handler;
    };

    void handleWrite(std::string_view fileName);

    const std::filesystem::path directory_;
    mutable foundation::Mutex lock_;
    std::vector<Registered> registered_ KESTO_GUARDED_BY(lock_); // the token is the index, from 1
    std::unique_ptr<ConfigurationWatcher::Watch> watch_; // destroyed first
};

} // namespace platform
