// SPDX-License-Identifier: Apache-2.0
// PipeWire's loop calls back with a pointer. Its target lives until the callback has returned, even if the callback
// destroys its own source.
//
// Timers are the system's own descriptors, which the loop only watches: PipeWire's timers take a `timespec`, which on a
// processor of 32 bits may be another in PipeWire than here.
#include "kesto-pipewire/Loop.h"

#include <pipewire/loop.h>
#include <pipewire/main-loop.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cmath>
#include <ctime>
#include <sys/timerfd.h>
#include <system_error>
#include <unistd.h>
#include <utility>

namespace kesto_pipewire {

struct Source::Watched : std::enable_shared_from_this<Watched> {
    Watched(pw_loop* given, Callback call) : loop(given), callback(std::move(call)) { }
    ~Watched() { release(); }
    Watched(const Watched&) = delete;
    Watched& operator=(const Watched&) = delete;

    void release()
    {
        if (auto* released = std::exchange(source, nullptr))
            pw_loop_destroy_source(loop, released);
    }
    static void fire(void* data)
    {
        const auto self = static_cast<Watched*>(data)->shared_from_this(); // the callback may destroy the source
        self->callback();
    }

    pw_loop* loop;
    Callback callback;
    spa_source* source = nullptr;
};

Source::Source(Source&& other) noexcept = default;

Source& Source::operator=(Source&& other) noexcept
{
    std::swap(watched_, other.watched_);
    return *this;
}

Source::~Source()
{
    if (watched_)
        watched_->release();
}

void Loop::Release::operator()(pw_main_loop* loop) const noexcept
{
    pw_main_loop_destroy(loop);
}

Loop::Loop() : loop_(pw_main_loop_new(nullptr))
{
    if (!loop_)
        throw std::system_error(errno, std::generic_category(), "cannot create an event loop");
}

Loop::~Loop() = default;

void Loop::run()
{
    pw_main_loop_run(loop_.get());
}

void Loop::quit()
{
    pw_main_loop_quit(loop_.get());
}

pw_loop* Loop::raw() const noexcept
{
    return pw_main_loop_get_loop(loop_.get());
}

// The common part of the four kinds of source; `start` makes the loop's own source with the given data.
template <typename Start> Source Loop::watch(Source::Callback callback, Start start)
{
    auto watched = std::make_shared<Source::Watched>(raw(), std::move(callback));
    watched->source = start(watched.get());
    if (!watched->source)
        throw std::system_error(errno, std::generic_category(), "cannot watch an event");
    return Source(std::move(watched));
}

Source Loop::addTimer(Source::Callback callback)
{
    return watch(std::move(callback), [this](void* data) {
        constexpr bool closeWithSource = true;
        return pw_loop_add_io(
            raw(), ::timerfd_create(CLOCK_MONOTONIC, TFD_NONBLOCK | TFD_CLOEXEC), SPA_IO_IN, closeWithSource,
            [](void* watched, int timer, std::uint32_t) {
                std::uint64_t expirations = 0;
                if (::read(timer, &expirations, sizeof expirations) > 0)
                    Source::Watched::fire(watched);
            },
            data);
    });
}

Source Loop::addSignal(int signal, Source::Callback callback)
{
    return watch(std::move(callback), [this, signal](void* data) {
        return pw_loop_add_signal(raw(), signal, [](void* watched, int) { Source::Watched::fire(watched); }, data);
    });
}

Source Loop::addReadable(int descriptor, Source::Callback callback)
{
    return watch(std::move(callback), [this, descriptor](void* data) {
        return pw_loop_add_io(
            raw(), descriptor, SPA_IO_IN, false,
            [](void* watched, int, std::uint32_t) { Source::Watched::fire(watched); }, data);
    });
}

Source Loop::addWakeup(Source::Callback callback)
{
    return watch(std::move(callback), [this](void* data) {
        return pw_loop_add_event(raw(), [](void* watched, std::uint64_t) { Source::Watched::fire(watched); }, data);
    });
}

void Loop::arm(Source& timer, double seconds)
{
    const std::chrono::nanoseconds time(std::llround(std::max(seconds, 1e-6) * 1e9)); // a time of 0 would disarm it
    const auto whole = std::chrono::floor<std::chrono::seconds>(time);
    itimerspec value{};
    value.it_value.tv_sec = static_cast<std::time_t>(whole.count());
    value.it_value.tv_nsec = static_cast<long>((time - whole).count());
    ::timerfd_settime(timer.watched_->source->fd, 0, &value, nullptr);
}

void Loop::disarm(Source& timer)
{
    constexpr itimerspec never{};
    ::timerfd_settime(timer.watched_->source->fd, 0, &never, nullptr);
}

void Loop::wake(Source& wakeup)
{
    pw_loop_signal_event(raw(), wakeup.watched_->source);
}

} // namespace kesto_pipewire
