// The heap of a thread that works for clients.
//
// Each thread has a heap of its own, which no other thread can tidy. What one thread allocated, another may have freed,
// so neither knows by itself that its heap could do with it: all are asked, and those that sleep are woken.
#pragma once

#include <atomic>
#include <functional>

namespace platform {

// Its thread makes it, uses it and ends it.
class ThreadHeap {
public:
    // `wake` makes the thread call `tidyIfAsked` soon, though it sleep. Any thread calls it, while this lives.
    explicit ThreadHeap(std::function<void()> wake);
    ~ThreadHeap();
    ThreadHeap(const ThreadHeap&) = delete;
    ThreadHeap& operator=(const ThreadHeap&) = delete;

    // Any thread.
    [[nodiscard]] bool isAsked() const noexcept { return isAsked_; }
    // Gives the system what the heap does not need, once each time that it was asked to. Whether it was.
    bool tidyIfAsked();

    // Asks every thread that has such a heap. Any thread.
    static void askAll();

private:
    const std::function<void()> wake_;
    std::atomic<bool> isAsked_ = false;
};

} // namespace platform
