// SPDX-License-Identifier: Apache-2.0
// The room of traces: emitting events into the kernel's trace, reading them, and writing the files of results. Only
// this room uses tracefs.
//
// The kernel event trace service, with an instance of tracefs that belongs to the service.
//
// All sessions share the instance: it has one ring buffer for each processor, to which all emitters write, and each
// session gets its part of the events. While a session runs, a thread reads the buffers every few milliseconds. The
// kernel could wake the thread for events instead, but this would make an event seven times as expensive for its
// emitter. Without a session the buffers are off and the thread sleeps.
//
// An event is delivered after the settling time, because until then an older event may still come from another
// processor. A session is completed when this time has passed since its end.
#pragma once

#include "foundation/Mutex.h"
#include "platform/KernelTrace.h"
#include "platform/linux/log/ProviderLog.h"
#include "platform/linux/trace/EmitterAccess.h"
#include "platform/linux/trace/TraceFanOut.h"
#include "platform/linux/trace/TraceMerger.h"
#include "platform/linux/trace/TracefsEmitter.h"
#include "platform/linux/trace/TracefsInstance.h"

#include <chrono>
#include <filesystem>
#include <memory>
#include <optional>
#include <string>
#include <thread>

namespace platform {

// The place of the trace; the defaults are the service's, tests set others.
struct TracefsPlace {
    std::filesystem::path mounts = "/proc/self/mounts";
    std::string instanceName = "kesto";
};

// Any thread. Its sessions must be destroyed before it.
class TracefsKernelTrace final : public KernelTrace {
public:
    using Clock = std::chrono::steady_clock; // the clock of the trace

    static constexpr std::chrono::milliseconds readingPeriod{20};
    static constexpr std::chrono::milliseconds settlingTime{2};
    // Each service on a machine has an instance: the second service has this name with "-2", and so on.
    static constexpr int mostInstances = 8;

    // Notifies the emitter and the access when a trace starts or ends.
    TracefsKernelTrace(TracefsPlace place, TracefsEmitter& emitter, EmitterAccess& access, ProviderLog log);
    ~TracefsKernelTrace() override;
    TracefsKernelTrace(const TracefsKernelTrace&) = delete;
    TracefsKernelTrace& operator=(const TracefsKernelTrace&) = delete;

    // The first call of either function sets up the instance, which takes some 30 ms. If this fails, the reason is
    // logged whenever it changes.
    [[nodiscard]] bool isAvailable() override;
    [[nodiscard]] std::unique_ptr<KernelTraceSession> createTraceSession() override;

private:
    class Session;

    [[nodiscard]] std::expected<TracefsInstance, TracefsFailure> openInstance() const;
    [[nodiscard]] bool setUp() KESTO_REQUIRES(lock_);
    // 0 or an error number.
    [[nodiscard]] int start(const std::shared_ptr<TraceSubscription>& subscription);
    void end(const std::shared_ptr<TraceSubscription>& subscription);
    void remove(TraceSubscription& subscription);

    [[nodiscard]] int switchOn() KESTO_REQUIRES(lock_);
    void switchOff() KESTO_REQUIRES(lock_);
    void updateEmitters() KESTO_REQUIRES(lock_);
    void run();
    [[nodiscard]] Clock::time_point nextReading() const KESTO_REQUIRES(lock_);
    void read() KESTO_REQUIRES(lock_);

    const TracefsPlace place_;
    TracefsEmitter& emitter_;
    EmitterAccess& access_;
    const ProviderLog log_;

    foundation::Mutex lock_;
    foundation::Condition changed_;
    std::string problem_ KESTO_GUARDED_BY(lock_); // the last logged one
    std::optional<TracefsInstance> instance_ KESTO_GUARDED_BY(lock_);
    std::optional<TraceMerger> merger_ KESTO_GUARDED_BY(lock_); // while the instance is on
    TraceFanOut fanOut_ KESTO_GUARDED_BY(lock_);
    Clock::time_point lastReading_ KESTO_GUARDED_BY(lock_);
    bool isOn_ KESTO_GUARDED_BY(lock_) = false;
    bool isStopping_ KESTO_GUARDED_BY(lock_) = false;
    std::thread thread_; // from the first start on
};

} // namespace platform
