// The room of traces: events into the kernel's trace, out of it again, and the files of what was measured. It alone
// touches tracefs.
//
// The kernel event trace service, on an instance of tracefs that is the service's own.
//
// All sessions share the instance: there is one ring buffer a processor, which everybody who emits writes to, and each
// session gets its part of what comes out of it. The buffers are read every few milliseconds by a thread of its own
// while there is a session, rather than when the kernel says that something is in them: to be told so costs whoever
// emits seven times what the event costs. Without a session the buffers are off, the thread sleeps, and nothing wakes
// it.
//
// An event is not delivered before the settling time is over, for until then one that is older may still come from
// another processor. A session that ends is completed as soon as this time has passed since.
#pragma once

#include "foundation/Mutex.h"
#include "platform/KernelTrace.h"
#include "platform/linux/log/ProviderLog.h"
#include "platform/linux/trace/TraceFanOut.h"
#include "platform/linux/trace/TraceMarkerAccess.h"
#include "platform/linux/trace/TraceMerger.h"
#include "platform/linux/trace/TracefsInstance.h"
#include "platform/linux/trace/TracefsMarkers.h"

#include <chrono>
#include <filesystem>
#include <memory>
#include <optional>
#include <string>
#include <thread>

namespace platform {

// Where the trace is found; as it is for the service, unless a test says otherwise.
struct TracefsPlace {
    std::filesystem::path mounts = "/proc/self/mounts";
    std::string instanceName = "kesto";
};

// Any thread. Its sessions go before it.
class TracefsKernelTrace final : public KernelTrace {
public:
    using Clock = std::chrono::steady_clock; // the clock of the trace

    static constexpr std::chrono::milliseconds readingPeriod{20};
    static constexpr std::chrono::milliseconds settlingTime{2};
    // Services on one machine have an instance each: the second one of this name and "-2", and so on.
    static constexpr int mostInstances = 8;

    // The markers and the access are told when somebody traces.
    TracefsKernelTrace(TracefsPlace place, TracefsMarkers& markers, TraceMarkerAccess& access, ProviderLog log);
    ~TracefsKernelTrace() override;
    TracefsKernelTrace(const TracefsKernelTrace&) = delete;
    TracefsKernelTrace& operator=(const TracefsKernelTrace&) = delete;

    // The first call of either sets the instance up, which takes some 30 ms. Why there is none is logged when it
    // changes.
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
    void tellEmitters() KESTO_REQUIRES(lock_);
    void run();
    [[nodiscard]] Clock::time_point nextReading() const KESTO_REQUIRES(lock_);
    void read() KESTO_REQUIRES(lock_);

    const TracefsPlace place_;
    TracefsMarkers& markers_;
    TraceMarkerAccess& access_;
    const ProviderLog log_;

    foundation::Mutex lock_;
    foundation::Condition changed_;
    std::string problem_ KESTO_GUARDED_BY(lock_); // that was told
    std::optional<TracefsInstance> instance_ KESTO_GUARDED_BY(lock_);
    std::optional<TraceMerger> merger_ KESTO_GUARDED_BY(lock_); // while it is on
    TraceFanOut fanOut_ KESTO_GUARDED_BY(lock_);
    Clock::time_point lastReading_ KESTO_GUARDED_BY(lock_);
    bool isOn_ KESTO_GUARDED_BY(lock_) = false;
    bool isStopping_ KESTO_GUARDED_BY(lock_) = false;
    std::thread thread_; // from the first start on
};

} // namespace platform
