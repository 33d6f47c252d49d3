// SPDX-License-Identifier: Apache-2.0
// Watches for haptics hardware that keeps running: if a second, different report of haptic hardware time comes after a
// first one, a session has probably leaked, and this class requests a snapshot from the bug-capture service.
//
// The system's model gives both names: the file's ends in Utility, the class's has it in the middle.
#pragma once

#include "platform/BugCapture.h"
#include "sinks/SinkSession.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <string_view>

// On the server queue, so it needs no lock.
class KestoReportingUtilityVorpStateManager {
public:
    // A message of a session, sent by a process of that name. No message is ignored.
    void handleEvent(const std::optional<foundation::Dictionary>& message, AudioEventCategory category,
                     AudioEventType type, const std::shared_ptr<const sinks::SinkSession>& session,
                     std::string_view processName);

    // How many distinct reports were counted since the last snapshot: 0 or 1.
    [[nodiscard]] std::uint64_t leakedHapticsSessionCounter() const { return leakedHapticsSessionCounter_; }
    // The report counted last.
    [[nodiscard]] const foundation::Dictionary& messageCache() const { return messageCache_; }
    // The reporter of the last requested snapshot; null before the first.
    [[nodiscard]] const platform::BugCaptureReporter* ulmetReporter() const { return ulmetReporter_.get(); }

private:
    void requestSnapshot(AudioEventCategory category, const sinks::SinkSession& session, std::string_view processName);

    std::uint64_t leakedHapticsSessionCounter_ = 0;
    foundation::Dictionary messageCache_;
    std::unique_ptr<platform::BugCaptureReporter> ulmetReporter_;
};
