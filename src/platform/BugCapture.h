// SPDX-License-Identifier: Apache-2.0
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

// One conversation with the service. Its functions never block on the disk. One thread at a time.
class BugCaptureReporter {
public:
    using Reply = std::move_only_function<void(foundation::Dictionary response)>;

    virtual ~BugCaptureReporter() = default;
    // A dictionary of the arguments by their names, without absent ones.
    [[nodiscard]] virtual foundation::Dictionary
    makeSignature(std::string_view domain, std::string_view type, std::string_view subType,
                  std::string_view subtypeContext, std::string_view detectedProcess,
                  const std::optional<foundation::Value>& triggerThresholdValues);
    // The reply comes later, once, on a queue that the service chooses, even if no snapshot is taken or the reporter
    // has been destroyed. Its "success" tells whether a snapshot was taken. The duration, in seconds, is kept with
    // the snapshot.
    virtual void requestSnapshot(foundation::Dictionary signature, double duration,
                                 const std::optional<foundation::Value>& event,
                                 const std::optional<foundation::Value>& payload, Reply reply) = 0;
};

// Any thread.
class BugCapture {
public:
    virtual ~BugCapture() = default;
    [[nodiscard]] virtual std::unique_ptr<BugCaptureReporter> makeReporter() = 0;

    // Describes the state of the requesting program, to be kept in the snapshot: called with each accepted request, on
    // the requesting thread. Set it before the first request; without it snapshots hold no description.
    using StateDescription = std::function<foundation::Value()>;
    virtual void setStateDescription(const StateDescription& /*describe*/) { }

    // The process that sent the message which the calling thread is handling, or 0. Several processes may share a name;
    // a snapshot that is requested meanwhile is of this process.
    //
    // It belongs to the thread because `handleEventForVorp` and `requestSnapshot`, through which a message reaches the
    // service, have fixed parameters, and the sender is not among them. It is set and read within one work item, and
    // that runs on one thread.
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
