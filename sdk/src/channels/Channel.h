// SPDX-License-Identifier: Apache-2.0
// The value of a channel, which any thread may change at any time, and the text of its file.
//
// Values are atomic and independent: threads never wait for each other. A reader may see a value that is a moment old,
// but a count never decreases, because that would make it a new channel.
//
// No change stays unwritten. A thread changes the value and then reads `isChanged_`; the publisher clears it and then
// reads the value. All of these are sequentially consistent, so either the publisher sees the change, or the thread
// sees the cleared flag and sets it again.
#pragma once

#include "Doorbell.h"
#include "kesto/channels.h"

#include <atomic>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

struct kesto_publisher;

namespace libkesto {

using ChannelClock = std::chrono::steady_clock;

} // namespace libkesto

// The opaque type of the interface. Any thread may change it; all other functions need the publisher's lock, unless
// they say otherwise.
struct kesto_channel {
public:
    using Time = libkesto::ChannelClock::time_point;

    explicit kesto_channel(libkesto::Doorbell& bell) noexcept : bell_(bell) { }
    virtual ~kesto_channel() = default;
    kesto_channel(const kesto_channel&) = delete;
    kesto_channel& operator=(const kesto_channel&) = delete;

    // Channels of other kinds refuse it. Any thread.
    virtual kesto_status add(std::int64_t) noexcept { return KESTO_INVALID_ARGUMENT; }
    virtual kesto_status set(std::int64_t) noexcept { return KESTO_INVALID_ARGUMENT; }
    virtual kesto_status record(std::int64_t) noexcept { return KESTO_INVALID_ARGUMENT; }
    virtual kesto_status enter(std::size_t, Time) noexcept { return KESTO_INVALID_ARGUMENT; }

    // Whether its value grows with time.
    [[nodiscard]] virtual bool isTimed() const noexcept { return false; }
    // The content of the file.
    virtual void appendText(std::string& text, Time now) = 0;

    // Whether it has changes that are not written yet.
    [[nodiscard]] bool isChanged() const noexcept { return isChanged_.load(); }
    void setChanged(bool isChanged) noexcept { isChanged_.store(isChanged); }

    // Its publisher, after it was added.
    [[nodiscard]] kesto_publisher& publisher() const noexcept { return *publisher_; }
    void setPublisher(kesto_publisher& publisher) noexcept { publisher_ = &publisher; }

protected:
    // Call it after each change of a value, which must be sequentially consistent. Any thread.
    void changed() noexcept
    {
        if (!isChanged_.load() && !isChanged_.exchange(true))
            bell_.ringIfAsleep();
    }

private:
    libkesto::Doorbell& bell_;
    kesto_publisher* publisher_ = nullptr;
    std::atomic<bool> isChanged_ = false;
};

namespace libkesto {

class SimpleChannelValue final : public kesto_channel {
public:
    using kesto_channel::kesto_channel;

    kesto_status add(std::int64_t amount) noexcept override;
    kesto_status set(std::int64_t value) noexcept override;
    void appendText(std::string& text, Time now) override;

private:
    std::atomic<std::int64_t> value_ = 0;
};

class HistogramChannelValue final : public kesto_channel {
public:
    // The bounds ascend.
    HistogramChannelValue(Doorbell& bell, std::string unit, std::vector<std::int64_t> bounds);

    kesto_status record(std::int64_t value) noexcept override;
    void appendText(std::string& text, Time now) override;

private:
    [[nodiscard]] std::size_t bucketOf(std::int64_t value) const noexcept;

    const std::string unit_;
    const std::vector<std::int64_t> bounds_;
    std::vector<std::atomic<std::uint64_t>> hits_;
    std::atomic<std::int64_t> minimum_;
    std::atomic<std::int64_t> maximum_;
};

class StateChannelValue final : public kesto_channel {
public:
    StateChannelValue(Doorbell& bell, std::vector<std::string> names, std::size_t first, Time now);

    kesto_status enter(std::size_t state, Time now) noexcept override;
    [[nodiscard]] bool isTimed() const noexcept override { return true; }
    void appendText(std::string& text, Time now) override;

private:
    struct State {
        std::string name;
        std::atomic<std::uint64_t> transitions = 0;
        std::atomic<std::uint64_t> microseconds = 0; // in this state, up to its last end
        std::uint64_t read = 0; // microseconds, at the last reading
        std::uint64_t shown = 0; // milliseconds; never decreases
    };
    // The state and its begin, which change together.
    struct Present {
        std::uint64_t state : 8;
        std::uint64_t since : 56; // in microseconds since the channel was made: enough for two thousand years
    };
    static_assert(KESTO_MOST_STATES <= 256 && std::atomic<Present>::is_always_lock_free);

    [[nodiscard]] std::uint64_t microsecondsAt(Time now) const noexcept;
    // Reads the present state and the times of all states up to its begin. Nothing if the state keeps changing
    // meanwhile.
    std::optional<Present> readTimes();

    const Time begin_;
    std::vector<State> states_;
    std::atomic<Present> present_;
};

} // namespace libkesto
