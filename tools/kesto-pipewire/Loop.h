// SPDX-License-Identifier: Apache-2.0
// The one event loop of the program: PipeWire's own, so that its events, the program's timers and the system's signals
// take turns on one thread and need no lock.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>

struct pw_loop;
struct pw_main_loop;
struct spa_source;

namespace kesto_pipewire {

// The loop watches a source as long as this object lives. May be destroyed within its own call.
class Source {
public:
    using Callback = std::function<void()>;

    Source() noexcept = default;
    Source(Source&& other) noexcept;
    Source& operator=(Source&& other) noexcept;
    ~Source();

private:
    friend class Loop;
    struct Watched;
    explicit Source(std::shared_ptr<Watched> watched) noexcept : watched_(std::move(watched)) { }

    std::shared_ptr<Watched> watched_;
};

// All functions except `wake` run on the loop's thread.
class Loop {
public:
    // Throws std::system_error if the system refuses a loop.
    Loop();
    ~Loop();
    Loop(const Loop&) = delete;
    Loop& operator=(const Loop&) = delete;

    // Runs until `quit` is called.
    void run();
    void quit();

    // A timer does nothing until `arm`; then it calls back once, after that many seconds.
    [[nodiscard]] Source addTimer(Source::Callback callback);
    void arm(Source& timer, double seconds);
    void disarm(Source& timer);

    [[nodiscard]] Source addSignal(int signal, Source::Callback callback);
    // Calls back whenever the descriptor can be read. The caller keeps the descriptor.
    [[nodiscard]] Source addReadable(int descriptor, Source::Callback callback);
    // Calls back after `wake`, which any thread may use.
    [[nodiscard]] Source addWakeup(Source::Callback callback);
    void wake(Source& wakeup);

    [[nodiscard]] pw_loop* raw() const noexcept;

private:
    struct Release {
        void operator()(pw_main_loop* loop) const noexcept;
    };
    template <typename Start> [[nodiscard]] Source watch(Source::Callback callback, Start start);

    std::unique_ptr<pw_main_loop, Release> loop_;
};

} // namespace kesto_pipewire
