// The automatic bug-capture service: takes a diagnostic snapshot of the device under a signature.
#pragma once

#include "foundation/values/Value.h"

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string_view>
#include <utility>

namespace platform {

// One conversation with the service. Its functions never block on the disk.
class BugCaptureReporter {
public:
    using Reply = std::move_only_function<void(foundation::Dictionary response)>;

    virtual ~BugCaptureReporter() = default;
    // A dictionary of the arguments by their names, without those that there are not.
    [[nodiscard]] virtual foundation::Dictionary
    makeSignature(std::string_view domain, std::string_view type, std::string_view subType,
                  std::string_view subtypeContext, std::string_view detectedProcess,
                  const std::optional<foundation::Value>& triggerThresholdValues);
    // The reply comes later, on a queue of the service's choosing: once, also when no snapshot is taken and when the
    // reporter is gone. Its "success" says whether one was.
    virtual void requestSnapshot(foundation::Dictionary signature, double duration,
                                 const std::optional<foundation::Value>& event,
                                 const std::optional<foundation::Value>& payload, Reply reply) = 0;
};

// Any thread.
class BugCapture {
public:
    virtual ~BugCapture() = default;
    [[nodiscard]] virtual std::unique_ptr<BugCaptureReporter> makeReporter() = 0;

    // How whoever asks for snapshots is at that moment, to be kept in them: it is asked with each request that leads to
    // one, where and when that is made. To be set before the first; none unless it is.
    using StateDescription = std::function<foundation::Value()>;
    virtual void setStateDescription(const StateDescription& /*describe*/) { }

    // The process whose message the calling thread is handling, or 0. Processes share names: a snapshot that is asked
    // for meanwhile is of this one.
    [[nodiscard]] static std::int32_t currentSender() noexcept { return currentSender_; }

    // Makes a process the current sender of this thread while its message is being handled.
    class SenderScope {
    public:
        explicit SenderScope(std::int32_t sender) noexcept : outer_(std::exchange(currentSender_, sender)) { }
        ~SenderScope() { currentSender_ = outer_; }
        SenderScope(const SenderScope&) = delete;
        SenderScope& operator=(const SenderScope&) = delete;

    private:
        const std::int32_t outer_;
    };

private:
    static inline thread_local std::int32_t currentSender_ = 0;
};

} // namespace platform
