// SPDX-License-Identifier: Apache-2.0
// Keeps events in memory, for tests: the smallest possible keeper.
#pragma once

#include "foundation/Mutex.h"
#include "platform/Clock.h"
#include "platform/linux/store/EventKeeper.h"
#include "platform/linux/store/tables/KnownOrigins.h"

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
    void setWaker(std::function<void()>) override { }
    void open() override { }
    void beginEnd() override { }
    void prepareForEnd() override { }
    void keep(platform::EventBatch& events, ledger::Tally& tally) override
    {
        std::vector<KeptEvent> given;
        for (const platform::EventRow& row : events.rows())
            for (const std::string_view name : {row.name, row.secondName})
                if (!name.empty())
                    given.push_back({row.time, std::string(name), std::string(row.payload)});
        place_->change([&](std::vector<KeptEvent>& kept) { kept.insert(kept.end(), given.begin(), given.end()); });
        tally.add(ledger::Counter::Kept, given.size());
        origins_.begin(events.announcements());
        origins_.countLoss(ledger::Counter::LostNotJson, eventsByOrigin(events.rowsWithoutJson()), tally);
    }
    [[nodiscard]] bool awaitsQuiet() const override { return false; }
    bool tidy(bool, ledger::Tally& tally) override
    {
        constexpr double secondsADay = 86400;
        const double tooOld = clock_.secondsSince1970() - configuration_.maximumAgeDays * secondsADay;
        place_->change([&](std::vector<KeptEvent>& kept) {
            tally.add(ledger::Counter::RemovedForAge,
                      std::erase_if(kept, [&](const KeptEvent& event) { return event.time < tooOld; }));
            std::size_t bytes = 0;
            for (const KeptEvent& event : kept)
                bytes += event.name.size() + event.payload.size();
            while (bytes > configuration_.maximumSizeMegabytes * 1024 * 1024) {
                bytes -= kept.front().name.size() + kept.front().payload.size();
                kept.erase(kept.begin());
                tally.add(ledger::Counter::RemovedForSize);
            }
        });
        return false;
    }
    void reportLosses() override { }
    [[nodiscard]] std::optional<ledger::StoreState> state() const override
    {
        const auto events = place_->all();
        ledger::StoreState state{
            .events = events.size(), .bytes = 0, .oldest = events.empty() ? 0 : events.front().time};
        for (const KeptEvent& event : events)
            state.bytes += event.name.size() + event.payload.size();
        return state;
    }

private:
    const std::shared_ptr<KeptEvents> place_;
    const platform::Clock& clock_;
    platform::AnalyticsConfiguration configuration_;
    platform::KnownOrigins origins_;
};

} // namespace support
