// SPDX-License-Identifier: Apache-2.0
// A bug-capture service that keeps the requests for snapshots, and answers when the test says so.
#pragma once

#include "platform/BugCapture.h"

#include <vector>

namespace support {

// One thread.
class FakeBugCapture final : public platform::BugCapture {
public:
    struct Snapshot {
        foundation::Dictionary signature;
        double duration = 0;
        std::optional<foundation::Value> event;
        std::optional<foundation::Value> payload;
        platform::BugCaptureReporter::Reply reply;
        std::int32_t sender = 0; // the current sender at the time of the request
        foundation::Value state; // of the requesting program at that time; null without a description
    };

    // The requested snapshots, in order; `snapshots()[0].reply(...)` answers one.
    [[nodiscard]] std::vector<Snapshot>& snapshots() { return snapshots_; }
    [[nodiscard]] int reportersMade() const { return reportersMade_; }
    // The service's present description for a snapshot; null without one.
    [[nodiscard]] foundation::Value describeState() const { return describe_ ? describe_() : foundation::Value(); }

    std::unique_ptr<platform::BugCaptureReporter> makeReporter() override
    {
        ++reportersMade_;
        return std::make_unique<Reporter>(*this);
    }
    void setStateDescription(const StateDescription& describe) override { describe_ = describe; }

private:
    class Reporter final : public platform::BugCaptureReporter {
    public:
        explicit Reporter(FakeBugCapture& capture) : capture_(capture) { }

        void requestSnapshot(foundation::Dictionary signature, double duration,
                             const std::optional<foundation::Value>& event,
                             const std::optional<foundation::Value>& payload, Reply reply) override
        {
            capture_.snapshots_.push_back({std::move(signature), duration, event, payload, std::move(reply),
                                           platform::BugCapture::currentSender(), capture_.describeState()});
        }

    private:
        FakeBugCapture& capture_;
    };

    std::vector<Snapshot> snapshots_;
    int reportersMade_ = 0;
    StateDescription describe_;
};

} // namespace support
