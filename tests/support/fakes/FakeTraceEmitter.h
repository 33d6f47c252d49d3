// SPDX-License-Identifier: Apache-2.0
// Keeps trace events in the order in which they were emitted.
#pragma once

#include "foundation/Mutex.h"
#include "platform/TraceEmitter.h"

#include <functional>
#include <gtest/gtest.h>
#include <utility>
#include <vector>

namespace support {

struct KeptEmission {
    std::uint32_t code = 0;
    std::array<std::uint64_t, 4> arguments{};
    friend bool operator==(const KeptEmission&, const KeptEmission&) = default;
};

// Any thread.
class FakeTraceEmitter final : public platform::TraceEmitter {
public:
    // The observer gets each code immediately.
    void setObserver(std::function<void(std::uint32_t)> observer) { observer_ = std::move(observer); }
    // Whether a trace runs; at first one does.
    void setTraced(bool isTraced)
    {
        const foundation::Lock lock(lock_);
        isTraced_ = isTraced;
    }

    // The codes of the service's markers since the last call.
    std::vector<std::uint32_t> take()
    {
        std::vector<std::uint32_t> codes;
        for (const KeptEmission& event : takeEvents()) {
            EXPECT_EQ(event.arguments, (std::array<std::uint64_t, 4>{}))
                << "the service's own events carry no arguments";
            codes.push_back(event.code);
        }
        return codes;
    }
    // The same, for all emitters.
    std::vector<KeptEmission> takeEvents()
    {
        const foundation::Lock lock(lock_);
        return std::exchange(events_, {});
    }

    void emit(std::uint32_t code, const std::array<std::uint64_t, 4>& arguments) override
    {
        if (observer_)
            observer_(code);
        const foundation::Lock lock(lock_);
        if (isTraced_)
            events_.push_back({code, arguments});
    }

private:
    std::function<void(std::uint32_t)> observer_;
    foundation::Mutex lock_;
    bool isTraced_ KESTO_GUARDED_BY(lock_) = true;
    std::vector<KeptEmission> events_ KESTO_GUARDED_BY(lock_);
};

} // namespace support
