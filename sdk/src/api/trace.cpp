// SPDX-License-Identifier: Apache-2.0
// Implements trace.h with the classes of the library.
#include "kesto/trace.h"

#include "AttachableEmitter.h"
#include "calls/Client.h"

namespace {

constinit const std::uint32_t nobodyTraces = 0;
constinit const kesto_tracer silentTracer{&nobodyTraces};

} // namespace

const kesto_tracer* kesto_client_tracer(const kesto_client* client)
{
    const kesto_tracer* const tracer = client == nullptr ? nullptr : client->tracer();
    return tracer == nullptr ? &silentTracer : tracer;
}

void kesto_tracer_emit(const kesto_tracer* tracer, uint32_t code, uint64_t argument1, uint64_t argument2,
                       uint64_t argument3, uint64_t argument4)
{
    if (tracer != nullptr && tracer != &silentTracer)
        static_cast<const libkesto::AttachableEmitter*>(tracer)->emit(code,
                                                                      {argument1, argument2, argument3, argument4});
}
