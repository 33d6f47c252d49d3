// SPDX-License-Identifier: Apache-2.0
// libkesto for C++, publishing: counters, histograms and states of a driver, for the Kesto reporting service (kestod).
//
//     kesto::Publisher publisher;
//     kesto::SimpleChannel late;
//     if (publisher.open() != kesto::Status::Ok
//         || late.create(publisher, {"mixer", "Tx", "", "late cycles"}) != kesto::Status::Ok)
//         return;
//     late.add(1);
//
// A thin layer over channels.h, all of it inline; the rules there about threads, real time, forks and names hold here,
// too. C++17 or later; no exceptions and no run-time types are needed.
#ifndef KESTO_CHANNELS_HPP
#define KESTO_CHANNELS_HPP

#include "channels.h"
#include "kesto.hpp"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <string>
#include <utility>
#include <vector>

namespace kesto {

// Options of a publisher; channels.h describes each.
struct PublisherOptions {
    std::string root; // empty: the service's default
    std::chrono::milliseconds writeInterval{0}; // 0: 500 ms
    std::chrono::milliseconds refreshInterval{0}; // 0: 1 s; max(): never
};

using PublisherStatistics = kesto_publisher_statistics;

// Owns the thread that writes the files of its channels. No other thread may use it while it is opened, moved or
// destroyed. Declare channels after their publisher, so that they are destroyed first.
class Publisher {
public:
    Publisher() noexcept = default;
    Publisher(Publisher&& other) noexcept : publisher_(std::exchange(other.publisher_, nullptr)) { }
    Publisher& operator=(Publisher&& other) noexcept
    {
        std::swap(publisher_, other.publisher_);
        return *this;
    }
    ~Publisher() { kesto_publisher_free(publisher_); }

    // Frees the publisher that was open before; its channels must be destroyed already. InvalidArgument, OutOfMemory or
    // SystemError on failure.
    [[nodiscard]] Status open(const PublisherOptions& options = PublisherOptions()) noexcept
    {
        kesto_publisher_options given{};
        given.size = sizeof given;
        given.root = options.root.empty() ? nullptr : options.root.c_str();
        given.write_interval_ms = milliseconds(options.writeInterval);
        given.refresh_interval_ms = milliseconds(options.refreshInterval);
        kesto_publisher_free(std::exchange(publisher_, nullptr));
        return Status(kesto_publisher_open(&given, &publisher_));
    }
    [[nodiscard]] bool isOpen() const noexcept { return publisher_ != nullptr; }

    // Writes changed channels, and the times of states, before it returns.
    Status flush() noexcept { return Status(kesto_publisher_flush(publisher_)); }

    // The path of the channel tree; empty while the publisher is not open.
    [[nodiscard]] std::string root() const
    {
        const char* const root = kesto_publisher_root(publisher_);
        return root == nullptr ? "" : root;
    }

    [[nodiscard]] PublisherStatistics statistics() const noexcept
    {
        PublisherStatistics statistics{};
        kesto_publisher_get_statistics(publisher_, &statistics, sizeof statistics);
        return statistics;
    }

    [[nodiscard]] kesto_publisher* get() const noexcept { return publisher_; }

private:
    static std::uint32_t milliseconds(std::chrono::milliseconds duration) noexcept
    {
        const auto count = duration.count();
        return count < 0 ? 0 : count < UINT32_MAX ? static_cast<std::uint32_t>(count) : UINT32_MAX;
    }

    kesto_publisher* publisher_ = nullptr;
};

// The name of a channel. An empty group or subgroup means none.
struct ChannelName {
    std::string driver;
    std::string group;
    std::string subgroup;
    std::string channel;
};

// The common part of all channels; its destructor removes the file. A channel that was not created returns
// InvalidArgument.
class Channel {
public:
    Channel(const Channel&) = delete;
    Channel& operator=(const Channel&) = delete;

    [[nodiscard]] bool isCreated() const noexcept { return channel_ != nullptr; }
    // Removes the file, before the destructor would.
    void destroy() noexcept { kesto_channel_destroy(std::exchange(channel_, nullptr)); }
    [[nodiscard]] kesto_channel* get() const noexcept { return channel_; }

protected:
    Channel() noexcept = default;
    Channel(Channel&& other) noexcept : channel_(std::exchange(other.channel_, nullptr)) { }
    Channel& operator=(Channel&& other) noexcept
    {
        std::swap(channel_, other.channel_);
        return *this;
    }
    ~Channel() { destroy(); }

    // Calls the function of channels.h with the channel's name and, behind it, the arguments.
    template <typename Function, typename... Arguments>
    Status make(Function function, const Publisher& publisher, const ChannelName& name, Arguments... arguments) noexcept
    {
        const auto orNull = [](const std::string& text) { return text.empty() ? nullptr : text.c_str(); };
        const kesto_channel_name given{name.driver.c_str(), orNull(name.group), orNull(name.subgroup),
                                       name.channel.c_str()};
        destroy();
        return Status(function(publisher.get(), &given, arguments..., &channel_));
    }

private:
    kesto_channel* channel_ = nullptr;
};

// A number.
class SimpleChannel : public Channel {
public:
    [[nodiscard]] Status create(const Publisher& publisher, const ChannelName& name) noexcept
    {
        return make(kesto_channel_create_simple, publisher, name);
    }
    Status add(std::int64_t amount) noexcept { return Status(kesto_channel_add(get(), amount)); }
    Status set(std::int64_t value) noexcept { return Status(kesto_channel_set(get(), value)); }
};

// How often values fell between the bounds.
class HistogramChannel : public Channel {
public:
    [[nodiscard]] Status create(const Publisher& publisher, const ChannelName& name, const std::string& unit,
                                const std::vector<std::int64_t>& bounds) noexcept
    {
        return make(kesto_channel_create_histogram, publisher, name, unit.empty() ? nullptr : unit.c_str(),
                    bounds.data(), bounds.size());
    }
    Status record(std::int64_t value) noexcept { return Status(kesto_channel_record(get(), value)); }
};

// The state of something, and the time in each state.
class StateChannel : public Channel {
public:
    [[nodiscard]] Status create(const Publisher& publisher, const ChannelName& name,
                                const std::vector<const char*>& states, std::size_t first = 0) noexcept
    {
        return make(kesto_channel_create_state, publisher, name, states.data(), states.size(), first);
    }
    Status enter(std::size_t state) noexcept { return Status(kesto_channel_enter(get(), state)); }
};

} // namespace kesto

#endif
