// SPDX-License-Identifier: Apache-2.0
// libkesto for C, tracing: events of a program in the kernel's trace, for sessions of the Kesto reporting service
// (kestod) that measure the time between them.
//
// An event is a code and four numbers. The kernel adds the time, the thread and the processor; the service delivers the
// events to the sessions that run and pairs them into intervals (docs/tracing.md). While no trace runs, emitting costs
// one read of memory: the calls may stay in a release, in real-time threads too.
//
//     const kesto_options options = {.size = sizeof options, .trace = true};
//     kesto_client *client;
//     if (kesto_client_open(&options, &client) != KESTO_OK)
//         return;
//     const kesto_tracer *tracer = kesto_client_tracer(client);
//     ...
//     kesto_trace(tracer, 0x21040010, buffer, 0, 0, 0);
//     mix(buffer);
//     kesto_trace(tracer, 0x21040014, buffer, 0, 0, 0);
//
// A program needs no rights for this: the service gives the necessary descriptors to every client that asks, when the
// first trace starts, and again over each new connection. Events that are emitted before, or without a connection, are
// discarded.
#ifndef KESTO_TRACE_H
#define KESTO_TRACE_H

#include "kesto.h"

#ifdef __cplusplus
extern "C" {
#endif

// A client emits events through it. Its fields are for `kesto_trace_active`.
typedef struct kesto_tracer {
    const uint32_t* is_tracing;
} kesto_tracer;

// The codes that the service's sessions collect, both ends included.
#define KESTO_FIRST_TRACE_CODE UINT32_C(0x21040000)
#define KESTO_LAST_TRACE_CODE UINT32_C(0x2104408A)

// The client's tracer, valid until `kesto_client_free`. Never null: the tracer of a null client, or of a client that
// was opened without `trace`, emits nothing. Any thread.
KESTO_API const kesto_tracer* kesto_client_tracer(const kesto_client* client);

// Writes the event in any case: one system call, which does not wait. For `kesto_trace`.
KESTO_API void kesto_tracer_emit(const kesto_tracer* tracer, uint32_t code, uint64_t argument1, uint64_t argument2,
                                 uint64_t argument3, uint64_t argument4);

// Whether a trace runs now; check it before computing expensive arguments. Any thread.
static inline bool kesto_trace_active(const kesto_tracer* tracer)
{
    return __builtin_expect(__atomic_load_n(tracer->is_tracing, __ATOMIC_RELAXED) != 0, 0);
}

// Emits an event if a trace runs. For real-time threads: no lock, no allocation; one system call of some 300 ns while a
// trace runs, else none. A forked child may call it, too, as long as the parent may use its tracer.
static inline void kesto_trace(const kesto_tracer* tracer, uint32_t code, uint64_t argument1, uint64_t argument2,
                               uint64_t argument3, uint64_t argument4)
{
    if (kesto_trace_active(tracer))
        kesto_tracer_emit(tracer, code, argument1, argument2, argument3, argument4);
}

#ifdef __cplusplus
}
#endif

#endif
