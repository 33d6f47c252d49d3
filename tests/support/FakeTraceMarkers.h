// Trace markers that are kept in the order in which they were left.
#pragma once

#include "foundation/Mutex.h"
#include "platform/TraceMarkers.h"

#include <functional>
#include <gtest/gtest.h>
#include <utility>
#include <vector>

namespace support {

// Any thread.
class FakeTraceMarkers final : public platform::TraceMarkers {
public:
    // Is told each code as it comes.
    void setObserver(std::function<void(std::uint32_t)> observer) { observer_ = std::move(observer); }

    // The codes since the last time.
    std::vector<std::uint32_t> take()
    {
        const foundation::Lock lock(lock_);
        return std::exchange(codes_, {});
    }

    void emit(std::uint32_t code, const std::array<std::uint64_t, 4>& arguments) override
    {
        EXPECT_EQ(arguments, (std::array<std::uint64_t, 4>{})) << "the service's markers carry no arguments";
        if (observer_)
            observer_(code);
        const foundation::Lock lock(lock_);
        codes_.push_back(code);
    }

private:
    std::function<void(std::uint32_t)> observer_;
    foundation::Mutex lock_;
    std::vector<std::uint32_t> codes_ KESTO_GUARDED_BY(lock_);
};

} // namespace support
