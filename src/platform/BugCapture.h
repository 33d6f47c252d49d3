// The automatic bug-capture service: takes a diagnostic snapshot of the device under a signature.
#pragma once

#include "foundation/Value.h"

#include <functional>
#include <memory>
#include <optional>
#include <string_view>

namespace platform {

// One conversation with the service. Its functions never block on the disk.
class BugCaptureReporter {
public:
    using Reply = std::move_only_function<void(foundation::Dictionary response)>;

    virtual ~BugCaptureReporter() = default;
    [[nodiscard]] virtual foundation::Dictionary
    makeSignature(std::string_view domain, std::string_view type, std::string_view subType,
                  std::string_view subtypeContext, std::string_view detectedProcess,
                  const std::optional<foundation::Value>& triggerThresholdValues) = 0;
    // The reply comes later, on a queue of the service's choosing.
    virtual void requestSnapshot(foundation::Dictionary signature, double duration,
                                 const std::optional<foundation::Value>& event,
                                 const std::optional<foundation::Value>& payload, Reply reply) = 0;
};

// Any thread.
class BugCapture {
public:
    virtual ~BugCapture() = default;
    [[nodiscard]] virtual std::unique_ptr<BugCaptureReporter> makeReporter() = 0;
};

} // namespace platform
