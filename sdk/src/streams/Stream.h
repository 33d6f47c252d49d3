// SPDX-License-Identifier: Apache-2.0
// The room of streams: what a program plays or records, from its calls to the calls of a session. It has no threads and
// no connection.
//
// A stream is one playback or one recording. The client's thread alone follows its state, from the records that callers
// put into the client's queue, and makes the calls of its sessions. A stream without a service only follows: when the
// service is back, it gets the state as it is then.
//
// Nothing here allocates while there is no service, so that following never fails.
#pragma once

#include "Moment.h"
#include "kesto/kesto.h"
#include "streams/StreamRecord.h"
#include "wire/CallFrames.h"
#include "wire/MessageEncoder.h"

#include <cstdint>
#include <string>
#include <string_view>

namespace libkesto {

// Takes calls, in their order, on their way to the service. May throw std::bad_alloc.
class CallTaker {
public:
    virtual void takeCall(const Call& call) = 0;

protected:
    ~CallTaker() = default;
};

enum class Direction : std::uint8_t { Output, Input };

// The client's thread, after it was made.
class Stream {
public:
    Stream(Direction direction, std::string_view application, kesto_service_type type);
    Stream(const Stream&) = delete;
    Stream& operator=(const Stream&) = delete;

    // Follows the call of the record, with the texts that belong to it. Without a service (null) it does not throw.
    // Following a record again after an exception gives the same state.
    void follow(const StreamRecord& record, std::string_view texts, CallTaker* service);
    // Ends the session.
    void stop(Moment when, CallTaker* service);
    // Makes the session of a started stream on a new connection.
    void renewSession(CallTaker& service) const;

    // From start to stop.
    [[nodiscard]] bool isStarted() const noexcept { return isStarted_; }

private:
    struct Format {
        std::string encoding; // empty: unknown
        std::uint32_t rate = 0;
        std::uint32_t channels = 0;
    };

    void start(const StreamRecord& record, std::string_view texts, CallTaker* service);
    void pause(Moment when, CallTaker* service);
    void resume(Moment when, CallTaker* service);
    void setVolume(double volume, bool isMuted, Moment when, CallTaker* service);
    void setDevice(std::string_view device, Moment when, CallTaker* service);
    void setFormat(const StreamRecord& record, std::string_view encoding, Moment when, CallTaker* service);
    void reportFault(const StreamRecord& record, CallTaker& service) const;

    [[nodiscard]] double volume() const noexcept;
    [[nodiscard]] kesto_category category() const noexcept;
    // The stream has changed, and reports this if it is started.
    [[nodiscard]] bool hasToReport(Moment when, const CallTaker* service) noexcept;
    void addFormat(MessageEncoder& message) const;
    void addDevice(MessageEncoder& message) const;
    void sendRunning(Moment when, CallTaker* service) const;
    void send(MessageEncoder& message, kesto_category category, kesto_event_type type, Moment when,
              CallTaker& service) const;
    void openSession(CallTaker& service) const;
    [[nodiscard]] Call call(kesto_operation operation) const;

    const Direction direction_;
    const std::string application_;
    const kesto_service_type type_;

    kesto_reporter reporter_ = 0;
    bool isStarted_ = false;
    bool isRunning_ = false; // started and not paused
    std::int64_t runs_ = 0; // since the start
    Moment startedAt_;
    Moment unchangedSince_; // of all that a Start reports

    double setVolume_ = 1;
    bool isMuted_ = false;
    bool hasDevice_ = false; // whether a device was ever given, even if it was none
    std::string device_; // this and the encoding have room for the longest, so that they never allocate
    Format format_;
};

} // namespace libkesto
