// The value of a channel, which any thread changes at any time, and the text that its file shows of it.
//
// Values are atomic and stand by themselves: nobody waits for anybody. What is read while it changes may be a moment
// old, but no count in it ever goes back, since that would say that the channel has begun anew.
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

// The opaque type of the interface. Changes: any thread. What is not said otherwise: whoever holds the publisher's
// lock.
struct kesto_channel {
public:
    using Time = libkesto::ChannelClock::time_point;

    explicit kesto_channel(libkesto::Doorbell& bell) noexcept : bell_(bell) { }
    virtual ~kesto_channel() = default;
    kesto_channel(const kesto_channel&) = delete;
    kesto_channel& operator=(const kesto_channel&) = delete;

    // Refused by channels of another kind. Any thread.
    virtual kesto_status add(std::int64_t) noexcept { return KESTO_INVALID_ARGUMENT; }
    virtual kesto_status set(std::int64_t) noexcept { return KESTO_INVALID_ARGUMENT; }
    virtual kesto_status record(std::int64_t) noexcept { return KESTO_INVALID_ARGUMENT; }
    virtual kesto_status enter(std::size_t, Time) noexcept { return KESTO_INVALID_ARGUMENT; }

    // Whether time passes in it while nobody touches it.
    [[nodiscard]] virtual bool isTimed() const noexcept { return false; }
    // The content of the file.
    virtual void appendText(std::string& text, Time now) = 0;

    // Whether there is something that has not been written.
    [[nodiscard]] bool isChanged() const noexcept { return isChanged_.load(); }
    void setChanged(bool isChanged) noexcept { isChanged_.store(isChanged); }

    // Who writes it, once it was added there.
    [[nodiscard]] kesto_publisher& publisher() const noexcept { return *publisher_; }
    void setPublisher(kesto_publisher& publisher) noexcept { publisher_ = &publisher; }

protected:
    // After a value was changed, by an operation that is sequentially consistent. Any thread.
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

class SimpleChannel final : public kesto_channel {
public:
    using kesto_channel::kesto_channel;

    kesto_status add(std::int64_t amount) noexcept override;
    kesto_status set(std::int64_t value) noexcept override;
    void appendText(std::string& text, Time now) override;

private:
    std::atomic<std::int64_t> value_ = 0;
};

class HistogramChannel final : public kesto_channel {
public:
    // The bounds ascend.
    HistogramChannel(Doorbell& bell, std::string unit, std::vector<std::int64_t> bounds);

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

class StateChannel final : public kesto_channel {
public:
    StateChannel(Doorbell& bell, std::vector<std::string> names, std::size_t first, Time now);

    kesto_status enter(std::size_t state, Time now) noexcept override;
    [[nodiscard]] bool isTimed() const noexcept override { return true; }
    void appendText(std::string& text, Time now) override;

private:
    struct State {
        std::string name;
        std::atomic<std::uint64_t> transitions = 0;
        std::atomic<std::uint64_t> microseconds = 0; // up to when it was last left
        std::uint64_t read = 0; // microseconds, at the last look
        std::uint64_t shown = 0; // milliseconds; never become less
    };
    // The state and since when, so that both change at once.
    struct Present {
        std::uint64_t state : 8;
        std::uint64_t since : 56; // in microseconds since the channel was made: enough for two thousand years
    };
    static_assert(KESTO_MOST_STATES <= 256 && std::atomic<Present>::is_always_lock_free);

    [[nodiscard]] std::uint64_t microsecondsAt(Time now) const noexcept;
    // The state that lasts, and what the others have been credited with up to then. Nothing when it never lasts.
    std::optional<Present> readTimes();

    const Time begin_;
    std::vector<State> states_;
    std::atomic<Present> present_;
};

} // namespace libkesto
