// SPDX-License-Identifier: Apache-2.0
// libkesto for C++, tracing: events of a program in the kernel's trace, for sessions of the Kesto reporting service
// (kestod) that measure the time between them.
//
//     kesto::Options options;
//     options.trace = true;
//     kesto::Client client;
//     if (client.open(options) != kesto::Status::Ok)
//         return;
//     const kesto::Tracer tracer(client);
//     {
//         const kesto::TraceInterval mixing(tracer, 0x21040010, 0x21040014);
//         mix(buffer);
//     }
//
// A thin layer over trace.h, all of it inline; the rules there about cost, threads and rights hold here, too.
#ifndef KESTO_TRACE_HPP
#define KESTO_TRACE_HPP

#include "kesto.hpp"
#include "trace.h"

#include <cstdint>

namespace kesto {

// A program emits events through it. Copies are equivalent; do not use one after its client is destroyed. Any thread.
class Tracer {
public:
    // A tracer that emits nothing.
    Tracer() noexcept : tracer_(kesto_client_tracer(nullptr)) { }
    // The tracer of an open client with the option `trace`; for any other client it emits nothing.
    explicit Tracer(const Client& client) noexcept : tracer_(kesto_client_tracer(client.get())) { }

    [[nodiscard]] bool isActive() const noexcept { return kesto_trace_active(tracer_); }
    void emit(std::uint32_t code, std::uint64_t argument1 = 0, std::uint64_t argument2 = 0, std::uint64_t argument3 = 0,
              std::uint64_t argument4 = 0) const noexcept
    {
        kesto_trace(tracer_, code, argument1, argument2, argument3, argument4);
    }
    [[nodiscard]] const kesto_tracer* get() const noexcept { return tracer_; }

private:
    const kesto_tracer* tracer_;
};

// Emits one event when it is made and another when it is destroyed.
class TraceInterval {
public:
    TraceInterval(const Tracer& tracer, std::uint32_t beginCode, std::uint32_t endCode) noexcept
        : tracer_(tracer),
          endCode_(endCode)
    {
        tracer_.emit(beginCode);
    }
    ~TraceInterval() { tracer_.emit(endCode_); }
    TraceInterval(const TraceInterval&) = delete;
    TraceInterval& operator=(const TraceInterval&) = delete;

private:
    const Tracer tracer_;
    const std::uint32_t endCode_;
};

} // namespace kesto

#endif
