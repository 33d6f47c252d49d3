// SPDX-License-Identifier: Apache-2.0
// Sessions come and go on any thread, and the reading thread reads the buffers: one lock protects the shared state, and
// events go to the sessions' own queues.
#include "platform/linux/trace/TracefsKernelTrace.h"

#include "platform/linux/files/SystemError.h"
#include "platform/linux/process/Thread.h"

#include <algorithm>
#include <cassert>
#include <cerrno>
#include <system_error>
#include <utility>

namespace platform {
namespace {

using Clock = TracefsKernelTrace::Clock;

// A moment on the trace's clock.
std::uint64_t traceTime(Clock::time_point moment)
{
    return static_cast<std::uint64_t>(std::chrono::nanoseconds(moment.time_since_epoch()).count());
}

Clock::time_point moment(std::uint64_t traceTime)
{
    return Clock::time_point(std::chrono::nanoseconds(traceTime));
}

// In nanoseconds. Measured for every reading, because it changes when the clock is set and when the machine has slept.
std::int64_t wallClockAheadOfTrace()
{
    const auto wall = std::chrono::system_clock::now().time_since_epoch();
    return std::chrono::nanoseconds(wall - Clock::now().time_since_epoch()).count();
}

} // namespace

class TracefsKernelTrace::Session final : public KernelTraceSession {
public:
    explicit Session(TracefsKernelTrace& trace) : trace_(trace) { }
    ~Session() override { trace_.remove(*subscription_); }
    Session(const Session&) = delete;
    Session& operator=(const Session&) = delete;

    void setCompletionHandler(std::function<void()> handler) override
    {
        assert(!subscription_->queue);
        subscription_->completion = std::move(handler);
    }

    void enableWallTimes(bool enabled) override
    {
        assert(!subscription_->queue);
        subscription_->hasWallTimes = enabled;
    }

    int filterEventRange(std::uint32_t firstCode, std::uint32_t lastCode,
                         std::function<void(const KernelTraceEvent&)> handler) override
    {
        if (subscription_->queue)
            return EBUSY; // already started
        if (firstCode > lastCode || !handler)
            return EINVAL;
        subscription_->filters.push_back({firstCode, lastCode, std::move(handler)});
        return 0;
    }

    int start(std::shared_ptr<WorkQueue> queue) override
    {
        if (subscription_->queue)
            return EALREADY;
        if (!queue)
            return EINVAL;
        subscription_->queue = std::move(queue);
        return trace_.start(subscription_);
    }

    // A session that could not start is completed, too, because its owner waits for that.
    void end() override
    {
        if (subscription_->queue)
            trace_.end(subscription_);
    }

