// SPDX-License-Identifier: Apache-2.0
// The codes of the service's own events in the kernel's trace, which show its work between the events of drivers and
// clients.
#pragma once

#include "platform/Platform.h"

#include <cstdint>

namespace utility {

enum class ServiceTraceCode : std::uint32_t {
    // Operations of a client.
    ClientCreate = 0x21044814,
    ClientStart = 0x21044818,
    ClientStop = 0x2104481C,
    ClientDestroy = 0x21044820,
    ClientSendMessage = 0x21044824,
    // Events of a session.
    SessionCreated = 0x21044828,
    SessionStarted = 0x2104482C,
    SessionStopping = 0x21044830,
    SessionDestroyed = 0x21044834,
    SessionMessageAccepted = 0x21044838,
};

// Emits an event of that code, with four zero arguments. Any thread.
inline void emitTraceCode(ServiceTraceCode code)
{
    platform::current().traceEmitter.emit(static_cast<std::uint32_t>(code), {});
}

} // namespace utility
