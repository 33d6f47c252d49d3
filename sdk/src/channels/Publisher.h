// SPDX-License-Identifier: Apache-2.0
// The room of channels: the values that a program publishes, and their files. It writes below the root of channels,
// with one thread for each publisher, and uses no connection.
//
// The owner of channels: writes their files, on a thread of its own and on request, and removes them.
//
// The thread sleeps until the first change, writes the changed channels, and rests: so a file is written at most once
// in an interval, and a change after a quiet time is visible immediately. It rests longer if writing takes too much of
// its time, and if files cannot be written.
#pragma once

#include "Counters.h"
#include "Doorbell.h"
#include "channels/Channel.h"
#include "channels/ChannelFolder.h"
#include "foundation/Mutex.h"

#include <atomic>
#include <chrono>
#include <expected>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <sys/types.h>
#include <thread>
#include <unistd.h>
#include <vector>

namespace libkesto {

struct PublisherSettings {
    std::string root;
    std::chrono::milliseconds writeInterval;
    std::optional<std::chrono::milliseconds> refreshInterval; // nothing: never
};

} // namespace libkesto

// The opaque type of the interface. Any thread.
struct kesto_publisher final {
public:
    using Settings = libkesto::PublisherSettings;
    using Time = kesto_channel::Time;

    // Null, with `errno`, if the system refuses a descriptor or a thread. May throw std::bad_alloc.
    [[nodiscard]] static std::unique_ptr<kesto_publisher> create(Settings settings);
    ~kesto_publisher();
    kesto_publisher(const kesto_publisher&) = delete;
    kesto_publisher& operator=(const kesto_publisher&) = delete;

    // Whether this process made it. In a forked child the thread, the lock and the files belong to the parent.
    [[nodiscard]] bool isOfThisProcess() const noexcept { return process_ == ::getpid(); }
    // Channels ring it when they change.
    [[nodiscard]] libkesto::Doorbell& bell() noexcept { return bell_; }
    // Writes the channel's first file. Null, with the status, if that fails. May throw std::bad_alloc.
    [[nodiscard]] std::expected<kesto_channel*, kesto_status> add(std::unique_ptr<kesto_channel> channel,
                                                                  libkesto::ChannelPlace place, std::string name);
    // Destroys the channel and removes its file.
    void remove(const kesto_channel& channel) noexcept;
    // Writes every file that may be out of date. KESTO_SYSTEM_ERROR, with `errno`, if a file cannot be written.
    [[nodiscard]] kesto_status flush() noexcept;
    [[nodiscard]] kesto_publisher_statistics statistics() const noexcept;
    [[nodiscard]] const std::string& root() const noexcept { return settings_.root; }

private:
    struct Published {
        std::unique_ptr<kesto_channel> channel;
        std::shared_ptr<libkesto::ChannelFolder> folder;
        std::string name;
    };

    kesto_publisher(Settings settings, platform::FileDescriptor doorbell);
    [[nodiscard]] bool start() noexcept;
    void run() noexcept;
    void rest(Time end) noexcept;
    void sleepUntilNeeded() noexcept;
    [[nodiscard]] bool isRefreshDue(Time now) const noexcept KESTO_REQUIRES(lock_);
    // 0, or the `errno` of a file that could not be written.
    int write(bool isRefresh) noexcept KESTO_REQUIRES(lock_);
    int write(Published& published, Time now) noexcept KESTO_REQUIRES(lock_);
    [[nodiscard]] std::shared_ptr<libkesto::ChannelFolder> folder(libkesto::ChannelPlace place) KESTO_REQUIRES(lock_);

    const pid_t process_; // of the process that made it
    const Settings settings_;
    const std::string owner_; // its name for itself in its files
    libkesto::Doorbell bell_;
    libkesto::Counter filesWritten_;
    libkesto::Counter filesFailed_;
    std::atomic<bool> isEnding_ = false;

    mutable foundation::Mutex lock_;
    std::map<std::string, std::weak_ptr<libkesto::DriverClaim>> claims_ KESTO_GUARDED_BY(lock_); // by driver
    std::map<libkesto::ChannelPlace, std::weak_ptr<libkesto::ChannelFolder>> folders_ KESTO_GUARDED_BY(lock_);
    std::vector<Published> channels_ KESTO_GUARDED_BY(lock_);
    std::size_t timedChannels_ KESTO_GUARDED_BY(lock_) = 0;
    Time refreshed_ KESTO_GUARDED_BY(lock_);
    std::string text_ KESTO_GUARDED_BY(lock_); // of the file that is being written

    std::thread thread_;
};
