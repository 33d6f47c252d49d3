// A bug-capture service that keeps the snapshots it is asked for, and answers when the test says so.
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
        std::int32_t sender = 0; // the current one when it was asked for
    };

    // The snapshots asked for, in order; `snapshots()[0].reply(...)` answers one.
    [[nodiscard]] std::vector<Snapshot>& snapshots() { return snapshots_; }
    [[nodiscard]] int reportersMade() const { return reportersMade_; }
    // What a snapshot would keep of the service now; null when it does not tell.
    [[nodiscard]] foundation::Value describeState() const { return describe_ ? describe_() : foundation::Value(); }

    std::unique_ptr<platform::BugCaptureReporter> makeReporter() override
    {
        ++reportersMade_;
        return std::make_unique<Reporter>(snapshots_);
    }
    void setStateDescription(const StateDescription& describe) override { describe_ = describe; }

private:
    class Reporter final : public platform::BugCaptureReporter {
    public:
        explicit Reporter(std::vector<Snapshot>& snapshots) : snapshots_(snapshots) { }

        foundation::Dictionary makeSignature(std::string_view domain, std::string_view type, std::string_view subType,
                                             std::string_view subtypeContext, std::string_view detectedProcess,
                                             const std::optional<foundation::Value>& triggerThresholdValues) override
        {
            return {{"domain", domain},
                    {"type", type},
                    {"subType", subType},
                    {"subtypeContext", subtypeContext},
                    {"detectedProcess", detectedProcess},
                    {"triggerThresholdValues", triggerThresholdValues.value_or(foundation::Value())}};
        }
        void requestSnapshot(foundation::Dictionary signature, double duration,
                             const std::optional<foundation::Value>& event,
                             const std::optional<foundation::Value>& payload, Reply reply) override
        {
            snapshots_.push_back(
                {std::move(signature), duration, event, payload, std::move(reply), platform::BugCapture::currentSender()});
        }

    private:
        std::vector<Snapshot>& snapshots_;
    };

    std::vector<Snapshot> snapshots_;
    int reportersMade_ = 0;
    StateDescription describe_;
};

} // namespace support
