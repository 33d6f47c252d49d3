// SPDX-License-Identifier: Apache-2.0
// What the owner of a playback or a recording holds: its calls, which become records in the client's queue.
#pragma once

#include "calls/Client.h"
#include "kesto/playback.h"

#include <cstdint>
#include <memory>
#include <string_view>

namespace libkesto {

// Any thread, real-time threads too; but one thread creates it, and one frees it. It keeps its client's memory, so that
// it may outlive the client's end.
class StreamHandle {
public:
    // May throw std::bad_alloc. `client` is not null, and has not been freed.
    StreamHandle(kesto_client& client, Direction direction, std::string_view application, kesto_service_type type);
    // Stops and frees the stream.
    ~StreamHandle();
    StreamHandle(const StreamHandle&) = delete;
    StreamHandle& operator=(const StreamHandle&) = delete;

    kesto_status start(const kesto_format* format, const char* device) noexcept;
    kesto_status volume(double volume) noexcept;
    kesto_status mute(bool isMuted) noexcept;
    kesto_status route(const char* device) noexcept;
    kesto_status format(const kesto_format* format) noexcept;
    kesto_status pause() noexcept { return put({.action = StreamAction::Pause}); }
    kesto_status resume() noexcept { return put({.action = StreamAction::Resume}); }
    kesto_status fault(std::uint64_t cycles, double seconds) noexcept;
    kesto_status stop() noexcept { return put({.action = StreamAction::Stop}); }

private:
    kesto_status put(StreamRecord record, const char* device = nullptr, const kesto_format* format = nullptr) noexcept;
    kesto_status refuse() noexcept;

    kesto_client& client_;
    Stream& stream_;
};

} // namespace libkesto
