// SPDX-License-Identifier: Apache-2.0
// A client's threads emit trace events through it, while the client's own thread connects, loses its connection and
// connects again.
//
// The threads take no lock, so the page must stay at its address and the descriptor must keep its number as long as the
// emitter lives. Only the objects behind them change: the address shows the library's own empty page or the service's
// page, and the number is a descriptor without write access or the service's marker. The system exchanges each in one
// step.
#pragma once

#include "kesto/trace.h"
#include "platform/linux/files/FileDescriptor.h"

#include <array>
#include <memory>

namespace libkesto {

// The descriptors from the service: the marker and the page.
using ReceivedDescriptors = std::array<platform::FileDescriptor, 2>;

class AttachableEmitter final : public kesto_tracer {
public:
    // Null, with `errno`, if the system refuses a descriptor or a page. May throw std::bad_alloc.
    [[nodiscard]] static std::unique_ptr<AttachableEmitter> create();
    ~AttachableEmitter();
    AttachableEmitter(const AttachableEmitter&) = delete;
    AttachableEmitter& operator=(const AttachableEmitter&) = delete;

    // Any thread.
    void emit(std::uint32_t code, const std::array<std::uint64_t, 4>& arguments) const noexcept;

    // From now on events go to the service. False if the descriptors are not as expected. Called on the client's
    // thread.
    [[nodiscard]] bool attach(ReceivedDescriptors descriptors) noexcept;
    // From now on events are discarded. Called on the client's thread.
    void detach() noexcept;

private:
    AttachableEmitter() noexcept : kesto_tracer{} { }

    void* page_ = nullptr;
    platform::FileDescriptor nowhere_; // open, but not for writing
    platform::FileDescriptor marker_; // its number stays
};

} // namespace libkesto
