// Keeps events in memory, for tests: the smallest possible keeper.
#pragma once

#include "foundation/Mutex.h"
#include "platform/Clock.h"
#include "platform/linux/store/EventKeeper.h"

#include <atomic>
#include <memory>
#include <string>
#include <vector>

namespace support {

struct KeptEvent {
    double time = 0;
    std::string name;
    std::string payload;
};

// The place of the events; like a file, it outlives its keeper. Any thread.
class KeptEvents {
public:
    [[nodiscard]] std::vector<KeptEvent> all() const
    {
        const foundation::Lock lock(lock_);
        return events_;
    }
    template <typename Change> void change(Change change)
    {
        const foundation::Lock lock(lock_);
        change(events_);
    }

private:
    mutable foundation::Mutex lock_;
    std::vector<KeptEvent> events_ KESTO_GUARDED_BY(lock_);
};

class MemoryKeeper : public platform::EventKeeper {
public:
    MemoryKeeper(std::shared_ptr<KeptEvents> place, const platform::Clock& clock)
        : place_(std::move(place)),
          clock_(clock)
    {
    }

    void setConfiguration(const platform::AnalyticsConfiguration& configuration) override
    {
        configuration_ = configuration;
    }
    void open() override { }
    void keep(platform::EventBatch& events) override
    {
        const auto rows = events.rows();
        place_->change([&](std::vector<KeptEvent>& kept) {
            for (const auto& [time, name, payload] : rows)
                kept.push_back({time, std::string(name), std::string(payload)});
        });
        kept_ += rows.size();
        notJson_ += events.size() - rows.size();
    }
    [[nodiscard]] bool awaitsQuiet() const override { return false; }
    bool tidy(bool) override
    {
        constexpr double secondsADay = 86400;
        const double tooOld = clock_.secondsSince1970() - configuration_.maximumAgeDays * secondsADay;
        place_->change([&](std::vector<KeptEvent>& kept) {
            std::erase_if(kept, [&](const KeptEvent& event) { return event.time < tooOld; });
            std::size_t bytes = 0;
            for (const KeptEvent& event : kept)
                bytes += event.name.size() + event.payload.size();
            while (bytes > configuration_.maximumSizeMegabytes * 1024 * 1024) {
                bytes -= kept.front().name.size() + kept.front().payload.size();
                kept.erase(kept.begin());
            }
        });
        return false;
    }
    [[nodiscard]] std::uint64_t keptEvents() const noexcept override { return kept_; }
    [[nodiscard]] std::uint64_t lostEvents(platform::StoreError reason) const noexcept override
    {
        return reason == platform::StoreError::NotJson ? notJson_.load() : 0;
    }

private:
    const std::shared_ptr<KeptEvents> place_;
    const platform::Clock& clock_;
    platform::AnalyticsConfiguration configuration_;
    std::atomic<std::uint64_t> kept_ = 0;
    std::atomic<std::uint64_t> notJson_ = 0;
};

} // namespace support
