// SPDX-License-Identifier: Apache-2.0
// What a session of a kernel trace delivers, and whether it calls its handlers as promised.
#pragma once

#include "platform/KernelTrace.h"
#include "platform/WorkQueue.h"
#include "support/Progress.h"

#include <gtest/gtest.h>
#include <vector>

namespace support {

// Outlives the session. Any thread.
class DeliveredEvents {
public:
    // Sets the session's completion handler to record its end here. All handlers must run on the queue.
    void listenTo(platform::KernelTraceSession& session, const platform::WorkQueue& queue)
    {
        session.setCompletionHandler([this, &queue] {
            progress_.change([&] {
                ++completions_;
                isAsPromised_ = isAsPromised_ && queue.isCurrent();
            });
        });
    }
    [[nodiscard]] int filter(platform::KernelTraceSession& session, const platform::WorkQueue& queue,
                             std::uint32_t firstCode, std::uint32_t lastCode)
    {
        return session.filterEventRange(firstCode, lastCode, [this, &queue](const platform::KernelTraceEvent& event) {
            progress_.change([&] {
                isAsPromised_ = isAsPromised_ && queue.isCurrent() && completions_ == 0;
                events_.push_back(event);
            });
        });
    }

    [[nodiscard]] bool waitForCompletion()
    {
        return progress_.waitFor([&] { return completions_ > 0; });
    }
    [[nodiscard]] bool waitForEvents(std::size_t count)
    {
        return progress_.waitFor([&] { return events_.size() >= count; });
    }
    [[nodiscard]] int completions()
    {
        return progress_.look([&] { return completions_; });
    }
    [[nodiscard]] std::vector<platform::KernelTraceEvent> events()
    {
        return progress_.look([&] {
            EXPECT_TRUE(isAsPromised_) << "handlers run on the queue, and none for an event after the completion";
            return events_;
        });
    }
    [[nodiscard]] std::vector<std::uint32_t> codes()
    {
        std::vector<std::uint32_t> codes;
        for (const platform::KernelTraceEvent& event : events())
            codes.push_back(event.eventCode);
        return codes;
    }

private:
    Progress progress_;
    std::vector<platform::KernelTraceEvent> events_;
    int completions_ = 0;
    bool isAsPromised_ = true;
};

} // namespace support