    [[nodiscard]] std::uint64_t lostEvents() const override { return subscription_->lost; }
    [[nodiscard]] std::uint64_t timestampToNanoseconds(std::uint64_t timestamp) const override { return timestamp; }

private:
    TracefsKernelTrace& trace_;
    const std::shared_ptr<TraceSubscription> subscription_ = std::make_shared<TraceSubscription>();
};

TracefsKernelTrace::TracefsKernelTrace(TracefsPlace place, TracefsEmitter& emitter, EmitterAccess& access,
                                       ProviderLog log)
    : place_(std::move(place)),
      emitter_(emitter),
      access_(access),
      log_(log),
      fanOut_(log)
{
}

TracefsKernelTrace::~TracefsKernelTrace()
{
    {
        const foundation::Lock lock(lock_);
        isStopping_ = true;
        if (isOn_)
            switchOff();
    }
    changed_.notifyAll();
    if (thread_.joinable())
        thread_.join();
}

bool TracefsKernelTrace::isAvailable()
{
    {
        const foundation::Lock lock(lock_);
        if (!setUp())
            return false;
    }
    access_.answerWaiting();
    return true;
}

std::unique_ptr<KernelTraceSession> TracefsKernelTrace::createTraceSession()
{
    return isAvailable() ? std::make_unique<Session>(*this) : nullptr;
}

std::expected<TracefsInstance, TracefsFailure> TracefsKernelTrace::openInstance() const
{
    const auto tracefs = findTracefs(place_.mounts);
    if (!tracefs)
        return std::unexpected(TracefsFailure{.what = "tracefs is not mounted"});
    auto instance = TracefsInstance::open(*tracefs, place_.instanceName);
    for (int number = 2; number <= mostInstances && !instance && instance.error().isInUse; ++number)
        instance = TracefsInstance::open(*tracefs, place_.instanceName + "-" + std::to_string(number));
    return instance;
}

bool TracefsKernelTrace::setUp()
{
    if (instance_)
        return true;
    auto opened = openInstance();
    if (!opened) {
        if (opened.error().what != problem_)
            log_.error("the kernel trace is not available: {}", opened.error().what);
        problem_ = opened.error().what;
        return false;
    }
    problem_.clear();
    instance_ = *std::move(opened);
    if (const auto error = access_.open(instance_->marker()); error)
        log_.error("clients cannot emit trace events: {}", systemErrorText(error.value()));
    return true;
}

int TracefsKernelTrace::start(const std::shared_ptr<TraceSubscription>& subscription)
{
    const foundation::Lock lock(lock_);
    if (const int error = switchOn(); error != 0) {
        log_.error("the kernel trace cannot be switched on: {}", systemErrorText(error));
        return error;
    }
    if (!fanOut_.add(subscription))
        return EMFILE;
    subscription->startTime = traceTime(Clock::now());
    updateEmitters();
    changed_.notifyAll();
    return 0;
}

// Starts the reading thread with the first session.
int TracefsKernelTrace::switchOn()
{
    if (isOn_)
        return 0;
    if (const auto error = instance_->switchOn(); error)
        return error.value();
    isOn_ = true;
    merger_.emplace(instance_->pageFormat(), instance_->markerType());
    lastReading_ = Clock::now();
    if (thread_.joinable())
        return 0;
    try {
        thread_ = startThread("kesto.trace", QualityOfService::UserInteractive, [this] { run(); });
    } catch (const std::system_error& error) {
        switchOff();
        return error.code().value();
    }
    return 0;
}

void TracefsKernelTrace::switchOff()
{
    isOn_ = false;
    merger_.reset(); // releases its memory
    instance_->switchOff();
    updateEmitters();
}

// Lets emitters skip events while no session needs them.
void TracefsKernelTrace::updateEmitters()
{
    const bool isTracing = isOn_ && fanOut_.isWanted();
    emitter_.setMarker(isTracing ? instance_->marker() : -1);
    access_.setTracing(isTracing);
}

void TracefsKernelTrace::end(const std::shared_ptr<TraceSubscription>& subscription)
{
    const foundation::Lock lock(lock_);
    if (subscription->hasEnded())
        return;
    subscription->endTime = traceTime(Clock::now());
    if (!subscription->hasStarted())
        return fanOut_.complete(subscription);
    updateEmitters();
    changed_.notifyAll();
}

void TracefsKernelTrace::remove(TraceSubscription& subscription)
{
    const foundation::Lock lock(lock_);
    subscription.isDestroyed = true;
    fanOut_.remove(subscription);
    if (isOn_)
        updateEmitters();
    changed_.notifyAll();
}

void TracefsKernelTrace::run()
{
    const foundation::Lock lock(lock_);
    while (!isStopping_) {
        if (fanOut_.isEmpty()) {
            if (isOn_)
                switchOff();
            changed_.wait(lock_);
        } else if (const auto next = nextReading(); next > Clock::now()) {
            changed_.waitUntil(lock_, next);
        } else {
            read();
        }
    }
}

Clock::time_point TracefsKernelTrace::nextReading() const
{
    const auto regular = lastReading_ + readingPeriod;
    const std::uint64_t end = fanOut_.nextEnd();
    return end == TraceSubscription::never ? regular : std::min(regular, moment(end) + settlingTime);
}

void TracefsKernelTrace::read()
{
    lastReading_ = Clock::now();
    TraceMerger& merger = *merger_;
    instance_->readPages([&merger](std::uint32_t cpu, std::span<const std::byte> page) { merger.take(cpu, page); });
    const std::uint64_t settled = traceTime(lastReading_ - settlingTime);
    const auto events = merger.eventsUpTo(settled);
    fanOut_.setWallClock(wallClockAheadOfTrace());
    fanOut_.deliver(events, settled, merger.takeLosses());
}

} // namespace platform
